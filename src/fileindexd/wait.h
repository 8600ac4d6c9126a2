// What the processes of the daemon wait with: signals as something to poll, and points in time.
#pragma once

#include <chrono>
#include <initializer_list>
#include <string>

#include "common/unique_fd.h"

struct pollfd;

namespace quarrox::fileindexd {

using Clock = std::chrono::steady_clock;

// A point in time that never comes.
inline constexpr Clock::time_point kNever = Clock::time_point::max();

// Throws Error 502, "CALL failed, reason=" and the text of errno.
[[noreturn]] void FailCall(const std::string& call);

// Blocks some signals for the process and takes them one by one, so that none interrupts a call. A process has one
// object, made before it has threads. The signals stay blocked.
class Signals {
 public:
  Signals(std::initializer_list<int> signals);

  // Readable while a signal waits.
  int fd() const { return fd_.get(); }

  // The next signal that waits, 0 where there is none. Never blocks.
  int Take();

 private:
  UniqueFd fd_;
};

// Waits in the kernel until a descriptor is ready or the time has come.
void PollUntil(pollfd* fds, size_t count, Clock::time_point end);

}  // namespace quarrox::fileindexd
