#include "server.h"

#include <malloc.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/resource.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <condition_variable>
#include <cstring>
#include <mutex>
#include <system_error>
#include <thread>

#include "common/error.h"
#include "common/listener.h"
#include "common/log.h"
#include "common/peer.h"
#include "common/watchdog.h"
#include "server_worker.h"

namespace quarrox::elasticd {
namespace {

constexpr int kMostThreads = 256;
constexpr int kThreadsKept = 2;  // one waits while the other is busy
constexpr int kIdleMilliseconds = 10000;
constexpr int kLingerMilliseconds = 1;  // a client needs some microseconds to close

// How long no client is accepted where the process has no descriptor left.
constexpr std::chrono::seconds kAcceptPause(1);

constexpr size_t kMostConnections = 16384;
constexpr size_t kMostConnectionsOfAll = 256;

// The longest request of anybody: a person's line with what goes along takes far less.
constexpr size_t kLongestOfAll = size_t{64} << 10;

// Of anybody's connections those of one user, so that no user keeps all others out.
constexpr int kMostOfOneUser = 16;

// Files of the engine itself.
constexpr size_t kOtherDescriptors = 512;

constexpr uint64_t kListenerToken = ConnectionTable::kEndToken - 1;
constexpr uint64_t kStopToken = ConnectionTable::kEndToken - 2;
constexpr uint64_t kNoToken = ConnectionTable::kEndToken - 3;

constexpr char kStopping[] = "The engine is stopping; ask again when it runs";

// Large requests go back to the system when they are done: by itself the allocator would soon keep them. All threads
// share what is left, because any of them goes on where another one stopped; it is not given back and asked for again
// with every request.
void SetUpMemory() {
  mallopt(M_MMAP_THRESHOLD, 1 << 20);
  mallopt(M_ARENA_MAX, 1);
  mallopt(M_TRIM_THRESHOLD, 32 << 20);
}

// As many descriptors as the machine allows. Returns how many clients may have one.
size_t RaiseLimit() {
  rlimit limit = {};
  getrlimit(RLIMIT_NOFILE, &limit);
  limit.rlim_cur = limit.rlim_max;
  if (setrlimit(RLIMIT_NOFILE, &limit) != 0) getrlimit(RLIMIT_NOFILE, &limit);
  const auto descriptors = static_cast<size_t>(limit.rlim_cur);
  return std::min(kMostConnections, std::max(descriptors / 4, descriptors - std::min(descriptors, kOtherDescriptors)));
}

DaemonListener::Audience AudienceOf(const Server::Settings& settings) {
  return settings.for_everybody ? DaemonListener::Audience::kEverybody : DaemonListener::Audience::kGroup;
}

}  // namespace

struct Server::Impl {
  Impl(Settings given, Handler handle, Refuse make_refusal)
      : settings(std::move(given)),
        handler(std::move(handle)),
        refuse(std::move(make_refusal)),
        listener(settings.path, rights.group(), "vexoelasticd", AudienceOf(settings)),
        epoll(epoll_create1(EPOLL_CLOEXEC)),
        stop(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)),
        table(epoll.get(), settings.for_everybody ? kMostConnectionsOfAll : RaiseLimit()),
        shared{table,
               handler,
               refuse,
               settings.spool_directory,
               settings.for_everybody ? kLongestOfAll : SIZE_MAX,
               !settings.for_everybody} {
    SetUpMemory();
    Watch(EPOLL_CTL_ADD, listener.fd(), kListenerToken);
    Watch(EPOLL_CTL_ADD, stop.get(), kStopToken);
  }

  void Watch(int operation, int fd, uint64_t token) const;
  void PassOn(uint64_t& duty);
  void Spawn();
  void Work();
  bool MayLeave();
  void Leave();
  void Process(Worker& worker, uint64_t token, uint64_t& duty);
  void WakeUp(Worker& worker);
  void WakeForWatchdog();
  UniqueFd AcceptOne(uint64_t& duty);
  void Accept(Worker& worker, uint64_t& duty);
  void Welcome(Worker& worker, UniqueFd& client);
  void StopAll(Worker& worker, uint64_t& duty);

