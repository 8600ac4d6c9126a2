#include "monitor_files.h"

#include <fcntl.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <string_view>
#include <system_error>
#include <utility>

#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "paths.h"

namespace quarrox::notifyd {
namespace {

constexpr uint32_t kFileChanges = IN_CLOSE_WRITE | IN_MOVED_TO | IN_MOVED_FROM | IN_DELETE;
constexpr uint32_t kDirectoryGoes = IN_DELETE_SELF | IN_MOVE_SELF;
constexpr std::string_view kSuffix = ".json";

[[noreturn]] void Fail(const std::string& what, int error) {
  throw Error(kErrSystem, what + ", reason=" + strerror(error));
}

// One after the other from the top, so that it takes no recursion.
void MakeDirectories(const std::string& path) {
  for (size_t end = path.find('/', 1);; end = path.find('/', end + 1)) {
    const std::string directory = path.substr(0, end);
    if (mkdir(directory.c_str(), end == std::string::npos ? 0700 : 0755) != 0 && errno != EEXIST) {
      Fail("The directory of the configurations cannot be made, path=" + directory, errno);
    }
    if (end == std::string::npos) return;
  }
}

}  // namespace

MonitorFiles::MonitorFiles(const std::string& directory) : directory_(directory) {
  Watch();
  ReadAll();
}

void MonitorFiles::Watch() {
  MakeDirectories(directory_);
  inotify_ = UniqueFd(inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
  if (!inotify_ ||
      inotify_add_watch(inotify_.get(), directory_.c_str(), kFileChanges | kDirectoryGoes | IN_ONLYDIR) < 0) {
    Fail("The configurations cannot be watched, path=" + directory_, errno);
  }
}

bool MonitorFiles::ReadAll() {
  std::set<std::string> names;
  for (const auto& [name, monitor] : monitors_) names.insert(name);
  std::error_code error;
  for (std::filesystem::directory_iterator file(directory_, error), end; !error && file != end; file.increment(error)) {
    const std::string name = file->path().filename().string();
    if (name.ends_with(kSuffix)) names.insert(name);
  }
  bool changed = false;
  for (const std::string& name : names) changed = Read(name) || changed;
  return changed;
}

bool MonitorFiles::Remove(const std::string& name) {
  refused_.erase(name);
  return monitors_.erase(name) != 0;
}

bool MonitorFiles::Refuse(const std::string& name, const std::string& why) {
  std::string& said = refused_[name];
  if (said == why) return false;
  said = why;
  errno = 0;
  QUARROX_LOG_FAILURE("A configuration is not followed, path=%s, reason=%s; %s",
                      log::Text(Join(directory_, name)).c_str(), log::Text(why).c_str(),
                      monitors_.contains(name) ? "what it said before stays in force" : "write it anew");
  return false;
}

// True when something else is in force than before.
bool MonitorFiles::Read(const std::string& name) {
  const std::string path = Join(directory_, name);
  if (access(path.c_str(), R_OK) != 0) {
    const int error = errno;
    return error == ENOENT ? Remove(name) : Refuse(name, strerror(error));
  }
  try {
    Json::Value value;
    if (!fromFile(value, path)) {
      return access(path.c_str(), F_OK) != 0 ? Remove(name) : Refuse(name, "it is not JSON");
    }
    monitors_[name] = ParseMonitor(value);
    refused_.erase(name);
    return true;
  } catch (const Error& error) {
    return Refuse(name, error.reason);
  }
}

// False when not every name is known that something happened to.
bool MonitorFiles::TakeNames(std::set<std::string>& names) {
  alignas(inotify_event) char buffer[16384];
  bool complete = true;
  for (ssize_t size; (size = read(inotify_.get(), buffer, sizeof(buffer))) > 0;) {
    for (ssize_t at = 0; at < size;) {
      const auto& event = *reinterpret_cast<const inotify_event*>(buffer + at);
      at += static_cast<ssize_t>(sizeof(event) + event.len);
      if ((event.mask & (kDirectoryGoes | IN_IGNORED | IN_UNMOUNT | IN_Q_OVERFLOW)) != 0) complete = false;
      if (event.len == 0) continue;
      if (const std::string name = event.name; name.ends_with(kSuffix)) names.insert(name);
    }
  }
  return complete;
}

bool MonitorFiles::Refresh() {
  std::set<std::string> names;
  if (!TakeNames(names)) {
    Watch();
    return ReadAll();
  }
  bool changed = false;
  for (const std::string& name : names) changed = Read(name) || changed;
  return changed;
}

}  // namespace quarrox::notifyd
