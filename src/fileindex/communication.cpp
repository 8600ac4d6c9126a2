#include "fileindex/communication.h"

#include <pthread.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdint>
#include <cstring>
#include <functional>

#include "common/json.h"
#include "common/log.h"
#include "common/unique_fd.h"

namespace quarrox::fileindex {
namespace {

constexpr int kConnectAttempts = 5;
constexpr unsigned int kMaxPiece = 1024;
constexpr int kMaxInterruptions = 10;
constexpr timeval kSendTimeout = {.tv_sec = 1, .tv_usec = 0};

std::string SystemReason(const char* what, int error) {
  return std::string(what) + " failed, reason=" + strerror(error);
}

// Keeps SIGPIPE from the calling thread while it writes. Not MSG_NOSIGNAL: what is written to need not be a socket.
class SigpipeBlock {
 public:
  SigpipeBlock() {
    sigset_t pending;
    sigpending(&pending);
    pending_before_ = sigismember(&pending, SIGPIPE) == 1;
    sigemptyset(&sigpipe_);
    sigaddset(&sigpipe_, SIGPIPE);
    pthread_sigmask(SIG_BLOCK, &sigpipe_, &old_mask_);
  }
  ~SigpipeBlock() { pthread_sigmask(SIG_SETMASK, &old_mask_, nullptr); }
  SigpipeBlock(const SigpipeBlock&) = delete;
  SigpipeBlock& operator=(const SigpipeBlock&) = delete;

  // Takes back the signal that a write raised. The kernel hands out a thread's own signals before the process's, so one
  // that somebody sent to the process meanwhile is still delivered.
  void Swallow() const {
    if (pending_before_) return;
    const timespec at_once = {};
    while (sigtimedwait(&sigpipe_, nullptr, &at_once) < 0 && errno == EINTR) {
    }
  }

 private:
  sigset_t sigpipe_;
  sigset_t old_mask_;
  bool pending_before_;
};

// write() that fails with EPIPE and nothing else.
ssize_t WriteWithoutSigpipe(int fd, const unsigned char* buf, size_t count) {
  const SigpipeBlock block;
  const ssize_t written = write(fd, buf, count);
  if (written < 0 && errno == EPIPE) {
    block.Swallow();
    errno = EPIPE;
  }
  return written;
}

// Moves exactly `count` bytes by calls of `move`, which is told how many are done and how many it may move.
void MoveBytes(const char* function, const char* name, unsigned int count,
               const std::function<ssize_t(unsigned int done, unsigned int size)>& move) {
  int interruptions = kMaxInterruptions;
  for (unsigned int done = 0; done < count;) {
    const ssize_t size = move(done, std::min(count - done, kMaxPiece));
    if (size >= 0) {
      done += static_cast<unsigned int>(size);  // 0, the end of what is read, is wanted to be tried again
    } else if (errno != EINTR || interruptions-- == 0) {
      QUARROX_THROW_IN(function, "0 > size", kErrSystem, SystemReason(name, errno));
    }
  }
}

// One look for the daemon a second, as long as it has no socket. A failure shows at the first write.
void Connect(int fd) {
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  static_assert(sizeof(kDaemonSocketPath) <= sizeof(address.sun_path));
  memcpy(address.sun_path, kDaemonSocketPath, sizeof(kDaemonSocketPath));
  for (int attempt = 1; 0 > connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof(address)); ++attempt) {
    if (errno != ENOENT || attempt == kConnectAttempts) return;
    sleep(1);
  }
}

void WriteFrame(int fd, const std::string& text) {
  const auto length = static_cast<uint32_t>(text.size() + 1);
  BufferWrite(fd, sizeof(length), reinterpret_cast<const unsigned char*>(&length));
  BufferWrite(fd, length, reinterpret_cast<const unsigned char*>(text.c_str()));
}

// The answer is dropped piece by piece: no memory is given for what a length only promises.
void DropFrame(int fd) {
  uint32_t length = 0;
  BufferRead(fd, sizeof(length), reinterpret_cast<unsigned char*>(&length));
  unsigned char piece[kMaxPiece];
  MoveBytes("BufferRead", "read", length, [&](unsigned int, unsigned int size) { return read(fd, piece, size); });
}

}  // namespace

void SendCommandToDaemon(const std::string& command, const Json::Value& data) {
  const UniqueFd fd_socket(socket(PF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (!fd_socket) {
    QUARROX_THROW("0 > (fd_socket = socket(PF_UNIX, SOCK_STREAM, 0))", kErrSystem, SystemReason("socket", errno));
  }
  Connect(fd_socket.get());
  if (0 > setsockopt(fd_socket.get(), SOL_SOCKET, SO_SNDTIMEO, &kSendTimeout, sizeof(kSendTimeout))) {
    QUARROX_THROW("0 > setsockopt(fd_socket, SOL_SOCKET, SO_SNDTIMEO, (char *)&timeout, sizeof(timeout))", kErrSystem,
                  SystemReason("setsockopt", errno));
  }
  Json::Value request(Json::objectValue);
  request["type"] = command;
  request["data"] = data;
  WriteFrame(fd_socket.get(), toString(request));
  DropFrame(fd_socket.get());
}

void BufferRead(int fd, unsigned int count, unsigned char* buf) {
  MoveBytes(__func__, "read", count, [&](unsigned int done, unsigned int size) { return read(fd, buf + done, size); });
}

void BufferWrite(int fd, unsigned int count, const unsigned char* buf) {
  MoveBytes(__func__, "write", count, [&](unsigned int done, unsigned int size) {
    errno = 0;  // a write of 0 bytes fails, too, and says no reason
    const ssize_t written = WriteWithoutSigpipe(fd, buf + done, size);
    return written == 0 ? -1 : written;
  });
}

}  // namespace quarrox::fileindex
