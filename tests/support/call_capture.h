// Calls of the C library that the unit tests replace at link time: sleeps return at once, rand() counts up, and flock()
// is real unless a test wants it to fail. Thread-safe.
// std::this_thread::sleep_for is not replaced: it is there for the rare test that must wait for another process.
#pragma once

#include <unistd.h>

#include <vector>

namespace quarrox::support {

// Forgets what was recorded; rand() counts on from 8, and the next `failures` calls of flock() fail with `error`.
void ResetCalls(int failures = 0, int error = 0);

// What was asked for since: the microseconds of each sleep, and each flock(), real or failed, that did not unlock.
std::vector<useconds_t> Sleeps();
std::vector<int> Flocks();

}  // namespace quarrox::support
