#include "linux/platform_conf.h"

#include <syslog.h>

#include <cerrno>
#include <cstring>
#include <fstream>
#include <iterator>

#include "linux/ini_file.h"

namespace platform {
namespace {

constexpr char kFile[] = "/etc/vexo/platform.conf";

struct Switch {
  const char* key;
  bool PlatformConf::*value;
};

constexpr Switch kSwitches[] = {
    {"manage samba", &PlatformConf::manage_samba},
};

void Warn(int line, const char* what) {
  syslog(LOG_WARNING, "%s:%d: %s", kFile, line, what);
}

void Apply(const IniEntry& entry, PlatformConf* conf) {
  if (entry.key.empty()) return;  // a section's head
  for (const Switch& known : kSwitches) {
    if (!entry.section.empty() || entry.key != known.key) continue;
    if (!ParseSwitch(entry.value, &(conf->*known.value))) Warn(entry.line, "neither yes nor no; the default holds");
    return;
  }
  Warn(entry.line, "no such setting; left out");
}

}  // namespace

PlatformConf ReadPlatformConf() {
  PlatformConf conf;
  errno = 0;
  std::ifstream in(kFile, std::ios::binary);
  if (!in) {
    if (errno != ENOENT) syslog(LOG_WARNING, "%s: cannot be read, defaults hold: %s", kFile, strerror(errno));
    return conf;
  }
  const std::string text(std::istreambuf_iterator<char>(in), {});
  const IniText ini = ParseIni(text, kFile);
  for (const std::string& problem : ini.problems) syslog(LOG_WARNING, "%s", problem.c_str());
  for (const IniEntry& entry : ini.entries) Apply(entry, &conf);
  return conf;
}

}  // namespace platform
