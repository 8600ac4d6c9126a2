#include "common/strings.h"

#include <gtest/gtest.h>

namespace quarrox {
namespace {

TEST(Strings, SplitsAPathAtItsLastSlash) {
  const char* const cases[][3] = {{"/volume1/a/b", "/volume1/a", "b"},
                                  {"/a", "", "a"},
                                  {"a", "", "a"},
                                  {"/a/", "/a", ""},
                                  {"", "", ""},
                                  {"//a", "/", "a"}};
  for (const auto& [path, directory, base] : cases) {
    EXPECT_EQ(Dirname(path), directory) << path;
    EXPECT_EQ(Basename(path), base) << path;
  }
}

TEST(Strings, AnExtensionBelongsToTheBaseNameAndIsLoweredInAsciiOnly) {
  EXPECT_EQ(GetFileExtension("dir.v2/file", true), "");
  EXPECT_EQ(GetFileExtension("/x/.JPG", false), "JPG");
  EXPECT_EQ(GetFileExtension("/x/a.tar.\xc3\x84XZ\xff", true), "\xc3\x84xz\xff");
}

TEST(Strings, TrimsWhatTheCLibraryCallsSpaceAndNotHighBytes) {
  EXPECT_EQ(LTrim("\t\n\v\f\r \xa0 a \xa0 "), "\xa0 a \xa0 ");
  EXPECT_EQ(RTrim(" \xa0 a \xa0\r\n "), " \xa0 a \xa0");
  EXPECT_EQ(Trim(" \t "), "");
}

}  // namespace
}  // namespace quarrox
