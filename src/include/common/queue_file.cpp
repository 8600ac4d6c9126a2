#include "common/queue_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "common/error.h"
#include "common/unique_fd.h"

namespace quarrox {
namespace {

[[noreturn]] void Fail(const std::string& path) {
  const int error = errno;
  throw Error(kErrSystem, "Failed to append to queue, path=" + path + ", reason=" + strerror(error));
}

// An open queue file with its lock held; both go when it leaves scope.
class LockedQueue {
 public:
  explicit LockedQueue(const std::string& path)
      : fd_(open(path.c_str(), O_RDWR | O_APPEND | O_CREAT | O_CLOEXEC, 0600)) {
    if (!fd_) Fail(path);
    int result;
    do result = flock(fd(), LOCK_EX);
    while (result != 0 && errno == EINTR);
    if (result != 0) Fail(path);
  }

  int fd() const { return fd_.get(); }
  bool IsStillAt(const std::string& path) const {
    struct stat mine;
    struct stat there;
    return fstat(fd(), &mine) == 0 && stat(path.c_str(), &there) == 0 && mine.st_dev == there.st_dev &&
           mine.st_ino == there.st_ino;
  }

 private:
  UniqueFd fd_;
};

// A producer that died in the middle of a line leaves it torn; the next line must not be glued to it.
bool EndsInsideLine(int fd, off_t size) {
  char last;
  return size > 0 && pread(fd, &last, 1, size - 1) == 1 && last != '\n';
}

void Append(int fd, const std::string& path, const std::string& lines) {
  const off_t before = lseek(fd, 0, SEEK_END);
  if (before < 0) Fail(path);
  const std::string text = EndsInsideLine(fd, before) ? "\n" + lines : lines;
  ssize_t written;
  do written = write(fd, text.data(), text.size());
  while (written < 0 && errno == EINTR);
  if (written == static_cast<ssize_t>(text.size())) return;
  const int error = written < 0 ? errno : ENOSPC;
  if (ftruncate(fd, before) != 0) {
    // Nothing more can be done: the reader skips the torn line.
  }
  errno = error;
  Fail(path);
}

}  // namespace

void AppendToQueue(const std::string& path, const std::string& lines) {
  for (;;) {
    const LockedQueue queue(path);
    if (!queue.IsStillAt(path)) continue;
    Append(queue.fd(), path, lines);
    return;
  }
}

}  // namespace quarrox
