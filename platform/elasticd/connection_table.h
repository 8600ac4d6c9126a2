// All connections: what each waits for and until when, and the memory that their requests may take together.
//
// Each that waits stands in the list of its stage. In a list all have the same time, so the first is due first, and
// nothing ever looks at all of them. A single timer wakes the first that is due; it is set only when it has fired, so a
// connection that comes and goes costs no call for it.
#pragma once

#include <deque>
#include <map>
#include <mutex>
#include <optional>
#include <vector>

#include "connection.h"

namespace quarrox::elasticd {

// Thread-safe. A connection that a thread was given is that thread's alone until it hands it back.
class ConnectionTable {
 public:
  // What is read at once.
  static constexpr size_t kChunk = 65536;

  // What all requests may take that are being received or carried out, and how much of it is kept for small ones, so
  // that they need not wait for large ones. One connection at a time may always go on, whatever it takes: else all that
  // are in the middle of a request could wait for each other.
  static constexpr size_t kMemory = size_t{64} << 20;
  static constexpr size_t kMemoryForSmall = size_t{16} << 20;

  // What events of the timer, and of the end, are told by.
  static constexpr uint64_t kTimerToken = ~uint64_t{0};
  static constexpr uint64_t kEndToken = kTimerToken - 1;

  enum class Parked { kYes, kLate, kStopping, kFailed };

  // Registers with `epoll`, which lives longer. Holds `most` connections. Throws Error 502.
  ConnectionTable(int epoll, size_t most);

  // A new connection for the caller, which takes `fd`; null where the table is full. Where a user is named, the
  // connection counts among theirs.
  Connection* Admit(UniqueFd& fd, std::optional<uid_t> user = std::nullopt);
  int CountOf(uid_t user) const;

  // The connection that an event is about; null where another thread has it or it is gone.
  Connection* Take(uint64_t token);

  // One that has said nothing for the longest time, or, with `also_slow`, else the one that is at its request for the
  // longest; null where there is none.
  Connection* TakeSilent(bool also_slow);

  // One whose time is over. Sets the timer for the next.
  Connection* TakeOverdue();

  // One that waits for anything but its client to read.
  Connection* TakeWaiting();

  // Hands the connection back until it is ready for `stage`. Its time begins where the stage is a new one or `afresh`
  // is set. What does not end in kYes leaves it with the caller: its time is over, all are to end, or the kernel has no
  // room.
  Parked Park(Connection& connection, Stage stage, bool afresh = false);

  // Ends the connection.
  void Release(Connection& connection);

  // Whether the connection may take this much memory. Else it has been handed back and waits for that.
  bool Reserve(Connection& connection, size_t memory);

  // Whether more than one is connected, save those who are expected to go.
  bool HasSeveral() const;
  void ExpectToGo(bool expected) { leaving_ += expected ? 1 : -1; }

  // A request is to be carried out: its time to arrive is over.
  void Unlist(Connection& connection);

  // A request was carried out: gives back the memory that it took.
  void GiveBack(Connection& connection);

  // An event of the timer at that time at the latest.
  void WakeAt(Clock::time_point time);

  // From now on no request is waited for, and answers wait for their clients only a moment.
  void BeginStop();

  // Once BeginStop was called and the last connection has gone, all threads get the event of the end, again and again.
  void AllowEnd();
  bool empty();

 private:
  struct List {
    Connection* first = nullptr;
    Connection* last = nullptr;
  };

  List& ListOf(Stage stage) { return lists_[static_cast<size_t>(stage)]; }
  Clock::duration TimeFor(Stage stage) const;
  void Link(Connection& connection, Stage stage);
  void Unlink(Connection& connection);
  void SetTimer(Clock::time_point time);
  bool Watch(Connection& connection);
  Connection* Own(Connection& connection);
  Connection* OwnFirst(Stage stage);
  void EndIfEmpty();

  bool TryReserve(Connection& connection, size_t memory);
  void Reduce(Connection& connection, size_t memory);
  void LetWaitersOn();

  const int epoll_;
  const size_t most_;
  UniqueFd timer_;
  UniqueFd end_;
  mutable std::mutex mutex_;
  std::deque<Connection> places_;
  std::vector<uint32_t> free_;
  size_t count_ = 0;
  std::map<uid_t, int> users_;  // the connections of each
  std::atomic<int> leaving_ = 0;
  List lists_[static_cast<size_t>(Stage::kStages)];
  Clock::time_point timer_at_ = Clock::time_point::max();
  size_t reserved_ = 0;
  Connection* privileged_ = nullptr;  // the one that may always go on; what it takes is not counted
  bool stopping_ = false;
  bool may_end_ = false;
};

}  // namespace quarrox::elasticd
