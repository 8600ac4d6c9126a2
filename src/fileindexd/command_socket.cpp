#include "command_socket.h"

#include <fcntl.h>
#include <sys/epoll.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <iterator>
#include <utility>

#include "common/log.h"

namespace quarrox::fileindexd {
namespace {

// How long no client is accepted where the process has no descriptor left.
constexpr std::chrono::seconds kAcceptPause(1);

UniqueFd LockAlone(const std::string& path) {
  UniqueFd lock(open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
  if (!lock) FailCall("open " + path);
  if (flock(lock.get(), LOCK_EX | LOCK_NB) == 0) return lock;
  if (errno != EWOULDBLOCK) FailCall("flock " + path);
  throw Error(kErrSystem, "Another fileindexd is running: it holds the lock of " + path);
}

// The answer is far smaller than any socket's buffer, so one that cannot be written at once has nobody to read it.
// Nothing follows it, but what the client still sends is to be read: closing now would fail its writing, and it might
// never look at the answer.
void Answer(int fd, const std::string& frame) {
  send(fd, frame.data(), frame.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
  shutdown(fd, SHUT_WR);
}

void Refuse(int fd, const Error& error) {
  Answer(fd, Refusal(error.code, error.reason));
  errno = 0;
  QUARROX_LOG_FAILURE("A client is refused, reason: %s", error.reason.c_str());
}

}  // namespace

CommandSocket::CommandSocket(const std::string& path)
    : path_(path), lock_(LockAlone(path + ".lock")), epoll_(epoll_create1(EPOLL_CLOEXEC)) {
  if (!epoll_) FailCall("epoll_create1");
  Listen();
}

CommandSocket::~CommandSocket() {
  Close();
}

// The socket listens before it takes its place, so that nobody who connects is turned away in between.
void CommandSocket::Listen() {
  const std::string fresh = path_ + ".new";
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  if (fresh.size() >= sizeof(address.sun_path)) throw Error(kErrSystem, "The socket's path is too long: " + path_);
  memcpy(address.sun_path, fresh.c_str(), fresh.size());
  unlink(fresh.c_str());
  listener_ = UniqueFd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!listener_) FailCall("socket");
  const auto* generic = reinterpret_cast<const sockaddr*>(&address);
  if (bind(listener_.get(), generic, sizeof(address)) != 0) FailCall("bind " + fresh);
  constexpr auto kSame = static_cast<uid_t>(-1);
  if (chown(fresh.c_str(), kSame, rights_.group()) != 0) QUARROX_LOG_FAILURE("chown %s failed", fresh.c_str());
  if (chmod(fresh.c_str(), 0660) != 0) FailCall("chmod " + fresh);
  if (listen(listener_.get(), SOMAXCONN) != 0) FailCall("listen");
  if (rename(fresh.c_str(), path_.c_str()) != 0) FailCall("rename " + fresh);
  SetAccepting(true);
}

void CommandSocket::Watch(int fd, int operation, unsigned int events) {
  epoll_event event = {};
  event.events = events;
  event.data.fd = fd;
  if (epoll_ctl(epoll_.get(), operation, fd, &event) != 0) FailCall("epoll_ctl");
}

void CommandSocket::SetAccepting(bool accepting) {
  if (accepting_ == accepting) return;
  Watch(listener_.get(), accepting ? EPOLL_CTL_ADD : EPOLL_CTL_DEL, EPOLLIN);
  accepting_ = accepting;
  accept_again_ = kNever;
}

Clock::time_point CommandSocket::Deadline() const {
  Clock::time_point first = accept_again_;
  for (const auto& [fd, client] : clients_) first = std::min(first, client.deadline);
  return first;
}

void CommandSocket::Process(std::vector<Command>& commands) {
  epoll_event events[64];
  const int count = epoll_wait(epoll_.get(), events, static_cast<int>(std::size(events)), 0);
  bool knock = false;
  for (int i = 0; i < count; ++i) {
    if (events[i].data.fd == listener_.get()) {
      knock = true;
    } else {
      Serve(events[i].data.fd, commands);
    }
  }
  Expire();
  // Last, because a new client may get the descriptor of one that has just gone.
  if (knock) Accept();
  if (!accepting_ && clients_.size() < kMaxClients && (accept_again_ == kNever || accept_again_ <= Clock::now())) {
    SetAccepting(true);
  }
}

void CommandSocket::Accept() {
  while (clients_.size() < kMaxClients) {
    UniqueFd fd(accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
    if (fd) {
      Admit(std::move(fd));
      continue;
    }
    if (errno == EAGAIN) return;
    if (errno == EINTR || errno == ECONNABORTED) continue;
    QUARROX_LOG_FAILURE("%s", "accept4 failed");
    SetAccepting(false);
    accept_again_ = Clock::now() + kAcceptPause;
    return;
  }
  SetAccepting(false);
}

void CommandSocket::Admit(UniqueFd fd) {
  const int number = fd.get();
  const bool allowed = rights_.MayCommand(number);
  Watch(number, EPOLL_CTL_ADD, EPOLLIN);
  Client& client = clients_.emplace(number, Client{std::move(fd), Clock::now() + kClientTime}).first->second;
  if (allowed) return;
  Refuse(number, Error(kErrSystem, "The user may not give commands"));
  client.answered = true;
}

void CommandSocket::Serve(int fd, std::vector<Command>& commands) {
  const auto found = clients_.find(fd);
  if (found == clients_.end()) return;
  Client& client = found->second;
  char buffer[65536];
  const ssize_t size = read(fd, buffer, sizeof(buffer));
  if (size < 0 && (errno == EAGAIN || errno == EINTR)) return;
  if (size <= 0) {
    if (!client.answered) Refuse(fd, Error(kErrBadParameter, "The request was cut short"));
    clients_.erase(found);
  } else if (!client.answered) {
    Take(client, buffer, static_cast<size_t>(size), commands);
  }
}

void CommandSocket::Take(Client& client, const char* data, size_t size, std::vector<Command>& commands) {
  try {
    if (!client.reader.Add(data, size)) return;
    Command command = ParseCommand(client.reader.Text());
    Answer(client.fd.get(), Acceptance());
    commands.push_back(std::move(command));
  } catch (const Error& error) {
    Refuse(client.fd.get(), error);
  }
  client.answered = true;
  client.reader = RequestReader();
}

void CommandSocket::Expire() {
  const Clock::time_point now = Clock::now();
  for (auto next = clients_.begin(); next != clients_.end();) {
    const Client& client = next->second;
    if (client.deadline > now) {
      ++next;
      continue;
    }
    if (!client.answered) Refuse(next->first, Error(kErrSystem, "The request did not arrive in time"));
    next = clients_.erase(next);
  }
}

void CommandSocket::Close() {
  if (!listener_) return;
  unlink(path_.c_str());
  const Error stopping(kErrSystem, "The daemon is stopping");
  for (const auto& [fd, client] : clients_) {
    if (!client.answered) Refuse(fd, stopping);
  }
  clients_.clear();
  for (;;) {
    const UniqueFd waiting(accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
    if (!waiting) break;
    Refuse(waiting.get(), stopping);
  }
  listener_.Close();
  epoll_.Close();
}

}  // namespace quarrox::fileindexd
