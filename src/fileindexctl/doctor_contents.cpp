// Whether the contents of files can be read, and whether what a file makes of its reader stays in there.
#include <sys/stat.h>

#include <string>

#include "doctor.h"
#include "fileindex/elastic_control.h"

namespace quarrox::ctl::doctor {
namespace {

struct Layer {
  const char* name;
  const char* missing;
  const char* remedy;
};

// All are there on a kernel as Debian configures it.
constexpr Layer kLayers[] = {
    {"landlock", "the kernel has no Landlock, which keeps those who read files from opening others",
     "boot Linux 5.13 or later, with landlock among the names of the kernel's parameter lsm="},
    {"seccomp", "the kernel has no system call filters, which keep those who read files from doing anything else",
     "boot a kernel with CONFIG_SECCOMP_FILTER"},
    {"user", "those who read files do it with the rights of root, which they cannot give up",
     "start the daemons with the capabilities CAP_SETUID and CAP_SETGID"},
    {"limits", "those who read files may take any amount of memory",
     "raise the hard limits that the daemons start with"},
};

void ReportNoReader(const std::string& program, const std::string& failure, Findings& findings) {
  const std::string text = "only plain text is read: " + failure;
  struct stat info;
  if (stat(program.c_str(), &info) == 0 && S_ISREG(info.st_mode) && info.st_size > 0 && (info.st_mode & 0111) != 0111) {
    return findings.Wrong(text, ShellLine({"chmod", "0755", program}));
  }
  findings.Wrong(text, "install fileindex again", Remedy::kByHand);
}

}  // namespace

void CheckContents(Machine&, Findings& findings) {
  const Json::Value features = fileindex::elastic::ReaderFeatures();
  if (features.isMember("failure")) {
    return ReportNoReader(features["program"].asString(), features["failure"].asString(), findings);
  }
  for (const Layer& layer : kLayers) {
    if (!features[layer.name].asBool()) findings.Wrong(layer.missing, layer.remedy, Remedy::kByHand);
  }
  findings.WellIfNothing("read by " + features["program"].asString() + ", kept in by Landlock " +
                         features["landlock"].asString() +
                         ", a filter of system calls, the rights of nobody, and limits");
}

}  // namespace quarrox::ctl::doctor
