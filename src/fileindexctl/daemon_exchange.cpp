#include "daemon_exchange.h"

#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>

#include <cerrno>
#include <cstdint>
#include <cstring>

#include "common/error.h"
#include "common/json.h"
#include "common/unique_fd.h"

namespace quarrox::ctl {
namespace {

[[noreturn]] void Fail(const std::string& what) {
  throw Error(kErrSystem, what);
}

[[noreturn]] void FailCall(int error) {
  if (error == ENOENT || error == ECONNREFUSED) Fail("nobody listens there");
  Fail(error == EAGAIN || error == EINPROGRESS ? "it does not answer in time" : strerror(error));
}

// The time is for each of connecting, sending, and the two parts of a frame.
UniqueFd Connect(const std::string& path, int seconds) {
  const timeval patience = {.tv_sec = seconds, .tv_usec = 0};
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof(address.sun_path)) FailCall(ENAMETOOLONG);
  memcpy(address.sun_path, path.data(), path.size());
  UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (!fd || setsockopt(fd.get(), SOL_SOCKET, SO_SNDTIMEO, &patience, sizeof(patience)) != 0 ||
      setsockopt(fd.get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof(patience)) != 0 ||
      connect(fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0) {
    FailCall(errno);
  }
  return fd;
}

void SendFrame(int fd, const std::string& text) {
  const auto length = static_cast<uint32_t>(text.size() + 1);
  std::string frame(sizeof(length), '\0');
  memcpy(frame.data(), &length, sizeof(length));
  frame.append(text.c_str(), length);
  const ssize_t sent = send(fd, frame.data(), frame.size(), MSG_NOSIGNAL);
  if (sent < 0) FailCall(errno);
  if (static_cast<size_t>(sent) != frame.size()) FailCall(EAGAIN);
}

void Receive(int fd, void* data, size_t size) {
  const ssize_t received = recv(fd, data, size, MSG_WAITALL);
  if (received < 0) FailCall(errno);
  if (static_cast<size_t>(received) != size) Fail("its answer is cut short");
}

DaemonAnswer TryExchange(const std::string& socket_path, const Json::Value& request, ExchangeLimits limits) {
  const UniqueFd fd = Connect(socket_path, limits.seconds);
  SendFrame(fd.get(), toString(request));
  uint32_t length = 0;
  Receive(fd.get(), &length, sizeof(length));
  if (length == 0 || length > limits.longest) Fail("its answer is no frame");
  std::string text(length, '\0');
  Receive(fd.get(), text.data(), length);
  text.pop_back();
  DaemonAnswer answer;
  if (!fromString(answer.object, text) || !answer.object.isObject() || !answer.object["success"].isBool()) {
    Fail("its answer is none: " + text.substr(0, 200));
  }
  ucred peer = {};
  socklen_t size = sizeof(peer);
  if (getsockopt(fd.get(), SOL_SOCKET, SO_PEERCRED, &peer, &size) == 0) answer.daemon = peer.pid;
  return answer;
}

}  // namespace

DaemonAnswer Exchange(const std::string& socket_path, const Json::Value& request, ExchangeLimits limits) {
  try {
    return TryExchange(socket_path, request, limits);
  } catch (const Error& error) {
    throw Error(error.code, "no answer at " + socket_path + ": " + error.reason);
  }
}

}  // namespace quarrox::ctl