  const Settings settings;
  const Handler handler;
  const Refuse refuse;
  const PeerRights rights;
  std::mutex listener_mutex;  // the listener is closed while others may be about to accept from it
  DaemonListener listener;
  const UniqueFd epoll;
  const UniqueFd stop;
  ConnectionTable table;
  Worker::Shared shared;
  std::atomic<bool> accepting_paused = false;
  std::atomic<int> waiting = 0;  // threads that wait for events
  std::atomic<int> threads = 0;  // changed under the mutex
  std::mutex threads_mutex;
  std::condition_variable all_left;
};

// Such an event is one thread's alone until it is passed on.
void Server::Impl::Watch(int operation, int fd, uint64_t token) const {
  epoll_event event = {};
  event.events = EPOLLIN | EPOLLONESHOT;
  event.data.u64 = token;
  if (epoll_ctl(epoll.get(), operation, fd, &event) == 0) return;
  const int error = errno;
  throw Error(kErrSystem, std::string("The engine cannot wait for its clients: ") + strerror(error));
}

// Leaves to another thread what this one would still have to do, and sees to it that there is one.
void Server::Impl::PassOn(uint64_t& duty) {
  if (duty == kStopToken) {
    Watch(EPOLL_CTL_MOD, stop.get(), kStopToken);
  } else if (duty == kListenerToken) {
    const std::lock_guard lock(listener_mutex);
    if (listener.fd() >= 0) Watch(EPOLL_CTL_MOD, listener.fd(), kListenerToken);
  }
  duty = kNoToken;
  if (waiting == 0) Spawn();
}

void Server::Impl::Spawn() {
  const std::lock_guard lock(threads_mutex);
  if (threads >= kMostThreads) return;
  ++threads;
  ++waiting;
  try {
    std::thread([this] {
      Work();
      Leave();
    }).detach();
  } catch (const std::system_error& error) {
    --threads;
    --waiting;
    errno = 0;
    QUARROX_LOG_FAILURE("The engine goes on with %d threads, reason: %s", threads.load(), error.what());
  }
}

bool Server::Impl::MayLeave() {
  const std::lock_guard lock(threads_mutex);
  if (waiting <= kThreadsKept) return false;
  --waiting;
  return true;
}

void Server::Impl::Leave() {
  const std::lock_guard lock(threads_mutex);
  if (--threads == 0) all_left.notify_all();
}

void Server::Impl::Work() {
  uint64_t duty = kNoToken;
  Worker worker(shared, [this, &duty] { PassOn(duty); });
  for (;;) {
    epoll_event event = {};
    const int patience = worker.lingers() ? kLingerMilliseconds : threads > kThreadsKept ? kIdleMilliseconds : -1;
    const int count = epoll_wait(epoll.get(), &event, 1, patience);
    if (worker.lingers()) {
      worker.SettleLingering();
      if (count == 0) continue;
    }
    if (count == 0 && MayLeave()) break;
    if (count <= 0) continue;
    --waiting;
    if (event.data.u64 == ConnectionTable::kEndToken && table.empty()) break;
    Process(worker, event.data.u64, duty);
    if (duty != kNoToken) PassOn(duty);
    ++waiting;
  }
}

void Server::Impl::Process(Worker& worker, uint64_t token, uint64_t& duty) {
  switch (token) {
    case kListenerToken:
      duty = kListenerToken;
      return Accept(worker, duty);
    case kStopToken:
      duty = kStopToken;
      return StopAll(worker, duty);
    case ConnectionTable::kEndToken:
      return;
    case ConnectionTable::kTimerToken:
      if (accepting_paused.exchange(false)) duty = kListenerToken;
      return WakeUp(worker);
    default:
      if (Connection* ready = table.Take(token)) worker.Serve(*ready);
  }
}

