#include "support/call_capture.h"

#include <sys/file.h>
#include <sys/syscall.h>

#include <cerrno>
#include <cstdlib>
#include <mutex>

namespace quarrox::support {
namespace {

// One lock for all: nothing here is fast, and a test sees one order of events.
std::mutex lock;
bool sleep_recording = false;
std::vector<useconds_t> recorded_sleeps;
bool rand_counting = false;
int rand_next = 0;
bool flock_recording = false;
int flock_error = 0;
int flock_failures = 0;
std::vector<int> flock_operations;

int Sleep(useconds_t microseconds) {
  const std::lock_guard<std::mutex> guard(lock);
  if (sleep_recording) recorded_sleeps.push_back(microseconds);
  return 0;
}

}  // namespace

SleepCapture::SleepCapture() {
  const std::lock_guard<std::mutex> guard(lock);
  recorded_sleeps.clear();
  sleep_recording = true;
}

SleepCapture::~SleepCapture() {
  const std::lock_guard<std::mutex> guard(lock);
  sleep_recording = false;
}

std::vector<useconds_t> SleepCapture::sleeps() const {
  const std::lock_guard<std::mutex> guard(lock);
  return recorded_sleeps;
}

CountingRand::CountingRand(int first) {
  const std::lock_guard<std::mutex> guard(lock);
  rand_next = first;
  rand_counting = true;
}

CountingRand::~CountingRand() {
  const std::lock_guard<std::mutex> guard(lock);
  rand_counting = false;
}

FlockFailures::FlockFailures(int error, int times) {
  const std::lock_guard<std::mutex> guard(lock);
  flock_error = error;
  flock_failures = times;
  flock_operations.clear();
  flock_recording = true;
}

FlockFailures::~FlockFailures() {
  const std::lock_guard<std::mutex> guard(lock);
  flock_failures = 0;
  flock_recording = false;
}

std::vector<int> FlockFailures::operations() const {
  const std::lock_guard<std::mutex> guard(lock);
  return flock_operations;
}

}  // namespace quarrox::support

using namespace quarrox::support;

extern "C" {

int usleep(useconds_t microseconds) {
  return Sleep(microseconds);
}

unsigned int sleep(unsigned int seconds) {
  return static_cast<unsigned int>(Sleep(seconds * 1000000));
}

int rand() noexcept {
  static unsigned int state = 1;
  const std::lock_guard<std::mutex> guard(lock);
  if (rand_counting) return rand_next++;
  state = state * 1103515245 + 12345;
  return static_cast<int>(state >> 1);
}

int flock(int fd, int operation) noexcept {
  if ((operation & LOCK_UN) == 0) {
    const std::lock_guard<std::mutex> guard(lock);
    if (flock_recording) flock_operations.push_back(operation);
    if (flock_failures > 0) {
      --flock_failures;
      errno = flock_error;
      return -1;
    }
  }
  return static_cast<int>(syscall(SYS_flock, fd, operation));
}

}  // extern "C"
