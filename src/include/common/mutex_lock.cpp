#include "common/mutex_lock.h"

#include "common/log.h"

namespace quarrox {

Mutex::Mutex() {
  pthread_mutex_init(&mutex_, nullptr);
}

Mutex::~Mutex() {
  pthread_mutex_destroy(&mutex_);
}

bool Mutex::Lock() {
  return 0 == pthread_mutex_lock(&mutex_);
}

bool Mutex::TryLock() {
  return 0 == pthread_mutex_trylock(&mutex_);
}

bool Mutex::Unlock() {
  return 0 == pthread_mutex_unlock(&mutex_);
}

LockMutex::LockMutex(Mutex& mutex) : mutex_(mutex) {
  if (!mutex_.Lock()) QUARROX_LOG_FAILED("!mutex_.Lock()");
}

LockMutex::~LockMutex() {
  if (!mutex_.Unlock()) QUARROX_LOG_FAILED("!mutex_.Unlock()");
}

Mutex& PlatformMutex() {
  static Mutex mutex;
  return mutex;
}

}  // namespace quarrox
