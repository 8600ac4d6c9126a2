#include "linux/content_workers.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>
#include <thread>

#include <gtest/gtest.h>

#include "common/file.h"
#include "common/strings.h"
#include "support/temp_dir.h"

namespace platform {

using quarrox::UniqueFd;

static std::string Faulty() {
  return quarrox::Dirname(quarrox::RealPath("/proc/self/exe")) + "/faulty_reader";
}

static pid_t LastChild(pid_t of) {
  pid_t last = 0;
  std::ifstream children("/proc/" + std::to_string(of) + "/task/" + std::to_string(of) + "/children");
  for (pid_t child = 0; children >> child;) last = child;
  return last;
}

struct ContentWorkersTest : testing::Test {
  ContentWorkersTest() {
    quarrox::support::WriteText(file_,
                                "gr\xfc\xdf"
                                "e");
  }

  // The text, or the title, or the failure, "!" before one that may pass.
  std::string Read(const std::string& extension, ContentWorkers& workers) {
    const UniqueFd fd(open(file_.c_str(), O_RDONLY | O_CLOEXEC));
    Json::Value fields;
    fields["VEXOMDPath"] = "/a";
    try {
      workers.Read({fd.get(), 100000, extension}, fields);
    } catch (const std::system_error& error) {
      return "!" + std::to_string(error.code().value()) + " " + error.what();
    } catch (const std::runtime_error& error) {
      return error.what();
    }
    EXPECT_EQ(fields["VEXOMDPath"], "/a");
    return fields.get("VEXOMDTextContent", fields["VEXOMDTitle"]).asString();
  }

  const quarrox::support::TempDir dir_;
  const std::string file_ = dir_ / "file";
  ContentWorkers workers_{Faulty(), std::chrono::milliseconds(1000)};
};

TEST_F(ContentWorkersTest, AFaultyReaderFailsItsOneFile) {
  const std::tuple<const char*, const char*> cases[] = {
      {"crash", "the file's reader was ended by signal 11 (x-crash)"},
      {"exit", "the file's reader ended with status 3 (x-exit)"},
      {"hang", "!110 reading the file took longer than 1 s (x-hang): Connection timed out"},
      {"spin", "reading the file took longer than 1 s (x-spin)"},
      {"grow", "reading the file takes too much memory (x-grow)"},
      {"nonsense", "the file's reader answered nonsense (x-nonsense)"},
      {"late", "found"},
      {"lies", "lies"},
      {"kill", "!12 the file's reader was ended by signal 9 (x-kill): Cannot allocate memory"},
      {"short", "!5 the file's reader was ended by signal 7 (x-short): Input/output error"},
      {"disk", "!5 Input/output error (x-disk): Input/output error"}};
  for (const auto& [extension, outcome] : cases) {
    EXPECT_EQ(Read(extension, workers_), outcome);
    EXPECT_EQ(Read("", workers_), "grüße") << "after " << extension;
  }
}

TEST_F(ContentWorkersTest, ThreadsReadAtOnceAndFailForThemselves) {
  std::vector<std::thread> threads;
  for (int number = 0; number < 8; ++number) {
    threads.emplace_back([this, number] {
      for (int i = 0; i < 40; ++i) {
        const bool fails = (i + number) % 10 == 0;
        EXPECT_EQ(Read(fails ? "exit" : "", workers_),
                  fails ? "the file's reader ended with status 3 (x-exit)" : "grüße");
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
}

TEST_F(ContentWorkersTest, AReaderThatIsGoneOrHasReadEnoughIsReplaced) {
  EXPECT_EQ(Read("", workers_), "grüße");
  const pid_t first = LastChild(getpid());
  siginfo_t end;
  ASSERT_TRUE(kill(first, SIGKILL) == 0 && waitid(P_PID, static_cast<id_t>(first), &end, WEXITED | WNOWAIT) == 0);
  ASSERT_EQ(Read("", workers_), "grüße");
  const pid_t second = LastChild(getpid());
  EXPECT_NE(second, first);
  for (int i = 0; i < 110; ++i) ASSERT_EQ(Read("", workers_), "grüße") << i;
  EXPECT_NE(LastChild(getpid()), second);
}

TEST_F(ContentWorkersTest, WhatIsNoReaderSaysNothingAboutAFile) {
  ContentWorkers missing("/nowhere/reader");
  EXPECT_EQ(Read("", missing), "!2 the reader of files /nowhere/reader cannot be started: No such file or directory");
  ContentWorkers other("/usr/bin/true");
  EXPECT_EQ(
      Read("", other),
      "!11 the reader of files /usr/bin/true cannot be used, it ended with status 0: Resource temporarily unavailable");
}

TEST_F(ContentWorkersTest, AReaderEndsWithItsProcessAlsoWhileItReads) {
  int ends[2];
  ASSERT_EQ(pipe2(ends, O_CLOEXEC), 0);
  const pid_t host = fork();
  if (host == 0) {
    Read("", workers_);
    const pid_t reader = LastChild(getpid());
    std::thread([this] { Read("hang", workers_); }).detach();
    _exit(write(ends[1], &reader, sizeof(reader)) == sizeof(reader) ? 0 : 1);
  }
  pid_t reader = 0;
  ASSERT_EQ(read(ends[0], &reader, sizeof(reader)), static_cast<ssize_t>(sizeof(reader)));
  const UniqueFd end(static_cast<int>(syscall(SYS_pidfd_open, reader, 0)));
  pollfd item = {end.get(), POLLIN, 0};
  EXPECT_TRUE(!end || poll(&item, 1, 10000) == 1);
  waitpid(host, nullptr, 0);
}

}  // namespace platform
