#include <unistd.h>

#include <cerrno>
#include <string>

#include <gtest/gtest.h>

#include "common/error.h"
#include "common/log.h"
#include "support/errors.h"
#include "support/syslog_capture.h"

namespace quarrox {
namespace {

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
  static constexpr int kLine = __LINE__ + 1;
  ~Failing() { QUARROX_LOG_FAILED("!mutex_.Unlock()"); }
};

TEST(Error, ComposesTheMessageInTheBaseOnly) {
  const Error bare(kErrNoSuchShare);
  EXPECT_EQ(bare.std::runtime_error::what(), std::string("Quarrox error, code=800"));
  EXPECT_STREQ(bare.what(), "");
  const Error full(kErrMalformedEvent, "R");
  EXPECT_EQ(full.std::runtime_error::what(), std::string("Quarrox error, code=906, reason=[R]"));
  EXPECT_STREQ(static_cast<const std::runtime_error&>(full).what(), "R");
}

TEST(Log, FailureLineNamesErrnoOnlyWhenItIsSetAndResetsIt) {
  const support::SyslogCapture log;
  errno = ENOENT;
  const int line = __LINE__ + 1;
  QUARROX_LOG_FAILURE("Failed to get status from share[%s]", "photo 100%s");
  EXPECT_EQ(errno, 0);
  { const Failing failing; }
  errno = EACCES;
  QUARROX_LOG_PROGRESS("Got event: %s", "{}");
  EXPECT_EQ(errno, EACCES);

  const auto lines = log.lines();
  ASSERT_EQ(lines.size(), 3U);
  EXPECT_EQ(lines[0].text,
            Head(line, "TestBody") + "Failed to get status from share[photo 100%s] [err: No such file or directory]");
  EXPECT_EQ(lines[0].format, "%s:%d (%d, %u) (%s) Failed to get status from share[%s] [err: %m]");
  EXPECT_EQ(lines[1].text, Head(Failing::kLine, "~Failing") + "Failed [!mutex_.Unlock()]");
  EXPECT_EQ(lines[2].text, "error_log_test:" + std::to_string(line + 4) + " Got event: {}");
  for (const auto& entry : lines) EXPECT_EQ(entry.priority, LOG_ERR);
}

TEST(Log, ThrowLogsTheErrnoOfTheFailureAndCutsWhatTheSystemLogWouldDrop) {
  const support::SyslogCapture log;
  errno = EPERM;
  EXPECT_THROW(QUARROX_THROW("0 > fd", kErrSystem, ReasonThatSetsErrno()), Error);
  EXPECT_EQ(errno, 0);
  const std::string reason(300000, 'x');
  EXPECT_EQ(support::ReasonOf(kErrLockFile, [&] { QUARROX_THROW_IN("Lock", "!ok", kErrLockFile, reason); }), reason);

  ASSERT_EQ(log.lines().size(), 2U);
  EXPECT_EQ(log.lines()[0].format, "%s:%d (%d, %u) (%s) Failed [%s], reason: %s [err: %m]");
  const std::string end = "Failed [0 > fd], reason: R %m %n [err: Operation not permitted]";
  EXPECT_NE(log.texts()[0].find(end), std::string::npos) << log.texts()[0];
  EXPECT_LT(log.texts()[1].size(), 10000U);
  EXPECT_NE(log.texts()[1].find("xxx... (300000 bytes)"), std::string::npos);
}

}  // namespace
}  // namespace quarrox
