#include "daemon.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/signalfd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <memory>
#include <vector>

#include <systemd/sd-daemon.h>

#include "common/error.h"
#include "common/unique_fd.h"
#include "common/watchdog.h"
#include "monitor_service.h"
#include "scope.h"
#include "watch_status.h"

namespace quarrox::notifyd {
namespace {

constexpr char kLockPath[] = "/var/run/vexonotifyd.lock";

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

// Held for as long as the configurations are served: two daemons would write each event twice. Where the lock cannot be
// made there is none.
UniqueFd BeTheOnlyOne() {
  UniqueFd lock(open(kLockPath, O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
  if (!lock || flock(lock.get(), LOCK_EX | LOCK_NB) == 0 || errno != EWOULDBLOCK) return lock;
  throw Error(kErrSystem, std::string("another vexonotifyd serves the configurations already, it holds ") + kLockPath);
}

// One directory and one queue, as given on the command line.
std::unique_ptr<MonitorService> WatchOne(const Options& options) {
  const std::string dir = Scope(options.dir, options.queue).dir();
  const Monitor monitor{RealQueue(options.queue), {{dir, kAllEvents, {std::string(kMetadataDir)}}}};
  auto service = std::make_unique<MonitorService>(options, monitor);
  fprintf(stderr, "watching %s with %s, queue %s\n", dir.c_str(), service->watches().MethodOf(dir).c_str(),
          monitor.queue.c_str());
  return service;
}

// False when a stop signal came.
bool RunOnce(MonitorService& service, int signals) {
  std::vector<pollfd> fds = {{signals, POLLIN, 0}};
  service.AddPollFds(fds);
  Watchdog& watchdog = Watchdog::OfProcess();
  const int service_timeout = service.Timeout();
  const int timeout = watchdog.Timeout(service_timeout);
  const int ready = poll(fds.data(), fds.size(), timeout);
  if (ready < 0 && errno != EINTR) throw Error(kErrSystem, std::string("poll failed, reason=") + strerror(errno));
  if (ready < 0) return true;
  if (fds[0].revents != 0) return false;
  watchdog.Alive();
  service.Process(fds.data() + 1, ready == 0 && timeout == service_timeout);
  return true;
}

}  // namespace

void RunDaemon(const Options& options) {
  const UniqueFd signals = CatchStopSignals();
  const UniqueFd lock = options.dir.empty() ? BeTheOnlyOne() : UniqueFd();
  const auto service = options.dir.empty()
                           ? std::make_unique<MonitorService>(options, kMonitorDirectory, kWatchStatusPath)
                           : WatchOne(options);
  sd_notify(0, "READY=1");
  try {
    while (RunOnce(*service, signals.get())) {
    }
  } catch (const Error&) {
    service->FlushNow();
    throw;
  }
  sd_notify(0, "STOPPING=1");
  service->Finish();
}

}  // namespace quarrox::notifyd
