// Whether the daemons are there: two are asked something that changes nothing; of the third, which talks to nobody, it
// is seen whether it watches its configurations.
#include <sys/stat.h>
#include <sys/utsname.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <system_error>

#include "common/error.h"
#include "common/file.h"
#include "common/json.h"
#include "daemon_exchange.h"
#include "doctor.h"
#include "fileindex/communication.h"

namespace quarrox::ctl::doctor {
namespace {

constexpr char kNotifyd[] = "vexonotifyd";

std::string StartOf(const std::string& daemon) {
  return IsDirExist("/run/systemd/system", false) ? "systemctl restart " + daemon : "start it as root: " + daemon;
}

// A daemon whose program was replaced since it started is another one than is installed.
void ReportRunning(const std::string& daemon, pid_t pid, const std::string& what, Findings& findings) {
  std::error_code error;
  const std::string program = std::filesystem::read_symlink("/proc/" + std::to_string(pid) + "/exe", error).string();
  if (program.ends_with(" (deleted)")) {
    findings.Wrong(daemon + " still runs a program that was replaced on the disk, process " + std::to_string(pid),
                   StartOf(daemon));
  } else {
    findings.Well(daemon + ' ' + what + ", process " + std::to_string(pid));
  }
}

template <typename Ask>
void CheckAnswers(const std::string& daemon, const Ask& ask, Findings& findings) {
  try {
    const DaemonAnswer answer = ask();
    if (answer.object["success"].asBool()) return ReportRunning(daemon, answer.daemon, "answers", findings);
    findings.Wrong(daemon + " refuses: " + toString(answer.object["error"]), "sudo fileindexctl doctor");
  } catch (const Error& error) {
    findings.Wrong(daemon + " does not serve: " + error.reason, StartOf(daemon));
  }
}

// Whether an inotify instance of a process watches an inode. Of the line "inotify wd:1 ino:a2c sdev:1f ...", numbers
// are in hexadecimal.
bool Watches(const std::string& process, ino_t inode) {
  std::error_code error;
  for (std::filesystem::directory_iterator file(process + "/fdinfo", error), end; !error && file != end;
       file.increment(error)) {
    std::ifstream lines(file->path());
    for (std::string kind, wd, ino; lines >> kind; lines.ignore(4096, '\n')) {
      if (kind != "inotify" || !(lines >> wd >> ino) || !ino.starts_with("ino:")) continue;
      if (strtoull(ino.c_str() + 4, nullptr, 16) == inode) return true;
    }
  }
  return false;
}

bool IsNotifyd(const std::string& process, const struct stat& configs) {
  std::string name;
  getline(std::ifstream(process + "/comm"), name);
  if (name != kNotifyd) return false;
  struct stat seen;  // in another container the same path is another directory
  if (stat((process + "/root" + kMonitorDirectory).c_str(), &seen) != 0) return false;
  return seen.st_dev == configs.st_dev && seen.st_ino == configs.st_ino && Watches(process, configs.st_ino);
}

// 0 where there is none.
pid_t FindNotifyd() {
  struct stat configs;
  if (stat(kMonitorDirectory, &configs) != 0) return 0;
  std::error_code error;
  for (std::filesystem::directory_iterator process("/proc", error), end; !error && process != end;
       process.increment(error)) {
    const int pid = atoi(process->path().filename().c_str());
    if (pid > 0 && IsNotifyd(process->path().string(), configs)) return pid;
  }
  return 0;
}

}  // namespace

void CheckVersions(Machine&, Findings& findings) {
  utsname kernel = {};
  uname(&kernel);
  findings.Well(std::string("fileindexctl " FILEINDEX_VERSION ", ") + kernel.sysname + ' ' + kernel.release);
}

void CheckDaemons(Machine& machine, Findings& findings) {
  Json::Value look_at_list;
  look_at_list["type"] = "notify_setting_changed";
  look_at_list["data"]["share_name"] = "";  // no share's
  CheckAnswers(
      "fileindexd", [&] { return Exchange(fileindex::kDaemonSocketPath, look_at_list); }, findings);
  Json::Value nothing;
  nothing["compound"] = Json::arrayValue;
  CheckAnswers(
      "vexoelasticd", [&] { return machine.AskEngine(nothing); }, findings);
  if (const pid_t pid = FindNotifyd(); pid != 0) {
    ReportRunning(kNotifyd, pid, std::string("watches ") + kMonitorDirectory, findings);
  } else {
    findings.Wrong(std::string("no ") + kNotifyd + " watches " + kMonitorDirectory + ", so no change is seen",
                   StartOf(kNotifyd));
  }
}

}  // namespace quarrox::ctl::doctor
