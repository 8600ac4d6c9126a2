#include "common/lock_file.h"

#include <sys/file.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <iterator>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "common/error.h"
#include "support/call_capture.h"
#include "support/syslog_capture.h"
#include "support/temp_dir.h"

namespace quarrox {
namespace {

using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

// The reason of the Error 506 that locking throws; "" when it throws none.
std::string LockReason(const std::string& path, bool exclusive) {
  try {
    const LockFile lock(path, exclusive);
  } catch (const Error& error) {
    EXPECT_EQ(error.code, kErrLockFile);
    return error.reason;
  }
  return "";
}

long OpenDescriptors() {
  const std::filesystem::directory_iterator all("/proc/self/fd");
  return std::distance(begin(all), end(all));
}

class LockFileTest : public ::testing::Test {
 protected:
  support::TempDir dir_;
  const std::string path_ = dir_ / "lock";
  support::SyslogCapture log_;
  support::SleepCapture sleep_;
};

TEST_F(LockFileTest, AnExclusiveLockShutsOutEverybodyAndASharedOneOnlyWriters) {
  {
    const LockFile held(path_, true);
    EXPECT_EQ(LockReason(path_, false), "Exceed max retry, path=" + path_);
    EXPECT_EQ(LockReason(path_, true), "Exceed max retry, path=" + path_);
  }
  const LockFile reader(path_, false);
  EXPECT_EQ(LockReason(path_, false), "");
  EXPECT_EQ(LockReason(path_, true), "Exceed max retry, path=" + path_);
}

TEST_F(LockFileTest, StaysOnDiskWithMode0644AndIsFreeAfterwards) {
  const mode_t old = umask(022);
  { const LockFile held(path_, true); }
  umask(old);
  struct stat info;
  ASSERT_EQ(stat(path_.c_str(), &info), 0);
  EXPECT_EQ(info.st_mode & 07777, 0644U);
  EXPECT_EQ(LockReason(path_, true), "");
  EXPECT_THAT(sleep_.sleeps(), IsEmpty());
}

TEST_F(LockFileTest, SixtyFourFailedAttemptsAreSixtyFourSleepsAndNoLogLine) {
  const support::FlockFailures flocks(EWOULDBLOCK, 1000);
  const long before = OpenDescriptors();
  EXPECT_EQ(LockReason(path_, false), "Exceed max retry, path=" + path_);
  EXPECT_EQ(flocks.operations(), std::vector<int>(64, LOCK_SH | LOCK_NB));
  ASSERT_EQ(sleep_.sleeps().size(), 64U);
  for (const useconds_t pause : sleep_.sleeps()) {
    EXPECT_LE(pause, 900000U);
    EXPECT_EQ(pause % 100000, 0U);
  }
  EXPECT_THAT(log_.lines(), IsEmpty());
  EXPECT_EQ(OpenDescriptors(), before);
}

TEST_F(LockFileTest, RetriesAfterASignalAndAfterACompetitorWithAFreshSleepEachTime) {
  const support::CountingRand rand(8);
  const support::FlockFailures flocks(EINTR, 3);
  EXPECT_EQ(LockReason(path_, true), "");
  EXPECT_THAT(flocks.operations(),
              ElementsAre(LOCK_EX | LOCK_NB, LOCK_EX | LOCK_NB, LOCK_EX | LOCK_NB, LOCK_EX | LOCK_NB));
  EXPECT_THAT(sleep_.sleeps(), ElementsAre(800000U, 900000U, 0U));
}

TEST_F(LockFileTest, AnyOtherFailureEndsItAtOnceWithTheSystemTextAlone) {
  const support::FlockFailures flocks(ENOLCK, 1);
  const long before = OpenDescriptors();
  EXPECT_EQ(LockReason(path_, true), "No locks available");
  EXPECT_THAT(sleep_.sleeps(), IsEmpty());
  EXPECT_THAT(log_.lines(), IsEmpty());
  EXPECT_EQ(OpenDescriptors(), before);
}

TEST_F(LockFileTest, AMissingDirectoryIsLoggedWithTheOpenCall) {
  const std::string path = dir_ / "missing/lock";
  const std::string reason = "open failed, path=" + path + ", reason=No such file or directory";
  EXPECT_EQ(LockReason(path, true), reason);
  ASSERT_EQ(log_.texts().size(), 1U);
  EXPECT_THAT(log_.texts()[0], HasSubstr("lock_file:"));
  EXPECT_THAT(log_.texts()[0],
              EndsWith(") (LockFile) Failed [0 > (fd_ = open(path_.c_str(), O_RDONLY | O_CREAT, 0644))], reason: " +
                       reason + " [err: No such file or directory]"));
}

}  // namespace
}  // namespace quarrox
