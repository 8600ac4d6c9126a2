#include "connection_table.h"

#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/timerfd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "common/error.h"

namespace quarrox::elasticd {
namespace {

// For a request, from its first byte on or from the one before; for a client to read any part of its answer; for one
// that was refused to stop writing.
constexpr std::chrono::seconds kTimeToSend(30);
constexpr std::chrono::seconds kTimeToRead(60);
constexpr std::chrono::seconds kTimeToReadAtEnd(5);
constexpr std::chrono::seconds kTimeToGo(2);

constexpr auto kNever = Clock::time_point::max();

void Register(int epoll, int fd, unsigned int events, uint64_t token) {
  epoll_event event = {};
  event.events = events;
  event.data.u64 = token;
  if (fd >= 0 && epoll_ctl(epoll, EPOLL_CTL_ADD, fd, &event) == 0) return;
  const int error = errno;
  throw Error(kErrSystem, std::string("The engine cannot wait for its clients: ") + strerror(error));
}

}  // namespace

ConnectionTable::ConnectionTable(int epoll, size_t most)
    : epoll_(epoll),
      most_(most),
      timer_(timerfd_create(CLOCK_MONOTONIC, TFD_CLOEXEC | TFD_NONBLOCK)),
      end_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
  // The timer wakes one thread, the end all.
  Register(epoll, timer_.get(), EPOLLIN | EPOLLET, kTimerToken);
  Register(epoll, end_.get(), EPOLLIN, kEndToken);
}

Clock::duration ConnectionTable::TimeFor(Stage stage) const {
  if (stage == Stage::kDraining) return kTimeToGo;
  if (stage != Stage::kSending) return kTimeToSend;
  return stopping_ ? kTimeToReadAtEnd : kTimeToRead;
}

void ConnectionTable::SetTimer(Clock::time_point time) {
  if (time == timer_at_) return;
  timer_at_ = time;
  itimerspec at = {};  // zero stops the timer
  if (time != kNever) {
    const auto since = std::max<int64_t>(1, std::chrono::nanoseconds(time.time_since_epoch()).count());
    constexpr int64_t kSecond = 1000000000;
    at.it_value.tv_sec = static_cast<time_t>(since / kSecond);
    at.it_value.tv_nsec = since % kSecond;
  }
  timerfd_settime(timer_.get(), TFD_TIMER_ABSTIME, &at, nullptr);
}

void ConnectionTable::Link(Connection& connection, Stage stage) {
  Unlink(connection);
  List& list = ListOf(stage);
  connection.stage = stage;
  connection.listed = true;
  connection.previous = list.last;
  connection.next = nullptr;
  (list.last != nullptr ? list.last->next : list.first) = &connection;
  list.last = &connection;
  if (stage == Stage::kNoMemory) return;  // that it waits is not its client's fault
  connection.deadline = Clock::now() + TimeFor(stage);
  if (connection.deadline < timer_at_) SetTimer(connection.deadline);
}

void ConnectionTable::Unlink(Connection& connection) {
  if (!connection.listed) return;
  List& list = ListOf(connection.stage);
  (connection.previous != nullptr ? connection.previous->next : list.first) = connection.next;
  (connection.next != nullptr ? connection.next->previous : list.last) = connection.previous;
  connection.listed = false;
}

int ConnectionTable::CountOf(uid_t user) const {
  const std::lock_guard lock(mutex_);
  const auto found = users_.find(user);
  return found == users_.end() ? 0 : found->second;
}

Connection* ConnectionTable::Admit(UniqueFd& fd, std::optional<uid_t> user) {
  const std::lock_guard lock(mutex_);
  if (count_ >= most_) return nullptr;
  if (free_.empty()) {
    free_.push_back(static_cast<uint32_t>(places_.size()));
    places_.emplace_back().index = free_.back();
  }
  Connection& connection = places_[free_.back()];
  free_.pop_back();
  ++count_;
  connection.fd = std::move(fd);
  connection.stage = Stage::kIdle;
  connection.answers = 0;
  connection.user = user;
  if (user) ++users_[*user];
  return Own(connection);
}

// Memory for the first piece is had at once where there is any: most requests need no more.
Connection* ConnectionTable::Own(Connection& connection) {
  connection.owned = true;
  if (connection.stage <= Stage::kReceiving) TryReserve(connection, kChunk);
  return &connection;
}

bool ConnectionTable::HasSeveral() const {
  const std::lock_guard lock(mutex_);
  return count_ > 1 + static_cast<size_t>(leaving_);
}

Connection* ConnectionTable::Take(uint64_t token) {
  const std::lock_guard lock(mutex_);
  const auto index = static_cast<uint32_t>(token);
  if (index >= places_.size()) return nullptr;
  Connection& connection = places_[index];
  if (connection.generation != token >> 32 || connection.owned || !connection.listed) return nullptr;
  return connection.stage == Stage::kNoMemory ? nullptr : Own(connection);
}

// Only as many as there are threads can stand before the one that is found.
Connection* ConnectionTable::OwnFirst(Stage stage) {
  Connection* connection = ListOf(stage).first;
  while (connection != nullptr && connection->owned) connection = connection->next;
  return connection == nullptr ? nullptr : Own(*connection);
}

Connection* ConnectionTable::TakeSilent(bool also_slow) {
  const std::lock_guard lock(mutex_);
  Connection* silent = OwnFirst(Stage::kIdle);
  return silent == nullptr && also_slow ? OwnFirst(Stage::kReceiving) : silent;
}

Connection* ConnectionTable::TakeWaiting() {
  const std::lock_guard lock(mutex_);
  for (const Stage stage : {Stage::kIdle, Stage::kReceiving, Stage::kNoMemory, Stage::kDraining}) {
    if (Connection* connection = OwnFirst(stage)) return connection;
  }
  return nullptr;
}

