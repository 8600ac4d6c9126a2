#include "common/queue_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <string>
#include <thread>

#include <gtest/gtest.h>

#include "support/call_capture.h"
#include "support/errors.h"
#include "support/file_size_limit.h"
#include "support/temp_dir.h"

namespace quarrox {
namespace {

using support::ReadText;

class QueueFileTest : public ::testing::Test {
 protected:
  static std::string ReasonOfAppending(const std::string& path, const std::string& lines) {
    return support::ReasonOf(kErrSystem, [&] { AppendToQueue(path, lines); });
  }

  // What a consumer does: takes the queue away under the lock that producers take. Runs `wait` before it does.
  template <typename Wait>
  bool Take(const std::string& to, const Wait& wait) {
    const int fd = open(path_.c_str(), O_RDWR | O_CLOEXEC);
    if (fd < 0) return false;
    flock(fd, LOCK_EX);
    wait();
    const bool taken = rename(path_.c_str(), to.c_str()) == 0;
    close(fd);
    return taken;
  }

  support::TempDir dir_;
  const std::string path_ = dir_ / "queue";
};

TEST_F(QueueFileTest, IsMadePrivateAndGrowsByWholeLines) {
  support::ResetCalls(3, EINTR);  // a signal during the wait is no failure
  AppendToQueue(path_, "one\n");
  EXPECT_EQ(std::filesystem::status(path_).permissions(), std::filesystem::perms{0600});
  support::WriteText(path_, "one\n{\"to");  // a producer died here
  AppendToQueue(path_, "two\n");
  AppendToQueue(path_, "three\nfour\n");
  EXPECT_EQ(ReadText(path_), "one\n{\"to\ntwo\nthree\nfour\n");
  const std::string drained_by_another = dir_ / "another";
  mkdir(drained_by_another.c_str(), 0700);
  if (chown(drained_by_another.c_str(), 1, 1) != 0) return;  // only root can make it so
  AppendToQueue(drained_by_another + "/queue", "one\n");
  struct stat info = {};
  stat((drained_by_another + "/queue").c_str(), &info);
  EXPECT_EQ(info.st_uid, 1U);
}

TEST_F(QueueFileTest, AFailureIsError502AndLeavesNoTornLine) {
  AppendToQueue(path_, "one\n");
  {
    const support::FileSizeLimit limit(8);
    const std::string reason = ReasonOfAppending(path_, "a line that does not fit\n");  // some of it would
    EXPECT_EQ(reason, "Failed to append to queue, path=" + path_ + ", reason=No space left on device");
  }
  EXPECT_EQ(ReadText(path_), "one\n");
}

TEST_F(QueueFileTest, AProducerThatWaitedForARenamedQueueWritesToTheNewOne) {
  AppendToQueue(path_, "one\n");
  support::ResetCalls();
  std::thread producer;
  ASSERT_TRUE(Take(path_ + ".tmp", [&] {
    producer = std::thread([this] { AppendToQueue(path_, "two\n"); });
    while (support::Flocks().size() < 2) std::this_thread::yield();
  }));
  producer.join();
  EXPECT_EQ(ReadText(path_), "two\n");
}

}  // namespace
}  // namespace quarrox
