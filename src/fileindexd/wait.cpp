#include "wait.h"

#include <poll.h>
#include <signal.h>
#include <sys/signalfd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "common/error.h"

namespace quarrox::fileindexd {
namespace {

int Milliseconds(Clock::time_point end) {
  if (end == kNever) return -1;
  // Rounded up: a wait that ends too early would be repeated until the time has come.
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(end - Clock::now()).count();
  return static_cast<int>(std::clamp<int64_t>(left, 0, 1 << 30));
}

}  // namespace

void FailCall(const std::string& call) {
  const int error = errno;
  throw Error(kErrSystem, call + " failed, reason=" + strerror(error));
}

Signals::Signals(std::initializer_list<int> signals) {
  sigset_t set;
  sigemptyset(&set);
  for (const int signal : signals) sigaddset(&set, signal);
  sigprocmask(SIG_BLOCK, &set, nullptr);
  fd_ = UniqueFd(signalfd(-1, &set, SFD_CLOEXEC | SFD_NONBLOCK));
  if (!fd_) FailCall("signalfd");
}

int Signals::Take() {
  signalfd_siginfo info;
  return read(fd_.get(), &info, sizeof(info)) == sizeof(info) ? static_cast<int>(info.ssi_signo) : 0;
}

void PollUntil(pollfd* fds, size_t count, Clock::time_point end) {
  if (poll(fds, count, Milliseconds(end)) >= 0) return;
  if (errno != EINTR) FailCall("poll");
  for (size_t i = 0; i < count; ++i) fds[i].revents = 0;
}

}  // namespace quarrox::fileindexd
