// What a daemon's loop tells the service manager, which starts a daemon anew where that word stays out. Any thread of a
// daemon's main process. Only what is asked for is told: without WATCHDOG_USEC in the environment, nothing ever is.
//
// The word comes from the loop itself, once in half of the time that the manager waits, and from long work in the loop
// at each step. So a loop that waits and work that gets on are alive, and what hangs is not.
#pragma once

#include <algorithm>
#include <atomic>
#include <chrono>
#include <string>

#include <systemd/sd-daemon.h>

namespace quarrox {

class Watchdog {
 public:
  using Clock = std::chrono::steady_clock;

  static Watchdog& OfProcess() {
    static Watchdog watchdog;
    return watchdog;
  }

  // When Alive() is to be called at the latest; the maximum where nobody waits for it.
  Clock::time_point due() const { return due_; }

  // Work goes on. May be called as often as one likes: before the time it costs a look at the clock.
  void Alive() {
    if (due() == Clock::time_point::max() || Clock::now() < due()) return;
    sd_notify(0, message_.c_str());
    SetDue();
  }

  // The time for poll(), in milliseconds: `timeout`, -1 for ever, or what is left until Alive() is due where that is
  // less.
  int Timeout(int timeout) const {
    if (due() == Clock::time_point::max()) return timeout;
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(due() - Clock::now()).count();
    const int until_due = static_cast<int>(std::clamp<int64_t>(left, 0, 1 << 30));
    return timeout < 0 ? until_due : std::min(timeout, until_due);
  }

 private:
  // A start that takes long gets as much time again.
  Watchdog() {
    uint64_t interval = 0;
    if (sd_watchdog_enabled(0, &interval) <= 0) return;
    half_ = std::chrono::microseconds(interval / 2);
    message_ = "WATCHDOG=1\nEXTEND_TIMEOUT_USEC=" + std::to_string(interval);
    SetDue();
  }

  void SetDue() { due_ = Clock::now() + half_; }

  std::chrono::microseconds half_{0};
  std::string message_;
  std::atomic<Clock::time_point> due_ = Clock::time_point::max();
};

}  // namespace quarrox
