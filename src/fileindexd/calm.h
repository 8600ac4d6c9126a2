// What keeps a worker out of the way of everything else on the machine.
#pragma once

#include <array>
#include <cstdint>

#include "wait.h"

namespace quarrox::fileindexd {

// Gives this process what the others leave of the processors and of the disk, and lets the kernel end it before them
// where memory runs out; it loses nothing then. What cannot be had is done without.
void BecomeCalm();

// Rests while others are short of processor, disk or memory, as the kernel counts the time for which something waits
// for one of them (/proc/pressure). It looks once a second. Where much waits it rests for a moment and listens: what
// goes on meanwhile is not this worker's doing, nor that of the engine on its behalf, since an engine that nobody asks
// is at rest. Then it rests for longer, but never for more than three quarters of the time, and not before it has got
// something done in between, however little the processors have left for it.
//
// Not thread-safe.
class Pacer {
 public:
  // One that is not `wanted`, or finds no pressure to read, never rests.
  explicit Pacer(bool wanted);

  // What others are short of, so that it rested when it looked last: "disk", "memory" or "processor"; empty for
  // nothing.
  const char* held_back_by() const { return held_back_by_; }

  // Called between any two files; returns early where the descriptor becomes readable.
  void Pace(int wake_fd);

 private:
  struct Sample {
    Clock::time_point at = {};
    std::array<int64_t, 3> stalled = {};  // microseconds, for each resource
    int64_t busy = 0;                     // processor time of all, in ticks
    int64_t ticks = 0;                    // the same with what nobody used
  };

  static bool Look(Sample& sample);
  static const char* WhatStalls(const Sample& before, const Sample& after, bool resting);
  static void Rest(int wake_fd, Clock::time_point end);

  Sample last_;
  Clock::time_point look_at_ = kNever;
  const char* held_back_by_ = "";
  int64_t turn_ = 0;  // the processor time of this process up to which it works before it may rest again
};

}  // namespace quarrox::fileindexd