// The owner of one that is due sees that for itself when it parks it.
Connection* ConnectionTable::TakeOverdue() {
  const std::lock_guard lock(mutex_);
  const Clock::time_point now = Clock::now();
  Connection* due = nullptr;
  Clock::time_point next = kNever;
  for (const Stage stage : {Stage::kIdle, Stage::kReceiving, Stage::kSending, Stage::kDraining}) {
    for (Connection* connection = ListOf(stage).first; connection != nullptr; connection = connection->next) {
      if (connection->owned) continue;
      if (due == nullptr && connection->deadline <= now) {
        due = Own(*connection);
        continue;
      }
      next = std::min(next, connection->deadline);
      break;
    }
  }
  timer_at_ = kNever;  // it has fired
  SetTimer(next);
  return due;
}

bool ConnectionTable::Watch(Connection& connection) {
  epoll_event event = {};
  event.events = EPOLLONESHOT;
  event.events |= connection.stage == Stage::kSending ? EPOLLOUT : EPOLLIN;
  event.data.u64 = uint64_t{connection.generation} << 32 | connection.index;
  const int operation = connection.registered ? EPOLL_CTL_MOD : EPOLL_CTL_ADD;
  connection.registered = epoll_ctl(epoll_, operation, connection.fd.get(), &event) == 0;
  return connection.registered;
}

// The kernel is told under the lock: else the connection could be taken, ended, and its descriptor be another's.
ConnectionTable::Parked ConnectionTable::Park(Connection& connection, Stage stage, bool afresh) {
  const std::lock_guard lock(mutex_);
  if (stopping_ && stage != Stage::kSending) return Parked::kStopping;
  const bool goes_on = connection.listed && connection.stage == stage && (!afresh || stopping_);
  if (!goes_on) {
    Link(connection, stage);
  } else if (connection.deadline <= Clock::now()) {
    return Parked::kLate;
  }
  if (!Watch(connection)) return Parked::kFailed;
  connection.owned = false;
  if (connection.deadline < timer_at_) SetTimer(connection.deadline);
  Reduce(connection, connection.Memory());
  return Parked::kYes;
}

void ConnectionTable::Release(Connection& connection) {
  connection.reader.Clear();
  std::string().swap(connection.leftover);
  connection.outgoing.reset();
  const UniqueFd fd = std::move(connection.fd);  // closed last, outside the lock
  const std::lock_guard lock(mutex_);
  Unlink(connection);
  Reduce(connection, 0);
  connection.owned = connection.registered = false;
  ++connection.generation;
  free_.push_back(connection.index);
  if (connection.user && --users_[*connection.user] == 0) users_.erase(*connection.user);
  --count_;
  EndIfEmpty();
}

void ConnectionTable::Unlist(Connection& connection) {
  const std::lock_guard lock(mutex_);
  Unlink(connection);
}

bool ConnectionTable::TryReserve(Connection& connection, size_t memory) {
  if (memory <= connection.reserved) return true;
  const size_t more = memory - connection.reserved;
  const size_t limit = memory <= kChunk ? kMemory : kMemory - kMemoryForSmall;
  if (&connection == privileged_) {
    connection.reserved = memory;
  } else if (reserved_ + more <= limit || stopping_) {
    reserved_ += more;
    connection.reserved = memory;
  } else if (privileged_ == nullptr) {
    privileged_ = &connection;
    reserved_ -= connection.reserved;
    connection.reserved = memory;
  } else {
    return false;
  }
  return true;
}

void ConnectionTable::Reduce(Connection& connection, size_t memory) {
  if (memory >= connection.reserved) return;
  if (&connection != privileged_) {
    reserved_ -= connection.reserved - memory;
  } else if (memory <= kChunk) {
    privileged_ = nullptr;
    reserved_ += memory;
  }
  connection.reserved = memory;
  LetWaitersOn();
}

// Those who wait longest first; a large one is not passed by others that are large.
void ConnectionTable::LetWaitersOn() {
  while (Connection* waiter = ListOf(Stage::kNoMemory).first) {
    if (waiter->owned || !TryReserve(*waiter, waiter->reader.MemoryWith(kChunk))) return;
    Link(*waiter, waiter->reader.empty() ? Stage::kIdle : Stage::kReceiving);
    Watch(*waiter);
  }
}

bool ConnectionTable::Reserve(Connection& connection, size_t memory) {
  const std::lock_guard lock(mutex_);
  if (TryReserve(connection, memory)) return true;
  Link(connection, Stage::kNoMemory);
  connection.owned = false;
  return false;
}

void ConnectionTable::GiveBack(Connection& connection) {
  const std::lock_guard lock(mutex_);
  Reduce(connection, std::min(connection.reserved, kChunk));
}

void ConnectionTable::WakeAt(Clock::time_point time) {
  const std::lock_guard lock(mutex_);
  if (time < timer_at_) SetTimer(time);
}

void ConnectionTable::BeginStop() {
  const std::lock_guard lock(mutex_);
  stopping_ = true;
  const Clock::time_point end = Clock::now() + kTimeToReadAtEnd;
  for (Connection* one = ListOf(Stage::kSending).first; one != nullptr; one = one->next) one->deadline = end;
  if (ListOf(Stage::kSending).first != nullptr && end < timer_at_) SetTimer(end);
}

void ConnectionTable::AllowEnd() {
  const std::lock_guard lock(mutex_);
  may_end_ = true;
  EndIfEmpty();
}

void ConnectionTable::EndIfEmpty() {
  if (may_end_ && count_ == 0) eventfd_write(end_.get(), 1);
}

bool ConnectionTable::empty() {
  const std::lock_guard lock(mutex_);
  return count_ == 0;
}

}  // namespace quarrox::elasticd
