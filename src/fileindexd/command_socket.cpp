#include "command_socket.h"

#include <sys/epoll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <iterator>
#include <utility>

#include "common/log.h"

namespace quarrox::fileindexd {
namespace {

// How long no client is accepted where the process has no descriptor left.
constexpr std::chrono::seconds kAcceptPause(1);

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
    : listener_(path, rights_.group(), "fileindexd"), epoll_(epoll_create1(EPOLL_CLOEXEC)) {
  if (!epoll_) FailCall("epoll_create1");
  SetAccepting(true);
}

CommandSocket::~CommandSocket() {
  Close();
}

void CommandSocket::Watch(int fd, int operation, unsigned int events) {
  epoll_event event = {};
  event.events = events;
  event.data.fd = fd;
  if (epoll_ctl(epoll_.get(), operation, fd, &event) != 0) FailCall("epoll_ctl");
}

void CommandSocket::SetAccepting(bool accepting) {
  if (accepting_ == accepting) return;
  Watch(listener_.fd(), accepting ? EPOLL_CTL_ADD : EPOLL_CTL_DEL, EPOLLIN);
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
    if (events[i].data.fd == listener_.fd()) {
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
    UniqueFd fd = listener_.Accept();
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
  if (listener_.fd() < 0) return;
  listener_.Withdraw();
  const Error stopping(kErrSystem, "The daemon is stopping");
  for (const auto& [fd, client] : clients_) {
    if (!client.answered) Refuse(fd, stopping);
  }
  clients_.clear();
  for (;;) {
    const UniqueFd waiting = listener_.Accept();
    if (!waiting) break;
    Refuse(waiting.get(), stopping);
  }
  listener_.Close();
  epoll_.Close();
}

}  // namespace quarrox::fileindexd
