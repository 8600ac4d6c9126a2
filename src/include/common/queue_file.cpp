#include "common/queue_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <utility>

#include "common/error.h"
#include "common/lock_file.h"
#include "common/strings.h"

namespace quarrox {
namespace {

constexpr size_t kReadSize = size_t{64} * 1024;
constexpr int kAppendFlags = O_RDWR | O_APPEND | O_CREAT;

[[noreturn]] void Fail(const std::string& path) {
  const int error = errno;
  throw Error(kErrSystem, "Failed to append to queue, path=" + path + ", reason=" + strerror(error));
}

bool Lock(int fd, int operation) {
  int result;
  do result = flock(fd, operation);
  while (result != 0 && errno == EINTR);
  return result == 0;
}

int Open(const std::string& path, int flags) {
  return open(path.c_str(), flags | O_CLOEXEC, 0600);
}

bool IsStillAt(int fd, const std::string& path) {
  struct stat mine;
  struct stat there;
  return fstat(fd, &mine) == 0 && stat(path.c_str(), &there) == 0 && mine.st_dev == there.st_dev &&
         mine.st_ino == there.st_ino;
}

// An open queue file with its lock held; both go when it leaves scope. False and errno where that failed.
class LockedQueue {
 public:
  LockedQueue(const std::string& path, int flags) : fd_(Open(path, flags)) {
    if (fd_ && !Lock(fd(), LOCK_EX)) fd_ = UniqueFd();
  }

  explicit operator bool() const { return static_cast<bool>(fd_); }
  int fd() const { return fd_.get(); }

 private:
  UniqueFd fd_;
};

// A producer that died in the middle of a line leaves it torn; the next line must not be glued to it.
bool EndsInsideLine(int fd, off_t size) {
  char last;
  return size > 0 && pread(fd, &last, 1, size - 1) == 1 && last != '\n';
}

// A queue that root makes belongs to whom its directory belongs to, who drains it.
void GiveToOwnerOfDirectory(int fd, const std::string& path) {
  struct stat directory;
  if (geteuid() != 0 || stat((Dirname(path) + "/").c_str(), &directory) != 0 || directory.st_uid == 0) return;
  if (fchown(fd, directory.st_uid, directory.st_gid) != 0) {
    // On a file system without owners everybody may read it.
  }
}

void Append(int fd, const std::string& path, const std::string& lines) {
  const off_t before = lseek(fd, 0, SEEK_END);
  if (before < 0) Fail(path);
  if (before == 0) GiveToOwnerOfDirectory(fd, path);
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

// Another consumer may have taken a queue to the same place meanwhile, but not while this one holds the lock.
bool RenameUnlessTaken(const std::string& path, const std::string& to) {
  struct stat info;
  if (lstat(to.c_str(), &info) == 0) {
    errno = EEXIST;
    return false;
  }
  return rename(path.c_str(), to.c_str()) == 0;
}

}  // namespace

void AppendToQueue(const std::string& path, const std::string& lines) {
  for (;;) {
    const LockedQueue queue(path, kAppendFlags);
    if (!queue) Fail(path);
    if (!IsStillAt(queue.fd(), path)) continue;
    Append(queue.fd(), path, lines);
    return;
  }
}

void AppendToQueueWithLockFile(const std::string& path, const std::string& lines) {
  for (;;) {
    // Opened first: a queue is made with its own mode, and what is still at the path with the lock held is what the
    // lock file opened, too.
    const UniqueFd fd(Open(path, kAppendFlags));
    const int error = errno;
    const LockFile lock(path, true);
    if (!fd) {
      errno = error;
      Fail(path);
    }
    if (!IsStillAt(fd.get(), path)) continue;
    Append(fd.get(), path, lines);
    return;
  }
}

bool TakeQueue(const std::string& path, const std::string& to) {
  for (;;) {
    const LockedQueue queue(path, O_RDWR);
    if (!queue) return false;
    if (IsStillAt(queue.fd(), path)) return RenameUnlessTaken(path, to);
  }
}

bool WaitForProducers(const std::string& taken_path) {
  const UniqueFd fd(open(taken_path.c_str(), O_RDONLY | O_CLOEXEC));
  return fd && Lock(fd.get(), LOCK_SH);
}

// --- reading -------------------------------------------------------------------------------------------------------

QueueLines::QueueLines(const std::string& path) {
  const int error = errno;
  fd_ = UniqueFd(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (!fd_) error_ = std::exchange(errno, error);
}

bool QueueLines::Next(std::string_view& line) {
  do {
    if (NextInBuffer(line)) return true;
  } while (Fill());
  return false;
}

bool QueueLines::NextInBuffer(std::string_view& line) {
  if (begin_ == end_) return false;
  const char* begin = buffer_.data() + begin_;
  const auto* newline = static_cast<const char*>(memchr(begin + searched_, '\n', end_ - begin_ - searched_));
  searched_ = 0;
  if (newline == nullptr && !at_end_) {
    searched_ = end_ - begin_;
    return false;
  }
  line = {begin, newline != nullptr ? static_cast<size_t>(newline - begin) : end_ - begin_};
  begin_ += line.size() + (newline != nullptr ? 1 : 0);
  overlong_ = std::exchange(cut_, false);
  return true;
}

// Reads more. False at the end or on an error.
bool QueueLines::Fill() {
  if (at_end_ || error_ != 0) return false;
  if (searched_ > kMaxLine) {  // only the beginning is kept while the rest goes by
    cut_ = true;
    searched_ = kMaxLine;
    end_ = begin_ + kMaxLine;
  }
  if (begin_ > 0) {
    memmove(buffer_.data(), buffer_.data() + begin_, end_ - begin_);
    end_ -= begin_;
    begin_ = 0;
  }
  if (buffer_.size() < end_ + kReadSize) buffer_.resize(std::max(buffer_.size() * 2, end_ + kReadSize));
  ssize_t n;
  do n = read(fd_.get(), buffer_.data() + end_, buffer_.size() - end_);
  while (n < 0 && errno == EINTR);
  if (n < 0) {
    error_ = errno;
    return false;
  }
  at_end_ = n == 0;
  end_ += static_cast<size_t>(n);
  return true;
}

}  // namespace quarrox
