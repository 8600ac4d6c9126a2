// The monitor configurations, as the files of a directory: each file whose name ends in ".json" is one. They are
// written whole and renamed into place; what comes, changes and goes is followed by inotify. Not thread-safe.
#pragma once

#include <map>
#include <set>
#include <string>

#include "common/unique_fd.h"
#include "monitor.h"

namespace quarrox::notifyd {

inline constexpr char kMonitorDirectory[] = "/var/lib/vexonotifyd";

class MonitorFiles {
 public:
  // Makes the directory (mode 0700) where it is missing and reads all that is in it. Throws Error 502 where it cannot
  // be watched.
  explicit MonitorFiles(const std::string& directory);

  // Readable when something was reported.
  int fd() const { return inotify_.get(); }

  // Takes what was reported and reads the files that it concerns. A file that cannot be read or is wrong is logged, and
  // what it said before stays in force. True when something else is in force than before.
  bool Refresh();

  // What is in force, by file name.
  const std::map<std::string, Monitor>& monitors() const { return monitors_; }

 private:
  void Watch();
  bool ReadAll();
  bool Read(const std::string& name);
  bool Remove(const std::string& name);
  bool Refuse(const std::string& name, const std::string& why);
  bool TakeNames(std::set<std::string>& names);

  const std::string directory_;
  UniqueFd inotify_;
  std::map<std::string, Monitor> monitors_;
  std::map<std::string, std::string> refused_;  // what is wrong with a file, as logged
};

}  // namespace quarrox::notifyd
