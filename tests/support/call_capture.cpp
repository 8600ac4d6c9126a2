#include "support/call_capture.h"

#include <sys/file.h>
#include <sys/syscall.h>

#include <cerrno>
#include <cstdlib>
#include <mutex>

namespace quarrox::support {
namespace {

struct Calls {
  int next_rand = 0;
  int flock_failures = 0;
  int flock_error = 0;
  time_t now = 0;  // 0 for the real time
  std::function<void()> on_sleep = {};
  std::vector<useconds_t> sleeps = {};
  std::vector<int> flocks = {};
};

// One lock for all: nothing here is fast.
std::mutex lock;
Calls calls;

}  // namespace

void ResetCalls(int failures, int error) {
  const std::lock_guard<std::mutex> guard(lock);
  calls = {.next_rand = 8, .flock_failures = failures, .flock_error = error};
}

void SetTime(time_t now) {
  const std::lock_guard<std::mutex> guard(lock);
  calls.now = now;
}

void OnSleep(const std::function<void()>& action) {
  const std::lock_guard<std::mutex> guard(lock);
  calls.on_sleep = action;
}

std::vector<useconds_t> Sleeps() {
  const std::lock_guard<std::mutex> guard(lock);
  return calls.sleeps;
}

std::vector<int> Flocks() {
  const std::lock_guard<std::mutex> guard(lock);
  return calls.flocks;
}

}  // namespace quarrox::support

using namespace quarrox::support;

extern "C" {

int usleep(useconds_t microseconds) {
  std::function<void()> action;
  {
    const std::lock_guard<std::mutex> guard(lock);
    calls.sleeps.push_back(microseconds);
    action.swap(calls.on_sleep);
  }
  if (action) action();
  return 0;
}

unsigned int sleep(unsigned int seconds) {
  usleep(seconds * 1000000);
  return 0;
}

time_t time(time_t* result) noexcept {
  const std::lock_guard<std::mutex> guard(lock);
  timespec real = {};
  if (calls.now == 0) clock_gettime(CLOCK_REALTIME, &real);
  const time_t now = calls.now != 0 ? calls.now : real.tv_sec;
  if (result != nullptr) *result = now;
  return now;
}

int rand() noexcept {
  const std::lock_guard<std::mutex> guard(lock);
  return calls.next_rand++;
}

int flock(int fd, int operation) noexcept {
  if ((operation & LOCK_UN) == 0) {
    const std::lock_guard<std::mutex> guard(lock);  // not held while the real one waits
    calls.flocks.push_back(operation);
    errno = calls.flock_error;
    if (calls.flock_failures-- > 0) return -1;
  }
  return static_cast<int>(syscall(SYS_flock, fd, operation));
}

}  // extern "C"
