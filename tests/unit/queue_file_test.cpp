#include "common/queue_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <set>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "common/error.h"
#include "support/call_capture.h"
#include "support/file_size_limit.h"
#include "support/temp_dir.h"

namespace quarrox {
namespace {

std::string AppendReason(const std::string& path, const std::string& lines) {
  try {
    AppendToQueue(path, lines);
  } catch (const Error& error) {
    EXPECT_EQ(error.code, kErrSystem);
    return error.reason;
  }
  return "";
}

// What a consumer does: takes the queue away under the lock that producers take.
class Consumer {
 public:
  explicit Consumer(const std::string& path) : path_(path), fd_(open(path.c_str(), O_RDWR | O_CLOEXEC)) {
    if (fd_ >= 0) flock(fd_, LOCK_EX);
  }
  ~Consumer() {
    if (fd_ >= 0) close(fd_);
  }
  Consumer(const Consumer&) = delete;
  Consumer& operator=(const Consumer&) = delete;
  bool RenameTo(const std::string& to) { return fd_ >= 0 && rename(path_.c_str(), to.c_str()) == 0; }

 private:
  std::string path_;
  int fd_;
};

class QueueFileTest : public ::testing::Test {
 protected:
  support::TempDir dir_;
  const std::string path_ = dir_ / "queue";
};

TEST_F(QueueFileTest, IsMadePrivateAndGrowsAtItsEnd) {
  const mode_t mask = umask(022);
  AppendToQueue(path_, "one\n");
  umask(mask);
  AppendToQueue(path_, "two\nthree\n");
  EXPECT_EQ(support::ReadText(path_), "one\ntwo\nthree\n");
  struct stat info;
  ASSERT_EQ(stat(path_.c_str(), &info), 0);
  EXPECT_EQ(info.st_mode & 07777, 0600U);
}

TEST_F(QueueFileTest, ATornLastLineIsNotGluedToTheNext) {
  support::WriteText(path_, "one\n{\"to");
  AppendToQueue(path_, "two\n");
  AppendToQueue(path_, "three\n");
  EXPECT_EQ(support::ReadText(path_), "one\n{\"to\ntwo\nthree\n");
}

TEST_F(QueueFileTest, AFullDiskLeavesNoTornLine) {
  AppendToQueue(path_, "one\n");
  {
    const support::FileSizeLimit limit(8);
    const std::string reason = AppendReason(path_, "a line that does not fit\n");  // some of it would
    EXPECT_EQ(reason.find("Failed to append to queue, path=" + path_ + ", reason="), 0U) << reason;
    EXPECT_EQ(support::ReadText(path_), "one\n");
    EXPECT_EQ(AppendReason(path_, "two\n"), "");
    EXPECT_NE(AppendReason(path_, "full\n"), "");  // nothing of it would
  }
  EXPECT_EQ(support::ReadText(path_), "one\ntwo\n");
}

TEST_F(QueueFileTest, AQueueThatCannotBeOpenedIsError502) {
  const std::string path = dir_ / "missing/queue";
  EXPECT_EQ(AppendReason(path, "one\n"),
            "Failed to append to queue, path=" + path + ", reason=No such file or directory");
  EXPECT_EQ(AppendReason(dir_.path(), "one\n"),
            "Failed to append to queue, path=" + dir_.path() + ", reason=Is a directory");
}

TEST_F(QueueFileTest, ASignalDuringTheWaitIsNoFailure) {
  const support::FlockFailures flocks(EINTR, 3);
  AppendToQueue(path_, "one\n");
  EXPECT_EQ(flocks.operations(), std::vector<int>(4, LOCK_EX));
  EXPECT_EQ(support::ReadText(path_), "one\n");
}

TEST_F(QueueFileTest, AProducerThatWaitedForARenamedQueueWritesToTheNewOne) {
  AppendToQueue(path_, "one\n");
  const support::FlockFailures flocks(0, 0);
  std::thread producer;
  {
    Consumer consumer(path_);
    producer = std::thread([this] { AppendToQueue(path_, "two\n"); });
    while (flocks.operations().size() < 2) std::this_thread::sleep_for(std::chrono::milliseconds(1));
    ASSERT_TRUE(consumer.RenameTo(path_ + ".tmp"));
  }
  producer.join();
  EXPECT_EQ(support::ReadText(path_ + ".tmp"), "one\n");
  EXPECT_EQ(support::ReadText(path_), "two\n");
}

TEST_F(QueueFileTest, ManyProducersAndAConsumerLoseAndTearNothing) {
  constexpr int kProducers = 4;
  constexpr int kLines = 400;
  std::vector<pid_t> producers;
  for (int p = 0; p < kProducers; ++p) {
    const pid_t pid = fork();
    if (pid == 0) {
      for (int i = 0; i < kLines; ++i) {
        AppendToQueue(path_, std::to_string(p) + " " + std::to_string(i) + std::string(200, 'x') + "\n");
      }
      _exit(0);
    }
    producers.push_back(pid);
  }
  // Each taken file is read only after every producer has gone: a line written into it late would be found.
  int taken = 0;
  for (size_t left = producers.size(); left > 0;) {
    if (Consumer(path_).RenameTo(dir_ / ("taken." + std::to_string(taken)))) ++taken;
    int status = 0;
    while (waitpid(-1, &status, WNOHANG) > 0) {
      EXPECT_EQ(status, 0);
      --left;
    }
  }
  std::multiset<std::string> lines;
  for (const auto& entry : std::filesystem::directory_iterator(dir_.path())) {
    std::istringstream text(support::ReadText(entry.path()));
    for (std::string line; std::getline(text, line);) lines.insert(line);
  }
  EXPECT_EQ(lines.size(), static_cast<size_t>(kProducers * kLines));
  for (int p = 0; p < kProducers; ++p) {
    for (int i = 0; i < kLines; ++i) {
      EXPECT_EQ(lines.count(std::to_string(p) + " " + std::to_string(i) + std::string(200, 'x')), 1U);
    }
  }
  EXPECT_GT(taken, 1);
}

}  // namespace
}  // namespace quarrox
