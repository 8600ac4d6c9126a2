#include "common/listener.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <cerrno>
#include <cstring>

#include "common/error.h"
#include "common/log.h"

namespace quarrox {
namespace {

[[noreturn]] void Fail(const std::string& call) {
  const int error = errno;
  throw Error(kErrSystem, call + " failed, reason=" + strerror(error));
}

UniqueFd LockAlone(const std::string& path, const std::string& daemon) {
  UniqueFd lock(open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
  if (!lock) Fail("open " + path);
  if (flock(lock.get(), LOCK_EX | LOCK_NB) == 0) return lock;
  if (errno != EWOULDBLOCK) Fail("flock " + path);
  throw Error(kErrSystem, "Another " + daemon + " is running: it holds the lock of " + path);
}

}  // namespace

DaemonListener::DaemonListener(const std::string& path, gid_t group, const std::string& daemon, Audience audience)
    : path_(path), lock_(LockAlone(path + ".lock", daemon)) {
  Listen(group, audience == Audience::kEverybody ? 0666 : 0660);
}

DaemonListener::~DaemonListener() {
  Close();
}

// The socket listens before it takes its place, so that nobody who connects is turned away in between.
void DaemonListener::Listen(gid_t group, mode_t mode) {
  const std::string fresh = path_ + ".new";
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  if (fresh.size() >= sizeof(address.sun_path)) throw Error(kErrSystem, "The socket's path is too long: " + path_);
  memcpy(address.sun_path, fresh.c_str(), fresh.size());
  unlink(fresh.c_str());
  UniqueFd listening(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!listening) Fail("socket");
  const auto* generic = reinterpret_cast<const sockaddr*>(&address);
  if (bind(listening.get(), generic, sizeof(address)) != 0) Fail("bind " + fresh);
  constexpr auto kSame = static_cast<uid_t>(-1);
  if (chown(fresh.c_str(), kSame, group) != 0) QUARROX_LOG_FAILURE("chown %s failed", fresh.c_str());
  if (chmod(fresh.c_str(), mode) != 0) Fail("chmod " + fresh);
  if (listen(listening.get(), SOMAXCONN) != 0) Fail("listen");
  if (rename(fresh.c_str(), path_.c_str()) != 0) Fail("rename " + fresh);
  socket_ = std::move(listening);
}

UniqueFd DaemonListener::Accept() const {
  return UniqueFd(accept4(socket_.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
}

void DaemonListener::Withdraw() {
  if (socket_ && !withdrawn_) unlink(path_.c_str());
  withdrawn_ = true;
}

void DaemonListener::Close() {
  Withdraw();
  socket_.Close();
}

}  // namespace quarrox
