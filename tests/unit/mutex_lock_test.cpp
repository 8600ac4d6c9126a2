#include "common/mutex_lock.h"

#include <future>

#include <gtest/gtest.h>

namespace quarrox {
namespace {

TEST(Mutex, IsHeldForTheSpanOfTheScope) {
  Mutex mutex;
  const auto try_elsewhere = [&] {
    return std::async(std::launch::async, [&] { return mutex.TryLock() && mutex.Unlock(); }).get();
  };
  {
    const LockMutex lock(mutex);
    EXPECT_FALSE(try_elsewhere());
  }
  EXPECT_TRUE(try_elsewhere());
}

}  // namespace
}  // namespace quarrox
