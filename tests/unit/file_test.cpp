#include "common/file.h"

#include <dirent.h>
#include <pwd.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <map>
#include <string>

#include <gtest/gtest.h>

#include "support/errors.h"
#include "support/syslog_capture.h"
#include "support/temp_dir.h"
#include "vexo/acl.h"

namespace quarrox {
namespace {

namespace fs = std::filesystem;

class FileTest : public ::testing::Test {
 protected:
  FileTest() {
    fs::create_directory(dir_ / "dir");
    support::WriteText(dir_ / "file", "text");
    const char* const links[][2] = {{"to_dir", "dir"},    {"to_link", "to_dir"}, {"to_file", "file"},
                                    {"dangling", "gone"}, {"ping", "pong"},      {"pong", "ping"}};
    for (const auto& [link, target] : links) fs::create_symlink(dir_ / target, dir_ / link);
  }
  support::TempDir dir_;
};

TEST_F(FileTest, KindsAreToldWithAndWithoutFollowingLinks) {
  // One letter each: exists, is a directory, leads to one, is a directory by its entry.
  const std::map<std::string, std::string> kinds = {{"file", "e"},     {"dir", "edlD"},  {"to_dir", "el"},
                                                    {"to_link", "el"}, {"to_file", "e"}, {"dangling", ""},
                                                    {"ping", ""}};
  for (const auto& [name, kind] : kinds) {
    dirent entry = {};
    entry.d_type = DT_UNKNOWN;  // as on a file system that gives no types
    name.copy(entry.d_name, sizeof(entry.d_name) - 1);
    EXPECT_EQ(IsFileExist(dir_ / name), kind.find('e') != kind.npos) << name;
    EXPECT_EQ(IsDirExist(dir_ / name, false), kind.find('d') != kind.npos) << name;
    EXPECT_EQ(IsDirExist(dir_ / name, true), kind.find('l') != kind.npos) << name;
    EXPECT_EQ(IsDirentDir(entry, dir_.path()), kind.find('D') != kind.npos) << name;
  }
}

TEST_F(FileTest, FilesAreCopiedMovedAndRemovedWhole) {
  support::WriteText(dir_ / "target", "something longer that is replaced");
  EXPECT_TRUE(CPFile(dir_ / "file", dir_ / "target"));
  EXPECT_EQ(support::ReadText(dir_ / "target"), "text");
  EXPECT_TRUE(MVFile(dir_ / "file", dir_ / "moved"));
  EXPECT_FALSE(CPFile(dir_ / "file", dir_ / "target"));
  EXPECT_EQ(support::ReadText(dir_ / "target"), "text");
  EXPECT_TRUE(Unlink(dir_ / "to_dir") && !Unlink(dir_ / "dir"));
}

TEST_F(FileTest, PermissionsAreThoseOfTheEffectiveUserAndNeedAllBits) {
  if (geteuid() != 0) GTEST_SKIP() << "only root can be somebody else";
  fs::permissions(dir_.path(), fs::perms{0755});
  fs::permissions(dir_ / "file", fs::perms{0644});
  EXPECT_TRUE(CheckACLPerm(dir_ / "file", VEXO_PERM_READ | VEXO_PERM_WRITE));
  int status = -1;
  if (fork() == 0) {
    const bool switched = seteuid(65534) == 0 && CheckACLPerm(dir_ / "file", VEXO_PERM_READ);
    _exit(switched && !CheckACLPerm(dir_ / "file", VEXO_PERM_READ | VEXO_PERM_WRITE) ? 0 : 1);
  }
  wait(&status);
  EXPECT_EQ(status, 0);
}

TEST_F(FileTest, WithoutAServiceUserNothingIsGivenAway) {
  if (getpwnam("Quarrox") != nullptr) GTEST_SKIP() << "this machine has the service user";
  const support::SyslogCapture log;
  EXPECT_THROW(ChownQuarrox(dir_ / "file"), Error);
  EXPECT_EQ(log.texts().size(), 1U);
}

}  // namespace
}  // namespace quarrox
