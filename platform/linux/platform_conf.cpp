#include "linux/platform_conf.h"

#include <syslog.h>

#include <cerrno>
#include <charconv>
#include <cstring>
#include <fstream>
#include <iterator>
#include <system_error>

#include "linux/ini_file.h"

namespace platform {
namespace {

constexpr char kFile[] = "/etc/vexo/platform.conf";

void Warn(int line, const char* what) {
  syslog(LOG_WARNING, "%s:%d: %s", kFile, line, what);
}

// Takes a value over; null, or what is wrong with it.
using Take = const char* (*)(const std::string& value, PlatformConf* conf);

const char* TakeManageSamba(const std::string& value, PlatformConf* conf) {
  return ParseSwitch(value, &conf->manage_samba) ? nullptr : "neither yes nor no; the default holds";
}

const char* TakeNoticeMail(const std::string& value, PlatformConf* conf) {
  conf->notice_mail = value;
  return nullptr;
}

const char* TakeNoticeCommand(const std::string& value, PlatformConf* conf) {
  if (!value.empty() && value[0] != '/') return "no absolute path; no command is run";
  conf->notice_command = value;
  return nullptr;
}

const char* TakeNoticeTime(const std::string& value, PlatformConf* conf) {
  unsigned int seconds = 0;
  const auto [end, error] = std::from_chars(value.data(), value.data() + value.size(), seconds);
  const bool usable = error == std::errc() && end == value.data() + value.size() && seconds >= 1 && seconds <= 600;
  if (!usable) return "no number of seconds from 1 to 600; the default holds";
  conf->notice_time = seconds;
  return nullptr;
}

constexpr struct {
  const char* key;
  Take take;
} kSettings[] = {
    {"manage samba", TakeManageSamba},
    {"notice mail", TakeNoticeMail},
    {"notice command", TakeNoticeCommand},
    {"notice time limit", TakeNoticeTime},
};

void Apply(const IniEntry& entry, PlatformConf* conf) {
  if (entry.key.empty()) return;  // a section's head
  for (const auto& known : kSettings) {
    if (!entry.section.empty() || entry.key != known.key) continue;
    if (const char* wrong = known.take(entry.value, conf)) Warn(entry.line, wrong);
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
