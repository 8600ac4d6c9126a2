#include "common/strings.h"

#include <gtest/gtest.h>

namespace quarrox {
namespace {

TEST(Strings, PrefixIsBytesAndNeverLongerThanTheText) {
  EXPECT_TRUE(StringStartWith("/volume1/a", "/volume1"));
  EXPECT_TRUE(StringStartWith("", ""));
  EXPECT_FALSE(StringStartWith("/vol", "/volume1"));
  EXPECT_FALSE(StringStartWith("/Volume1", "/volume1"));
}

TEST(Strings, SplitsAPathAtItsLastSlash) {
  struct Case {
    const char* path;
    const char* directory;
    const char* base;
  };
  for (const Case& c : {Case{"/volume1/a/b", "/volume1/a", "b"}, Case{"/a", "", "a"}, Case{"a", "", "a"},
                        Case{"/a/", "/a", ""}, Case{"/", "", ""}, Case{"", "", ""}, Case{"//a", "/", "a"}}) {
    EXPECT_EQ(Dirname(c.path), c.directory) << c.path;
    EXPECT_EQ(Basename(c.path), c.base) << c.path;
  }
}

TEST(Strings, ExtensionBelongsToTheBaseNameOnly) {
  EXPECT_EQ(GetFileExtension("dir.v2/file", true), "");
  EXPECT_EQ(GetFileExtension("/x/A.JPG", true), "jpg");
  EXPECT_EQ(GetFileExtension("/x/A.JPG", false), "JPG");
  EXPECT_EQ(GetFileExtension("/x/a.tar.gz", false), "gz");
  EXPECT_EQ(GetFileExtension("/x/.profile", false), "profile");
  EXPECT_EQ(GetFileExtension("/x/a.", false), "");
  EXPECT_EQ(GetFileExtension("/x/a.\xc3\x84X", true), "\xc3\x84x");
}

TEST(Strings, LowersAsciiAndLeavesEveryOtherByte) {
  EXPECT_EQ(ToLower("AZ-az \xc3\x84\xff"), "az-az \xc3\x84\xff");
}

TEST(Strings, TrimsWhatTheCLibraryCallsSpaceAndNotHighBytes) {
  const std::string text = "\t\n\v\f\r \xa0 a b \xa0\r\n ";
  EXPECT_EQ(Trim(text), "\xa0 a b \xa0");
  EXPECT_EQ(LTrim(text), "\xa0 a b \xa0\r\n ");
  EXPECT_EQ(RTrim(text), "\t\n\v\f\r \xa0 a b \xa0");
  EXPECT_EQ(Trim(" \t "), "");
  EXPECT_EQ(Trim(""), "");
}

}  // namespace
}  // namespace quarrox
