// Mutual exclusion between threads of one process.
#pragma once

#include <pthread.h>

#include "common/export.h"

namespace quarrox {

// One process-private mutex with default attributes: not recursive. Each call returns true exactly when the underlying
// mutex call returned 0.
class QUARROX_API Mutex {
 public:
  Mutex();
  ~Mutex();
  Mutex(const Mutex&) = delete;
  Mutex& operator=(const Mutex&) = delete;

  bool Lock();
  bool TryLock();
  bool Unlock();

 private:
  pthread_mutex_t mutex_;
};

// Holds a Mutex for the span of a scope. A lock that cannot be taken or given back is logged, never thrown.
class QUARROX_API LockMutex {
 public:
  explicit LockMutex(Mutex& mutex);
  ~LockMutex();
  LockMutex(const LockMutex&) = delete;
  LockMutex& operator=(const LockMutex&) = delete;

 private:
  Mutex& mutex_;
};

// The process-wide mutex under which every call into the platform's share and user libraries is made, and every switch
// of the effective user. Made on first use.
QUARROX_API Mutex& PlatformMutex();

}  // namespace quarrox
