#include "common/lock_file.h"

#include <sys/file.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "support/call_capture.h"
#include "support/errors.h"
#include "support/syslog_capture.h"
#include "support/temp_dir.h"

namespace quarrox {
namespace {

using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::IsEmpty;

class LockFileTest : public ::testing::Test {
 protected:
  LockFileTest() { support::ResetCalls(); }
  std::string Locking(bool exclusive) const {
    return support::ReasonOf(kErrLockFile, [&] { const LockFile lock(path_, exclusive); });
  }

  support::TempDir dir_;
  std::string path_ = dir_ / "lock";
  const std::string exhausted_ = "Exceed max retry, path=" + path_;
  support::SyslogCapture log_;
};

TEST_F(LockFileTest, AnExclusiveLockShutsOutEverybodyAndASharedOneOnlyWriters) {
  {
    const LockFile held(path_, true);
    EXPECT_EQ(Locking(false), exhausted_);
    EXPECT_EQ(Locking(true), exhausted_);
  }
  const LockFile reader(path_, false);
  EXPECT_EQ(Locking(false), "");
  EXPECT_EQ(Locking(true), exhausted_);
  EXPECT_EQ(std::filesystem::status(path_).permissions(), std::filesystem::perms{0644});
}

TEST_F(LockFileTest, SixtyFourFailedAttemptsAreSixtyFourFreshSleepsAndNoLogLine) {
  support::ResetCalls(64, EWOULDBLOCK);
  EXPECT_EQ(Locking(false), exhausted_);
  EXPECT_EQ(support::Flocks(), std::vector<int>(64, LOCK_SH | LOCK_NB));
  std::vector<useconds_t> sleeps;
  for (useconds_t i = 8; i < 72; ++i) sleeps.push_back(i % 10 * 100000);
  EXPECT_EQ(support::Sleeps(), sleeps);
  EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(LockFileTest, RetriesAfterASignalButNoOtherFailure) {
  support::ResetCalls(3, EINTR);
  EXPECT_EQ(Locking(true), "");
  EXPECT_EQ(support::Flocks(), std::vector<int>(4, LOCK_EX | LOCK_NB));
  support::ResetCalls(1, ENOLCK);
  EXPECT_EQ(Locking(true), "No locks available");
  EXPECT_THAT(support::Sleeps(), IsEmpty());
  path_ = dir_ / "missing/lock";
  const std::string reason = "open failed, path=" + path_ + ", reason=No such file or directory";
  EXPECT_EQ(Locking(true), reason);
  EXPECT_THAT(log_.texts(),
              ElementsAre(EndsWith(") (LockFile) Failed [0 > (fd_ = open(path_.c_str(), O_RDONLY | O_CREAT, 0644))], "
                                   "reason: " +
                                   reason + " [err: No such file or directory]")));
}

TEST_F(LockFileTest, OthersCanOpenItWhateverTheUmaskIs) {
  const mode_t mask = umask(077);
  { const LockFile lock(path_, true); }
  umask(mask);
  struct stat info = {};
  stat(path_.c_str(), &info);
  EXPECT_EQ(info.st_mode & 0777, 0644U);
}

}  // namespace
}  // namespace quarrox
