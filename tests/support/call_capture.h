// Calls of the C library that the unit tests replace at link time: sleeps return at once, rand() counts up, and flock()
// and time() are real unless a test wants otherwise. Thread-safe.
// std::this_thread::sleep_for is not replaced: it is there for the rare test that must wait for another process.
#pragma once

#include <unistd.h>

#include <ctime>
#include <functional>
#include <vector>

namespace quarrox::support {

// Forgets what was recorded; rand() counts on from 8, the next `failures` calls of flock() fail with `error`, and
// time() is real.
void ResetCalls(int failures = 0, int error = 0);

// Makes time() stand still.
void SetTime(time_t now);

// Does something once, in the next sleep.
void OnSleep(const std::function<void()>& action);

// What was asked for since: the microseconds of each sleep, and each flock(), real or failed, that did not unlock.
std::vector<useconds_t> Sleeps();
std::vector<int> Flocks();

}  // namespace quarrox::support
