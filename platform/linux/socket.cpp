#include "vexo/socket.h"

#include <sys/socket.h>
#include <sys/time.h>
#include <sys/uio.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdint>
#include <cstring>
#include <iterator>
#include <limits>
#include <utility>

#include "common/unique_fd.h"

using std::chrono::steady_clock;

namespace vexodaemon {
namespace {

using Microseconds = std::chrono::microseconds;

// The first step in which a frame is read; later ones double what has arrived.
constexpr size_t kFirstStep = 64 * 1024;

// Longer waits are as good as endless, and this one overflows no clock: ten years.
constexpr long kLongestTimeout = 10L * 366 * 24 * 3600;

bool Fail(int error) {
  errno = error;
  return false;
}

// All of several pieces, as one message where the socket takes it: the peer is woken once. Uses up `pieces`.
bool SendAll(int fd, iovec* pieces, size_t count) {
  while (count > 0) {
    msghdr message = {};
    message.msg_iov = pieces;
    message.msg_iovlen = count;
    const ssize_t sent = sendmsg(fd, &message, MSG_NOSIGNAL);
    if (sent < 0 && errno == EINTR) continue;
    if (sent < 0) return false;
    auto left = static_cast<size_t>(sent);
    for (; count > 0 && left >= pieces->iov_len; ++pieces, --count) left -= pieces->iov_len;
    if (count == 0) break;
    pieces->iov_base = static_cast<char*>(pieces->iov_base) + left;
    pieces->iov_len -= left;
  }
  return true;
}

bool ReceiveAll(int fd, char* data, size_t size) {
  while (size > 0) {
    const ssize_t n = recv(fd, data, size, 0);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return false;
    if (n == 0) return Fail(0);  // the peer closed
    data += n;
    size -= static_cast<size_t>(n);
  }
  return true;
}

bool ReceiveFrame(int fd, size_t length, std::string& frame) {
  while (frame.size() < length) {
    const size_t have = frame.size();
    const size_t step = std::min(length - have, std::max(have, kFirstStep));
    frame.resize(have + step);
    if (!ReceiveAll(fd, frame.data() + have, step)) return false;
  }
  return true;
}

// A send time-out bounds how long a Unix socket waits for a place among the connections that are not accepted yet.
bool SetSendTimeout(int fd, Microseconds timeout) {
  timeval value = {};
  value.tv_sec = static_cast<time_t>(timeout.count() / 1000000);
  value.tv_usec = static_cast<suseconds_t>(timeout.count() % 1000000);
  return setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &value, sizeof(value)) == 0;
}

bool ConnectUntil(int fd, const sockaddr_un& address, steady_clock::time_point deadline) {
  for (;;) {
    const auto left = std::chrono::duration_cast<Microseconds>(deadline - steady_clock::now());
    if (left.count() <= 0) return Fail(ETIMEDOUT);
    if (!SetSendTimeout(fd, left)) return false;
    if (connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0) return true;
    if (errno == EAGAIN) return Fail(ETIMEDOUT);
    if (errno != EINTR) return false;
  }
}

}  // namespace

SockConnection::~SockConnection() {
  if (fd_ >= 0) close(fd_);
}

bool SockConnection::Send(const std::string& text) {
  if (text.size() >= std::numeric_limits<uint32_t>::max()) return Fail(EMSGSIZE);
  const uint32_t length = static_cast<uint32_t>(text.size() + 1);
  char header[sizeof(length)];
  memcpy(header, &length, sizeof(length));
  iovec pieces[] = {{header, sizeof(header)}, {const_cast<char*>(text.c_str()), length}};
  return SendAll(fd_, pieces, std::size(pieces));
}

bool SockConnection::Recv(std::string& text) {
  char header[sizeof(uint32_t)];
  if (!ReceiveAll(fd_, header, sizeof(header))) return false;
  uint32_t length;
  memcpy(&length, header, sizeof(length));
  if (length == 0) return Fail(EPROTO);
  std::string frame;
  if (!ReceiveFrame(fd_, length, frame)) return false;
  if (frame.back() != '\0') return Fail(EPROTO);
  frame.pop_back();
  text = std::move(frame);
  return true;
}

DomainSockConnection::DomainSockConnection(const std::string& path) : path_(path) {}

bool DomainSockConnection::Connect(long timeout) {
  if (fd_ >= 0) close(std::exchange(fd_, -1));
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  if (timeout <= 0) return Fail(EINVAL);
  if (path_.size() >= sizeof(address.sun_path)) return Fail(ENAMETOOLONG);
  memcpy(address.sun_path, path_.data(), path_.size());

  fd_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd_ < 0) return false;
  const auto deadline = steady_clock::now() + std::chrono::seconds(std::min(timeout, kLongestTimeout));
  if (ConnectUntil(fd_, address, deadline) && SetSendTimeout(fd_, Microseconds(0))) return true;
  const quarrox::UniqueFd failed(std::exchange(fd_, -1));  // closes it and keeps errno
  return false;
}

}  // namespace vexodaemon
