// How the configured folders are watched, for people: one file, which is written as a whole when something changes.
//
//   {"pid": 812, "since": 1763761000, "folders": {"/srv/docs": {"method": "fanotify", "since": 1763761000, "reason":
//   ""}}}
//
// "method" is "fanotify", "inotify", or empty where nothing hears the folder; "reason" then says why, unless the folder
// is not there. Times are in seconds since the epoch. Not thread-safe.
#pragma once

#include <cstdint>
#include <map>
#include <string>

namespace quarrox::notifyd {

inline constexpr char kWatchStatusPath[] = "/var/run/vexonotifyd.status";

class WatchStatus {
 public:
  struct Folder {
    std::string method = {};
    std::string reason = {};
    int64_t since = 0;
  };
  using Folders = std::map<std::string, Folder>;  // by configured path

  explicit WatchStatus(std::string file);
  ~WatchStatus();  // removes the file
  WatchStatus(const WatchStatus&) = delete;
  WatchStatus& operator=(const WatchStatus&) = delete;

  // What holds now; "since" is filled in here. That it cannot be written is logged once and keeps nothing from being
  // watched.
  void Tell(Folders folders);

 private:
  void Write();

  const std::string file_;
  const int64_t started_;
  Folders folders_;
  bool written_ = false;
  bool failed_ = false;
};

}  // namespace quarrox::notifyd
