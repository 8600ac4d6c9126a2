#include "fileindex/index_failures.h"

#include <gtest/gtest.h>

#include "support/call_capture.h"
#include "support/temp_dir.h"

namespace quarrox::fileindex {

using Paths = std::vector<std::string>;

static IndexFailure Failure(bool may_succeed_later, int64_t size = 1) {
  IndexFailure failure;
  failure.may_succeed_later = may_succeed_later;
  failure.size = size;
  return failure;
}

TEST(IndexFailuresTest, PausesDoubleUpToAnHourWhileTheFileStaysAndOnlyWhereTryingMayHelp) {
  IndexFailures failures;
  support::SetTime(1000);
  for (const int pause : {60, 120, 240, 480, 960, 1920, 3600, 3600}) {
    failures.Note("/a", Failure(true));
    EXPECT_EQ(failures.NextTry(), 1000 + pause);
  }
  failures.Note("/a", Failure(true, 2));
  failures.Note("/b", Failure(false));
  EXPECT_EQ(failures.NextTry(), 1060);
  EXPECT_EQ(failures.Due(1059), Paths());
  EXPECT_EQ(failures.Due(1060), Paths({"/a"}));
  EXPECT_EQ(failures.Due(999), Paths({"/a"}));  // the clock was set back
  support::ResetCalls();
}

TEST(IndexFailuresTest, FailuresMoveAndGoWithTheirDirectoryAndWithNoOtherOfALikeName) {
  IndexFailures failures;
  for (const char* path : {"/a", "/a/x", "/a/x/y", "/a.b", "/ab", "/n/old"}) failures.Note(path, Failure(true));
  failures.MoveBelow("/a", "/n");
  EXPECT_EQ(failures.AtOrBelow(""), Paths({"/a.b", "/ab", "/n", "/n/x", "/n/x/y"}));
  failures.ForgetBelow("/n/x");
  failures.Forget("/ab");
  EXPECT_EQ(failures.AtOrBelow(""), Paths({"/a.b", "/n"}));
}

TEST(IndexFailuresTest, WhatIsSavedIsReadAgainAndTheRestIsOnlyCounted) {
  const support::TempDir dir;
  IndexFailures failures(dir / "failures");
  failures.Note("/\xff\"", Failure(true));
  for (size_t i = 0; i < IndexFailures::kMost; ++i) failures.Note("/" + std::to_string(i), Failure(false));
  failures.Save();
  const IndexFailures read(failures.file());
  EXPECT_EQ(read.size(), IndexFailures::kMost);
  EXPECT_EQ(read.omitted(), 1U);
  EXPECT_EQ(read.Due(failures.NextTry().value()), Paths({"/\xff\""}));
}

}  // namespace quarrox::fileindex
