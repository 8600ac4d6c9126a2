#include "daemon.h"

#include <poll.h>
#include <signal.h>
#include <sys/signalfd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <memory>

#include "common/error.h"
#include "common/log.h"
#include "common/unique_fd.h"
#include "queue_writer.h"
#include "scope.h"
#include "watcher.h"

namespace quarrox::notifyd {
namespace {

// One round takes what was reported by then; further ones what that left open, such as the missing half of a move.
constexpr int kLastRounds = 3;

UniqueFd CatchStopSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGINT);
  sigprocmask(SIG_BLOCK, &signals, nullptr);
  UniqueFd fd(signalfd(-1, &signals, SFD_CLOEXEC));
  if (!fd) throw Error(kErrSystem, std::string("signalfd failed, reason=") + strerror(errno));
  return fd;
}

std::unique_ptr<Watcher> MakeWatcher(const Options& options, const Scope& scope, EventSink& sink) {
  if (options.method == Method::kInotify) return MakeInotifyWatcher(scope, sink);
  std::string why;
  auto watcher = MakeFanotifyWatcher(scope, sink, options.limited_queue, why);
  if (watcher != nullptr) return watcher;
  const std::string text = "fanotify cannot watch " + scope.dir() + ": " + why;
  if (options.method == Method::kFanotify) throw Error(kErrSystem, text + "; run as root, or use --method inotify");
  QUARROX_LOG_PROGRESS("%s; inotify is used", log::Text(text).c_str());
  return MakeInotifyWatcher(scope, sink);
}

int Earlier(int a, int b) {
  if (a < 0 || b < 0) return a < 0 ? b : a;
  return a < b ? a : b;
}

// False when a stop signal came.
bool RunOnce(Watcher& watcher, QueueWriter& writer, int signals) {
  pollfd fds[] = {{signals, POLLIN, 0}, {watcher.fd(), POLLIN, 0}};
  const int watcher_timeout = watcher.Timeout();
  const int ready = poll(fds, 2, Earlier(watcher_timeout, writer.Timeout()));
  if (ready < 0 && errno != EINTR) throw Error(kErrSystem, std::string("poll failed, reason=") + strerror(errno));
  if (fds[0].revents != 0) return false;
  if (fds[1].revents != 0 || (ready == 0 && watcher_timeout >= 0)) watcher.Drain();
  writer.Flush();
  return true;
}

void WriteRest(Watcher& watcher, QueueWriter& writer, const std::string& queue) {
  for (int round = 0; round < kLastRounds; ++round) watcher.Drain();
  if (!writer.FlushNow())
    throw Error(kErrSystem, "Events are lost because the queue cannot be written, queue=" + queue);
}

void Run(Watcher& watcher, QueueWriter& writer, int signals, const std::string& queue) {
  try {
    while (RunOnce(watcher, writer, signals)) {
    }
    WriteRest(watcher, writer, queue);
  } catch (const Error&) {
    writer.FlushNow();
    throw;
  }
}

}  // namespace

void RunDaemon(const Options& options) {
  const UniqueFd signals = CatchStopSignals();
  const Scope scope(options.dir, options.queue);
  QueueWriter writer(scope.queue(), scope.dir());
  const std::unique_ptr<Watcher> watcher = MakeWatcher(options, scope, writer);
  fprintf(stderr, "watching %s with %s, queue %s\n", scope.dir().c_str(), watcher->method(), scope.queue().c_str());
  Run(*watcher, writer, signals.get(), scope.queue());
}

}  // namespace quarrox::notifyd