// The service manager's word goes the way of every event: it says that there is a thread that takes them.
// What is for everybody does not vouch for the rest.
void Server::Impl::WakeUp(Worker& worker) {
  if (!settings.for_everybody) Watchdog::OfProcess().Alive();
  Connection* overdue = table.TakeOverdue();
  WakeForWatchdog();
  if (overdue != nullptr) worker.Serve(*overdue);
}

void Server::Impl::WakeForWatchdog() {
  if (!settings.for_everybody) table.WakeAt(Watchdog::OfProcess().due());
}

UniqueFd Server::Impl::AcceptOne(uint64_t& duty) {
  const std::lock_guard lock(listener_mutex);
  if (listener.fd() < 0) return UniqueFd();
  UniqueFd client = listener.Accept();
  if (client || errno == EAGAIN || errno == EINTR || errno == ECONNABORTED) return client;
  QUARROX_LOG_FAILURE("%s", "No client is accepted for a second: accept4 failed");
  duty = kNoToken;
  accepting_paused = true;
  table.WakeAt(Clock::now() + kAcceptPause);
  return client;
}

// Goes on while there is somebody to accept and nobody else was asked to: waking another thread for that costs more
// than a small request.
void Server::Impl::Accept(Worker& worker, uint64_t& duty) {
  while (duty == kListenerToken) {
    UniqueFd client = AcceptOne(duty);
    if (!client) return;
    if (worker.lingers()) worker.SettleLingering();
    Welcome(worker, client);
  }
}

void Server::Impl::Welcome(Worker& worker, UniqueFd& client) {
  std::optional<uid_t> user;
  if (settings.for_everybody) {
    const std::optional<Identity> peer = IdentityOfPeer(client.get());
    if (!peer) return worker.SendRefusal(client.get(), "The system does not tell who asks");
    user = peer->user;
    if (table.CountOf(*user) >= kMostOfOneUser) {
      return worker.SendRefusal(client.get(), "Too many connections of this user are open; ask again later");
    }
  }
  Connection* connection = table.Admit(client, user);
  if (connection == nullptr) {
    const char* const full = "Too many clients are connected; ask again later";
    Connection* silent = table.TakeSilent(settings.for_everybody);
    worker.SendRefusal(silent != nullptr ? silent->fd.get() : client.get(), full);
    if (silent == nullptr) return;
    table.Release(*silent);
    connection = table.Admit(client, user);
    if (connection == nullptr) return worker.SendRefusal(client.get(), full);
  }
  if (settings.for_everybody || rights.MayCommand(connection->fd.get())) return worker.Serve(*connection);
  worker.Refuse(*connection, "The user may not use the engine; root and the members of the group Quarrox may");
}

// May come again to a thread that another passed the rest on to.
void Server::Impl::StopAll(Worker& worker, uint64_t& duty) {
  {
    const std::lock_guard lock(listener_mutex);
    if (listener.fd() >= 0) {
      table.BeginStop();
      listener.Withdraw();
      while (const UniqueFd client = listener.Accept()) worker.SendRefusal(client.get(), kStopping);
      listener.Close();
    }
  }
  while (Connection* waiter = table.TakeWaiting()) {
    worker.Serve(*waiter);
    if (duty == kNoToken) return;
  }
  duty = kNoToken;
  table.AllowEnd();
}

Server::Server(Settings settings, Handler handler, Refuse refuse)
    : impl_(std::make_unique<Impl>(std::move(settings), std::move(handler), std::move(refuse))) {}

Server::~Server() = default;

void Server::Run() {
  impl_->WakeForWatchdog();
  for (int i = 0; i < kThreadsKept; ++i) impl_->Spawn();
  std::unique_lock lock(impl_->threads_mutex);
  impl_->all_left.wait(lock, [this] { return impl_->threads == 0; });
}

void Server::Stop() {
  eventfd_write(impl_->stop.get(), 1);
}

}  // namespace quarrox::elasticd
