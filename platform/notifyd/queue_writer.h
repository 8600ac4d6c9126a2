// Writes events to the queue file, in batches, and loses none silently.
//
// While the queue cannot be written (a full disk), lines wait in memory and are tried again each second. When more than
// kMaxPending bytes wait they are dropped, and one line saying that events were lost is written as soon as writing
// works again. Both are said once in the system log. Not thread-safe.
#pragma once

#include <chrono>
#include <string>

#include "event.h"

namespace quarrox::notifyd {

class QueueWriter final : public EventSink {
 public:
  static constexpr size_t kBatch = size_t{1} << 20;
  static constexpr size_t kMaxPending = size_t{64} << 20;
  using Clock = std::chrono::steady_clock;

  explicit QueueWriter(std::string queue) : queue_(std::move(queue)) {}

  // The path that a line about lost events carries.
  void set_root(const std::string& root) { root_ = root; }
  const std::string& root() const { return root_; }

  // Keeps the event's line; writes once a batch is full.
  void Add(const Event& event) override;

  // Writes what waits, unless writing failed less than a second ago. True when nothing waits any more.
  bool Flush();

  // The same, however short ago writing failed.
  bool FlushNow();

  // Milliseconds until Flush() should be called again, -1 when nothing waits.
  int Timeout() const;

 private:
  bool Append(const std::string& lines);
  bool WriteLost();
  bool WriteBatches();
  void Drop();

  const std::string queue_;
  std::string root_;
  std::string pending_;
  bool failing_ = false;
  bool dropped_ = false;  // lines were dropped and the reader does not know yet
  Clock::time_point retry_;
};

}  // namespace quarrox::notifyd
