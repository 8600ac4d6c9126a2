#include "common/lock_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "common/log.h"

namespace quarrox {
namespace {
constexpr int kMaxAttempts = 64;
constexpr useconds_t kRetryStepMicroseconds = 100000;
constexpr int kRetrySteps = 10;
constexpr mode_t kLockMode = 0644;

// What exists is opened without O_CREAT: in a directory like /tmp the kernel refuses that flag, even to root, on a file
// of somebody else (fs.protected_regular). A pipe that somebody has put there does not hold the caller up. A new file
// gets its mode whatever the umask is, so that others can open it.
int OpenLock(const std::string& path) {
  const int error = errno;
  int fd = open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
  if (fd >= 0 || errno != ENOENT) return fd;
  fd = open(path.c_str(), O_RDONLY | O_CREAT | O_NONBLOCK | O_CLOEXEC, kLockMode);
  if (fd < 0) return fd;
  if (fchmod(fd, kLockMode) != 0) {
    // Somebody else has made it meanwhile.
  }
  errno = error;
  return fd;
}

}  // namespace

LockFile::LockFile(const std::string& path, bool exclusive) : fd_(-1), path_(path) {
  for (int budget = kMaxAttempts;;) {
    if (0 > (fd_ = OpenLock(path_))) {
      QUARROX_THROW("0 > (fd_ = open(path_.c_str(), O_RDONLY | O_CREAT, 0644))", kErrLockFile,
                    "open failed, path=" + path_ + ", reason=" + strerror(quarrox_throw_errno));
    }
    if (0 == flock(fd_, (exclusive ? LOCK_EX : LOCK_SH) | LOCK_NB)) return;
    const int error = errno;
    close(fd_);
    fd_ = -1;
    if (error != EINTR && error != EAGAIN) throw Error(kErrLockFile, strerror(error));
    usleep(kRetryStepMicroseconds * static_cast<useconds_t>(rand() % kRetrySteps));  // NOLINT: any spread serves
    if (budget-- == 1) throw Error(kErrLockFile, "Exceed max retry, path=" + path_);
  }
}

LockFile::~LockFile() {
  if (fd_ < 0) return;
  flock(fd_, LOCK_UN);
  close(fd_);
}

}  // namespace quarrox
