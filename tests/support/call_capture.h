// Calls of the C library that the unit tests replace at link time: sleeping, rand() and flock().
//
// In a test that asks for nothing, sleeps return at once, rand() is random and flock() is real. An object below changes
// that for its lifetime; at most one of each class lives at a time. Recording is thread-safe.
// std::this_thread::sleep_for is not replaced: it is there for the rare test that must wait for another process.
#pragma once

#include <unistd.h>

#include <vector>

namespace quarrox::support {

// Records the sleeps asked for, in microseconds.
class SleepCapture {
 public:
  SleepCapture();
  ~SleepCapture();
  SleepCapture(const SleepCapture&) = delete;
  SleepCapture& operator=(const SleepCapture&) = delete;

  std::vector<useconds_t> sleeps() const;
};

// rand() counts up from `first`.
class CountingRand {
 public:
  explicit CountingRand(int first);
  ~CountingRand();
  CountingRand(const CountingRand&) = delete;
  CountingRand& operator=(const CountingRand&) = delete;
};

// The next `times` calls of flock() fail with `error`; later ones are real. Unlocking never fails and is not counted.
class FlockFailures {
 public:
  FlockFailures(int error, int times);
  ~FlockFailures();
  FlockFailures(const FlockFailures&) = delete;
  FlockFailures& operator=(const FlockFailures&) = delete;

  // The operations asked for since the object was made, real and failed.
  std::vector<int> operations() const;
};

}  // namespace quarrox::support
