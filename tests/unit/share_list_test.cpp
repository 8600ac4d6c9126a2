#include "linux/share_list.h"

#include <filesystem>
#include <regex>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "support/temp_dir.h"

namespace platform {
namespace {

// "@" in a text stands for a directory of the test's own, with the directories docs and docs/inner.
class ShareListTest : public testing::Test {
 protected:
  ShareListTest() { std::filesystem::create_directories(directory_ / "docs/inner"); }

  std::string At(const std::string& text) const {
    return std::regex_replace(text, std::regex("@"), std::filesystem::canonical(directory_.path()).string());
  }
  auto Parse(const std::string& text, bool samba = false) const { return ParseShares(At(text), "F", samba); }

  quarrox::support::TempDir directory_;
};

TEST_F(ShareListTest, TellsWhereWhatIsWrongAndKeepsTheRest) {
  const std::string cases[][2] = {
      {"[a\npath = @/x\n", "F:3: a section's head without \"]\", the section is left out; close the bracket"},
      {"[a]\n", "F:3: share a: it has no path; write \"path = DIRECTORY\""},
      {"[a]\npath = a\n", "F:4: share a: \"a\" is no plain absolute path; write one"},
      {"[a]\npath = /x/../a\n", "F:4: share a: \"/x/../a\" is no plain absolute path; write one"},
      {"[a]\npath = //\n", "F:4: share a: \"//\" makes all of the machine a share; choose a directory"},
      {"[a]\npath = /%U/a\n", "F:4: share a: its path \"/%U/a\" has the variable \"%U\""},
      {"[docs]\npath = /x\n", "F:3: share docs: another share in line 1 has this name, this one is left out"},
      {"[a\033]\npath = @//docs/\n", "F:4: share a\\x1B: its directory @/docs is that of the share docs in line 1"},
      {"[a/b]\npath = /x\n", "F:3: share a/b: no directory can have this name, it is left out"}};
  for (const auto& [text, problem] : cases) {
    const auto list = Parse("[docs]\npath = @/docs\n" + text);
    EXPECT_THAT(list->problems(), testing::ElementsAre(testing::StartsWith(At(problem)))) << text;
    EXPECT_EQ(list->shares().size(), 1U) << text;
  }
}

TEST_F(ShareListTest, ReadsValuesAsTheFileServerDoes) {
  const auto list = Parse(
      "\xEF\xBB\xBF[GLOBAL]\r\nRead Only = yes\n[docs]\n path = \"@/\\\n%S/\"\nWRITE OK = true\n# [x] \\\n"
      "vfs  objects = acl_xattr,recycle\nrecycle : repository = bin/all/%U/x\nfileindex:encrypted = Locked\n[inner]\n"
      "path = @/docs/inner/%U\nhide unreadable = maybe\n[Printers]\n[homes]\n[gone]\npath = /x\navailable = off\n");
  ASSERT_EQ(list->shares().size(), 2U);
  EXPECT_EQ(list->shares()[0].path + ":" + list->shares()[0].recycle, At("@/docs:bin/all"));
  EXPECT_EQ(list->shares()[0].status, kShareRecycle | kShareEncryption | kShareLocked);
  EXPECT_EQ(list->shares()[1].status, kShareReadOnly);
  EXPECT_EQ(list->problems().size(), 2U) << "the switch that is none, and the share in another";
  EXPECT_EQ(Parse("[docs]\npath = @/docs\n", true)->shares()[0].status, kShareReadOnly) << "Samba's default";
}

TEST_F(ShareListTest, FindsTheInnermostShareByWholeComponents) {
  const auto list = Parse("[docs]\npath = @/docs\n[inner]\npath = @/docs/inner\n");
  const std::string cases[][2] = {
      {"@/docs", "docs"}, {"@/docs/innermost/a", "docs"}, {"@/docs/inner//a", "inner"}, {"@/docs2", ""}, {"@", ""},
      {"docs", ""}};
  for (const auto& [path, name] : cases) {
    const Share* const found = list->FindByPath(At(path));
    EXPECT_EQ(found == nullptr ? "" : found->name, name) << path;
  }
  EXPECT_TRUE(list->IsVolume(At("@/docs")) && list->IsVolume(At("@")) && !list->IsVolume(At("@/docs/inner")));
}

}  // namespace
}  // namespace platform
