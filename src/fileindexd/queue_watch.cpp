#include "queue_watch.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "common/strings.h"
#include "wait.h"

namespace quarrox::fileindexd {
namespace {

constexpr uint32_t kAppears = IN_CREATE | IN_MOVED_TO;
constexpr uint32_t kWritten = IN_MODIFY | IN_CLOSE_WRITE;
constexpr uint32_t kDirectoryGoes = IN_DELETE_SELF | IN_MOVE_SELF;

// Set by the kernel beside what was asked for: the watch is gone, or events were dropped.
constexpr uint32_t kUnasked = IN_IGNORED | IN_UNMOUNT | IN_Q_OVERFLOW;

bool IsDirectory(const std::string& path) {
  struct stat there;
  return stat(path.c_str(), &there) == 0 && S_ISDIR(there.st_mode);
}

}  // namespace

bool QueueWatch::TryWatch(const std::string& directory, const std::string& name) {
  const uint32_t mask = kAppears | kWritten | kDirectoryGoes | IN_ONLYDIR;
  const int watch = inotify_add_watch(inotify_.get(), directory.c_str(), mask);
  if (watch < 0 && (errno == ENOENT || errno == ENOTDIR)) return false;
  if (watch < 0) FailCall("inotify_add_watch " + directory);
  if (watch_ >= 0 && watch_ != watch) inotify_rm_watch(inotify_.get(), watch_);
  watch_ = watch;
  name_ = name;
  return true;
}

void QueueWatch::Open() {
  inotify_ = UniqueFd(inotify_init1(IN_CLOEXEC | IN_NONBLOCK));
  if (!inotify_) FailCall("inotify_init1");
  mounts_ = UniqueFd(open("/proc/self/mountinfo", O_RDONLY | O_CLOEXEC));
}

void QueueWatch::Arm() {
  if (!inotify_) Open();
  TakeEvents();
  // A directory that is made between the failure for it and the watch above it is not reported; so this goes on until
  // there is no directory at what the watched one waits for.
  std::string child;
  do {
    child.clear();
    std::string directory = Dirname(path_);
    std::string name = Basename(path_);
    while (!TryWatch(directory.empty() ? "/" : directory, name)) {
      child = directory;
      name = Basename(directory);
      directory = Dirname(directory);
    }
  } while (!child.empty() && IsDirectory(child));
}

void QueueWatch::FillPollFds(pollfd* fds) const {
  fds[0] = {inotify_.get(), POLLIN, 0};
  fds[1] = {mounts_.get(), POLLPRI, 0};
}

bool QueueWatch::Concerns(const inotify_event& event) const {
  if ((event.mask & IN_Q_OVERFLOW) != 0) return true;
  if (event.wd != watch_) return false;  // left from a directory that is watched no more
  if ((event.mask & (kDirectoryGoes | kUnasked)) != 0) return true;
  return event.len > 0 && name_ == event.name;
}

bool QueueWatch::TakeEvents() {
  alignas(inotify_event) char buffer[16384];
  bool concerns = false;
  for (ssize_t size; (size = read(inotify_.get(), buffer, sizeof(buffer))) > 0;) {
    for (ssize_t at = 0; at < size;) {
      const auto& event = *reinterpret_cast<const inotify_event*>(buffer + at);
      concerns = concerns || Concerns(event);
      at += static_cast<ssize_t>(sizeof(event) + event.len);
    }
  }
  return concerns;
}

bool QueueWatch::Reported(const pollfd* fds) {
  // The kernel says only once, to poll(), that the table of mounts has changed.
  const bool mounts_changed = fds[1].revents != 0;
  return TakeEvents() || mounts_changed;
}

}  // namespace quarrox::fileindexd
