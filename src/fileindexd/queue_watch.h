// Tells when something was written into a file that comes and goes, with its directory and what that is mounted on.
//
// It watches the directory of the file; where that does not exist, the nearest one above it that does, for the next
// component on the way. What is mounted over a watched directory is no event of that directory, so the table of mounts
// is watched as well. Nothing is polled.
#pragma once

#include <cstddef>
#include <string>

#include "common/unique_fd.h"

struct inotify_event;
struct pollfd;

namespace quarrox::fileindexd {

// Not thread-safe.
class QueueWatch {
 public:
  explicit QueueWatch(const std::string& path) : path_(path) {}

  const std::string& path() const { return path_; }

  // Watches the right directory and forgets what was reported. Call it before each look at the file: what happens after
  // the look is then reported. Throws Error 502 where the kernel grants no watch.
  void Arm();

  // What poll() is to wait for.
  static constexpr size_t kPollFds = 2;
  void FillPollFds(pollfd* fds) const;

  // Takes what was reported, after poll() has filled these. True where that is a reason to Arm() and to look.
  bool Reported(const pollfd* fds);

 private:
  void Open();
  bool TakeEvents();
  bool TryWatch(const std::string& directory, const std::string& name);
  bool Concerns(const inotify_event& event) const;

  const std::string path_;
  UniqueFd inotify_;
  UniqueFd mounts_;
  int watch_ = -1;
  std::string name_;  // the entry of the watched directory that matters
};

}  // namespace quarrox::fileindexd
