// An owned file descriptor.
#pragma once

#include <unistd.h>

#include <cerrno>
#include <utility>

namespace quarrox {

// Closes what it owns when it goes, and leaves errno as it was. Not thread-safe.
class UniqueFd {
 public:
  explicit UniqueFd(int fd = -1) : fd_(fd) {}
  ~UniqueFd() {
    const int error = errno;
    Close();
    errno = error;
  }
  UniqueFd(UniqueFd&& other) noexcept : fd_(std::exchange(other.fd_, -1)) {}
  UniqueFd& operator=(UniqueFd&& other) noexcept {
    std::swap(fd_, other.fd_);
    return *this;
  }

  int get() const { return fd_; }
  explicit operator bool() const { return fd_ >= 0; }

  // Whether closing worked, for who wrote and wants to know.
  bool Close() {
    const int fd = std::exchange(fd_, -1);
    return fd < 0 || close(fd) == 0;
  }

 private:
  int fd_;
};

}  // namespace quarrox
