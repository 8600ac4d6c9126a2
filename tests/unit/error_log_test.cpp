#include <unistd.h>

#include <cerrno>
#include <string>

#include <gtest/gtest.h>

#include "common/error.h"
#include "common/log.h"
#include "support/syslog_capture.h"

namespace quarrox {
namespace {

std::string Composed(const Error& error) {
  return error.std::runtime_error::what();
}

// "unit:line (pid, euid) (function) " as this file writes it.
std::string Head(int line, const std::string& function) {
  return "error_log_test:" + std::to_string(line) + " (" + std::to_string(getpid()) + ", " + std::to_string(geteuid()) +
         ") (" + function + ") ";
}

std::string ReasonThatSetsErrno() {
  errno = EIO;
  return "R %m %n";
}

// The function under test is a destructor too: its short name has the tilde.
struct Failing {
  static int line;
  ~Failing() {
    line = __LINE__ + 1;
    QUARROX_LOG_FAILED("!mutex_.Unlock()");
  }
};
int Failing::line = 0;

TEST(Error, ComposesTheMessageInTheBaseOnly) {
  const Error bare(kErrNoSuchShare);
  EXPECT_EQ(Composed(bare), "Quarrox error, code=800");
  EXPECT_STREQ(bare.what(), "");

  const Error full(kErrMalformedEvent, "R");
  EXPECT_EQ(Composed(full), "Quarrox error, code=906, reason=[R]");
  EXPECT_STREQ(full.what(), "R");
  EXPECT_EQ(Composed(Error(kErrMalformedEvent, "")), Composed(Error(kErrMalformedEvent)));
}

TEST(Error, KeepsCodeAndReasonThroughACatchByItsBase) {
  try {
    throw Error(kErrLockFile, "why");
  } catch (const std::runtime_error& error) {
    EXPECT_STREQ(error.what(), "why");
    EXPECT_EQ(dynamic_cast<const Error&>(error).code, 506);
  }
}

TEST(Log, FailureLineNamesErrnoOnlyWhenItIsSetAndResetsIt) {
  const support::SyslogCapture log;
  errno = ENOENT;
  const int line = __LINE__ + 1;
  QUARROX_LOG_FAILURE("Failed to get status from share[%s]", "photo 100%s");
  EXPECT_EQ(errno, 0);
  QUARROX_LOG_FAILURE("Compound failed: %s (%d) %s", "a", 7, "b");
  { const Failing failing; }

  const auto lines = log.lines();
  ASSERT_EQ(lines.size(), 3U);
  EXPECT_EQ(lines[0].text,
            Head(line, "TestBody") + "Failed to get status from share[photo 100%s] [err: No such file or directory]");
  EXPECT_EQ(lines[0].format, "%s:%d (%d, %u) (%s) Failed to get status from share[%s] [err: %m]");
  EXPECT_EQ(lines[1].text, Head(line + 2, "TestBody") + "Compound failed: a (7) b");
  EXPECT_EQ(lines[2].text, Head(Failing::line, "~Failing") + "Failed [!mutex_.Unlock()]");
  for (const auto& entry : lines) EXPECT_EQ(entry.priority, LOG_ERR);
}

TEST(Log, ProgressLineHasNeitherProcessNorErrnoAndLeavesErrnoAlone) {
  const support::SyslogCapture log;
  errno = EACCES;
  const int line = __LINE__ + 1;
  QUARROX_LOG_PROGRESS("Got event: %s", "{}");
  EXPECT_EQ(errno, EACCES);
  ASSERT_EQ(log.lines().size(), 1U);
  EXPECT_EQ(log.lines()[0].text, "error_log_test:" + std::to_string(line) + " Got event: {}");
  EXPECT_EQ(log.lines()[0].format, "%s:%d Got event: %s");
}

TEST(Log, ThrowLogsTheErrnoOfTheFailureNotTheOneOfMakingTheReason) {
  const support::SyslogCapture log;
  errno = EPERM;
  EXPECT_THROW(QUARROX_THROW("0 > fd", kErrSystem, ReasonThatSetsErrno()), Error);
  EXPECT_EQ(errno, 0);
  EXPECT_THROW(QUARROX_THROW("gone", kErrNoSuchShare, ""), Error);

  ASSERT_EQ(log.lines().size(), 2U);
  EXPECT_EQ(log.lines()[0].format, "%s:%d (%d, %u) (%s) Failed [%s], reason: %s [err: %m]");
  EXPECT_NE(log.lines()[0].text.find("Failed [0 > fd], reason: R %m %n [err: Operation not permitted]"),
            std::string::npos);
  // The reason of the second was made with errno 0.
  EXPECT_EQ(log.lines()[1].format, "%s:%d (%d, %u) (%s) Failed [%s], reason: %s");
}

TEST(Log, AReasonTooLongForTheSystemLogIsCutThereAndWholeInTheError) {
  const support::SyslogCapture log;
  const std::string reason(300000, 'x');
  try {
    QUARROX_THROW("!ok", kErrMalformedEvent, reason);
    FAIL();
  } catch (const Error& error) {
    EXPECT_EQ(error.reason, reason);
  }
  ASSERT_EQ(log.lines().size(), 1U);
  EXPECT_LT(log.lines()[0].text.size(), 10000U);
  EXPECT_NE(log.lines()[0].text.find("xxx... (300000 bytes)"), std::string::npos);
}

TEST(Log, UnitIsTheFileNameWithoutDirectoryAndExtension) {
  EXPECT_STREQ(log::Unit("/a/b.c/index_mgr.cpp").name, "index_mgr");
  EXPECT_STREQ(log::Unit("index_mgr").name, "index_mgr");
  EXPECT_EQ(std::string(log::Unit(std::string(100, 'u').c_str()).name).size(), 47U);
}

}  // namespace
}  // namespace quarrox
