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
  const std::lock_guard<std::mutex> guard(lock);
  calls.sleeps.push_back(microseconds);
  return 0;
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
