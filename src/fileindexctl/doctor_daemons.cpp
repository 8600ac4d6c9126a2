// Whether the daemons are there: two are asked something that changes nothing; of the third, which talks to nobody, it
// is seen whether it watches its configurations.
#include <sys/stat.h>
#include <sys/utsname.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <string>
#include <string_view>
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

// What a process still runs though it was replaced on the disk: its program or the library; empty for neither.
std::string ReplacedFile(const std::string& process) {
  constexpr std::string_view kGone = " (deleted)";
  std::error_code error;
  std::string program = std::filesystem::read_symlink(process + "/exe", error).string();
  if (program.ends_with(kGone)) return program.substr(0, program.size() - kGone.size());
  std::ifstream maps(process + "/maps");
  for (std::string line; std::getline(maps, line);) {
    const size_t at = line.find('/');
    const bool is_library = at != std::string::npos && line.find("/libfileindex.so", at) != std::string::npos;
    if (is_library && line.ends_with(kGone)) return line.substr(at, line.size() - kGone.size() - at);
  }
  return {};
}

// What its very program says when asked, "fileindexd 0.1.0"; empty for one that is too old to, or not root's: nobody
// else's program is run.
std::string VersionOf(const std::string& process) {
  struct stat info;
  if (stat(process.c_str(), &info) != 0 || info.st_uid != 0 || geteuid() != 0) return {};
  const std::unique_ptr<FILE, int (*)(FILE*)> output(popen((process + "/exe --version 2>/dev/null").c_str(), "re"),
                                                     pclose);
  char line[256] = "";
  if (output == nullptr || fgets(line, sizeof(line), output.get()) == nullptr) return {};
  std::string text = line;
  while (!text.empty() && text.back() == '\n') text.pop_back();
  return text;
}

// A daemon whose program was replaced since it started is another one than is installed.
void ReportRunning(const std::string& daemon, pid_t pid, const std::string& what, Machine& machine,
                   Findings& findings) {
  machine.daemons[daemon] = pid;
  const std::string process = "/proc/" + std::to_string(pid);
  const std::string replaced = ReplacedFile(process);
  const std::string version = VersionOf(process);
  const std::string own = daemon + " " FILEINDEX_VERSION;
  if (!replaced.empty()) {
    findings.Wrong(daemon + " still runs " + replaced + " as it was before it was replaced on the disk, process " +
                       std::to_string(pid),
                   RestartCommand(daemon, pid));
  } else if (geteuid() == 0 && version != own && !version.starts_with(own + ',')) {
    findings.Wrong(daemon + " is of another version than fileindexctl " FILEINDEX_VERSION ": " +
                       (version.empty() ? "one that does not tell it" : version) + ", process " + std::to_string(pid),
                   RestartCommand(daemon, pid));
  } else {
    findings.Well((version.empty() ? daemon : version) + ' ' + what + ", process " + std::to_string(pid));
  }
}

template <typename Ask>
void CheckAnswers(const std::string& daemon, const Ask& ask, Machine& machine, Findings& findings) {
  try {
    const DaemonAnswer answer = ask();
    if (answer.object["success"].asBool()) return ReportRunning(daemon, answer.daemon, "answers", machine, findings);
    findings.Wrong(daemon + " refuses: " + toString(answer.object["error"]), "sudo fileindexctl doctor");
  } catch (const Error& error) {
    findings.Wrong(daemon + " does not serve: " + error.reason, RestartCommand(daemon, 0));
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

// Whether systemd runs and knows the daemon.
bool IsService(const std::string& daemon) {
  constexpr const char* kUnits[] = {"/etc/systemd/system/", "/usr/local/lib/systemd/system/",
                                    "/usr/lib/systemd/system/"};
  const auto has_unit = [&](const std::string& directory) { return IsFileExist(directory + daemon + ".service"); };
  return IsDirExist("/run/systemd/system", false) && std::any_of(std::begin(kUnits), std::end(kUnits), has_unit);
}

}  // namespace

// One that was started by hand is not systemd's to end, and keeps another one out.
std::string RestartCommand(const std::string& daemon, pid_t pid) {
  const std::string number = std::to_string(pid);
  const bool is_service = IsService(daemon);
  std::string cgroup;
  if (is_service && pid != 0) getline(std::ifstream("/proc/" + number + "/cgroup"), cgroup, '\0');
  if (is_service && (pid == 0 || cgroup.find('/' + daemon + ".service") != std::string::npos)) {
    return ShellLine({"systemctl", "restart", daemon});
  }
  std::string start = is_service ? ShellLine({"systemctl", "restart", daemon}) : ShellLine({"setsid", "-f", daemon});
  if (pid == 0) return start;
  return "kill " + number + "; while kill -0 " + number + " 2>/dev/null; do sleep 0.1; done; " + start;
}

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
      "fileindexd", [&] { return Exchange(fileindex::kDaemonSocketPath, look_at_list); }, machine, findings);
  Json::Value nothing;
  nothing["compound"] = Json::arrayValue;
  CheckAnswers(
      "vexoelasticd", [&] { return machine.AskEngine(nothing); }, machine, findings);
  if (const pid_t pid = FindNotifyd(); pid != 0) {
    ReportRunning(kNotifyd, pid, std::string("watches ") + kMonitorDirectory, machine, findings);
  } else {
    findings.Wrong(std::string("no ") + kNotifyd + " watches " + kMonitorDirectory + ", so no change is seen",
                   RestartCommand(kNotifyd, 0));
  }
}

}  // namespace quarrox::ctl::doctor
