// How the notification daemon hears what happens in folders, and since when, as it tells itself.
#include <algorithm>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <map>
#include <string>
#include <system_error>

#include "common/file.h"
#include "common/json.h"
#include "doctor.h"

namespace quarrox::ctl::doctor {
namespace {

constexpr char kNotifyd[] = "vexonotifyd";
constexpr char kWatchStatusPath[] = "/var/run/vexonotifyd.status";

constexpr char kPerDirectory[] = "inotify";  // what takes a watch for each directory

struct Heard {
  uint64_t folders = 0;
  int64_t since = 0;  // the last of them
};

std::string TextOf(const Json::Value& value) {
  return value.isString() ? value.asString() : std::string();
}

// The watches of a process, one of which it takes for each directory.
uint64_t CountInotifyWatches(pid_t pid) {
  uint64_t count = 0;
  std::error_code error;
  const std::string files = "/proc/" + std::to_string(pid) + "/fdinfo";
  for (std::filesystem::directory_iterator file(files, error), end; !error && file != end; file.increment(error)) {
    std::ifstream lines(file->path());
    for (std::string line; std::getline(lines, line);) count += line.starts_with("inotify wd:") ? 1 : 0;
  }
  return count;
}

void ReportUnheard(const std::string& folder, const std::string& why, pid_t daemon, Findings& findings) {
  if (!IsDirExist(folder, true)) return;  // CheckFolders says so
  const std::string text = "nothing hears what changes in " + folder + (why.empty() ? "" : ": " + why);
  if (why.find("max_user_watches") == std::string::npos) return findings.Wrong(text, RestartCommand(kNotifyd, daemon));
  findings.Wrong(text, RaiseWatchesCommand());
}

// What the daemon of this process tells; null where it tells nothing.
Json::Value ReadStatus(pid_t daemon) {
  Json::Value status;
  const bool is_told = fromFile(status, kWatchStatusPath) && status.isObject() && status["folders"].isObject();
  return is_told && status["pid"] == Json::Int64{daemon} ? status["folders"] : Json::Value();
}

// The folders that are to be watched, by method; what nothing hears is reported.
std::map<std::string, Heard> CountHeard(const Json::Value& folders, pid_t daemon, Machine& machine,
                                        Findings& findings) {
  std::map<std::string, Heard> methods;
  for (const auto& [queue, config] : machine.monitors()) {
    for (const std::string& folder : config.directories) {
      const Json::Value& told = folders[folder];
      if (!told.isObject()) {
        findings.Well(folder + " is being looked at for the first time; what happens in it is heard from then on");
        continue;
      }
      const std::string method = TextOf(told["method"]);
      if (method.empty()) {
        ReportUnheard(folder, TextOf(told["reason"]), daemon, findings);
        continue;
      }
      Heard& heard = methods[method];
      ++heard.folders;
      heard.since = std::max(heard.since, told["since"].isInt64() ? told["since"].asInt64() : 0);
    }
  }
  return methods;
}

}  // namespace

void CheckWatches(Machine& machine, Findings& findings) {
  const auto daemon = machine.daemons.find(kNotifyd);
  if (daemon == machine.daemons.end()) return;  // CheckDaemons says so
  const pid_t pid = daemon->second;
  const Json::Value folders = ReadStatus(pid);
  if (folders.isNull()) {
    return findings.Wrong(std::string(kNotifyd) + " does not tell in " + kWatchStatusPath + " what it watches",
                          RestartCommand(kNotifyd, pid));
  }
  for (const auto& [method, heard] : CountHeard(folders, pid, machine, findings)) {
    std::string text = method;
    text.append(" hears ").append(std::to_string(heard.folders)).append(heard.folders == 1 ? " folder" : " folders");
    if (method == kPerDirectory) text.append(", with " + std::to_string(CountInotifyWatches(pid)) + " watches");
    findings.Well(text.append(", since ").append(LocalTime(heard.since)));
  }
  findings.WellIfNothing("nothing is to be watched");
}

}  // namespace quarrox::ctl::doctor
