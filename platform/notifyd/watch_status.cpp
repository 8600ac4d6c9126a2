#include "watch_status.h"

#include <unistd.h>

#include <cerrno>
#include <ctime>
#include <utility>

#include "common/json.h"
#include "common/log.h"

namespace quarrox::notifyd {

WatchStatus::WatchStatus(std::string file) : file_(std::move(file)), started_(time(nullptr)) {}

WatchStatus::~WatchStatus() {
  if (written_) unlink(file_.c_str());
}

void WatchStatus::Tell(Folders folders) {
  bool changed = folders.size() != folders_.size();
  for (auto& [path, folder] : folders) {
    const auto before = folders_.find(path);
    const bool is_same = before != folders_.end() && before->second.method == folder.method;
    folder.since = is_same ? before->second.since : time(nullptr);
    changed = changed || !is_same || before->second.reason != folder.reason;
  }
  folders_ = std::move(folders);
  if (changed || !written_) Write();
}

void WatchStatus::Write() {
  Json::Value status(Json::objectValue);
  status["pid"] = Json::Int64{getpid()};
  status["since"] = Json::Int64{started_};
  status["folders"] = Json::Value(Json::objectValue);
  for (const auto& [path, folder] : folders_) {
    Json::Value& told = status["folders"][path];
    told["method"] = folder.method;
    told["reason"] = folder.reason;
    told["since"] = Json::Int64{folder.since};
  }
  written_ = toFile(status, file_);
  if (!written_ && !std::exchange(failed_, true)) {
    QUARROX_LOG_FAILURE("%s cannot be written, so nobody is told how folders are watched", file_.c_str());
  }
  errno = 0;
}

}  // namespace quarrox::notifyd
