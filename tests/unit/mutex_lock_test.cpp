#include "common/mutex_lock.h"

#include <thread>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "support/syslog_capture.h"

namespace quarrox {
namespace {

using ::testing::EndsWith;

bool TryFromAnotherThread(Mutex& mutex) {
  bool taken = false;
  std::thread([&] {
    taken = mutex.TryLock();
    if (taken) mutex.Unlock();
  }).join();
  return taken;
}

// A Mutex whose underlying mutex reports misuse, which the default kind does not.
class CheckingMutex {
 public:
  CheckingMutex() {
    static_assert(sizeof(Mutex) == sizeof(pthread_mutex_t));
    auto* raw = reinterpret_cast<pthread_mutex_t*>(&mutex);
    pthread_mutexattr_t attributes;
    pthread_mutexattr_init(&attributes);
    pthread_mutexattr_settype(&attributes, PTHREAD_MUTEX_ERRORCHECK);
    pthread_mutex_destroy(raw);
    pthread_mutex_init(raw, &attributes);
    pthread_mutexattr_destroy(&attributes);
  }
  Mutex mutex;
};

TEST(Mutex, IsHeldForTheSpanOfTheScope) {
  Mutex mutex;
  {
    const LockMutex lock(mutex);
    EXPECT_FALSE(TryFromAnotherThread(mutex));
  }
  EXPECT_TRUE(TryFromAnotherThread(mutex));
  EXPECT_EQ(&PlatformMutex(), &PlatformMutex());
}

TEST(Mutex, AFailedLockOrUnlockIsLoggedAndNeverThrown) {
  const support::SyslogCapture log;
  CheckingMutex checking;
  ASSERT_TRUE(checking.mutex.Lock());
  errno = 0;
  { const LockMutex again(checking.mutex); }  // locking fails, unlocking works
  {
    const LockMutex once(checking.mutex);  // locking works,
    EXPECT_TRUE(checking.mutex.Unlock());
  }  // unlocking fails
  ASSERT_EQ(log.texts().size(), 2U);
  EXPECT_THAT(log.texts()[0], EndsWith(") (LockMutex) Failed [!mutex_.Lock()]"));
  EXPECT_THAT(log.texts()[1], EndsWith(") (~LockMutex) Failed [!mutex_.Unlock()]"));
}

}  // namespace
}  // namespace quarrox
