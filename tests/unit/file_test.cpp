#include "common/file.h"

#include <dirent.h>
#include <pwd.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <map>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "common/error.h"
#include "support/syslog_capture.h"
#include "support/temp_dir.h"
#include "vexo/acl.h"

namespace quarrox {
namespace {

using support::ReadText;
using support::WriteText;

// The process's current directory for the span of a test.
class CurrentDirectory {
 public:
  explicit CurrentDirectory(const std::string& path) : old_(std::filesystem::current_path()) {
    std::filesystem::current_path(path);
  }
  ~CurrentDirectory() { std::filesystem::current_path(old_); }
  CurrentDirectory(const CurrentDirectory&) = delete;
  CurrentDirectory& operator=(const CurrentDirectory&) = delete;

 private:
  std::filesystem::path old_;
};

// What IsDirentDir says of each entry of a directory; with `hide_types` as on a file system that gives no types.
std::map<std::string, bool> Directories(const std::string& path, bool hide_types) {
  std::map<std::string, bool> result;
  DIR* stream = opendir(path.c_str());
  while (const dirent* entry = readdir(stream)) {
    dirent copy = *entry;
    if (hide_types) copy.d_type = DT_UNKNOWN;
    if (copy.d_name[0] != '.') result[copy.d_name] = IsDirentDir(copy, path);
  }
  closedir(stream);
  return result;
}

class FileTest : public ::testing::Test {
 protected:
  FileTest() {
    std::filesystem::create_directory(dir_ / "dir");
    WriteText(dir_ / "file", "text");
    std::filesystem::create_symlink(dir_ / "dir", dir_ / "to_dir");
    std::filesystem::create_symlink(dir_ / "to_dir", dir_ / "to_link");
    std::filesystem::create_symlink(dir_ / "file", dir_ / "to_file");
    std::filesystem::create_symlink(dir_ / "gone", dir_ / "dangling");
    std::filesystem::create_symlink("dir", dir_ / "relative");
  }
  support::TempDir dir_;
};

TEST_F(FileTest, ExistenceFollowsLinks) {
  EXPECT_TRUE(IsFileExist(dir_ / "file"));
  EXPECT_TRUE(IsFileExist(dir_ / "dir"));
  EXPECT_TRUE(IsFileExist(dir_ / "to_file"));
  EXPECT_FALSE(IsFileExist(dir_ / "dangling"));
  EXPECT_FALSE(IsFileExist(""));
}

TEST_F(FileTest, ADirectoryBehindALinkCountsOnlyWhenFollowed) {
  EXPECT_TRUE(IsDirExist(dir_ / "dir", false));
  EXPECT_FALSE(IsDirExist(dir_ / "to_dir", false));
  EXPECT_TRUE(IsDirExist(dir_ / "to_dir", true));
  EXPECT_TRUE(IsDirExist(dir_ / "to_link", true));
  EXPECT_FALSE(IsDirExist(dir_ / "to_file", true));
  EXPECT_FALSE(IsDirExist(dir_ / "dangling", true));
  EXPECT_FALSE(IsDirExist(dir_ / "file", true));
}

TEST_F(FileTest, ARelativeLinkIsReadFromTheCurrentDirectory) {
  {
    const CurrentDirectory elsewhere("/");
    EXPECT_FALSE(IsDirExist(dir_ / "relative", true));
  }
  const CurrentDirectory beside(dir_.path());
  EXPECT_TRUE(IsDirExist(dir_ / "relative", true));
}

TEST_F(FileTest, ALinkToItselfIsNoDirectory) {
  std::filesystem::create_symlink(dir_ / "loop", dir_ / "loop");
  std::filesystem::create_symlink(dir_ / "pong", dir_ / "ping");
  std::filesystem::create_symlink(dir_ / "ping", dir_ / "pong");
  EXPECT_FALSE(IsDirExist(dir_ / "loop", true));
  EXPECT_FALSE(IsDirExist(dir_ / "ping", true));
}

TEST_F(FileTest, ADirectoryEntryIsADirectoryWithAndWithoutItsType) {
  for (const bool hide_types : {false, true}) {
    std::map<std::string, bool> found = Directories(dir_.path(), hide_types);
    EXPECT_TRUE(found["dir"]) << hide_types;
    EXPECT_FALSE(found["file"]) << hide_types;
    EXPECT_FALSE(found["to_dir"]) << hide_types;
    EXPECT_FALSE(found["dangling"]) << hide_types;
  }
}

TEST_F(FileTest, RealPathResolvesLinksAndIsEmptyOnFailure) {
  EXPECT_EQ(RealPath(dir_ / "to_link/../file"), RealPath(dir_.path()) + "/file");
  EXPECT_EQ(RealPath(dir_ / "dangling"), "");
}

TEST_F(FileTest, UnlinkRemovesFilesAndReportsTheRest) {
  EXPECT_TRUE(Unlink(dir_ / "to_dir"));
  EXPECT_TRUE(IsDirExist(dir_ / "dir", false));
  EXPECT_FALSE(Unlink(dir_ / "dir"));
  EXPECT_FALSE(Unlink(dir_ / "gone"));
}

TEST_F(FileTest, CopyLeavesTheSourceAndMoveTakesIt) {
  ASSERT_EQ(chmod((dir_ / "file").c_str(), 0640), 0);
  EXPECT_TRUE(CPFile(dir_ / "file", dir_ / "copy"));
  EXPECT_EQ(ReadText(dir_ / "copy"), "text");
  EXPECT_EQ(ReadText(dir_ / "file"), "text");
  WriteText(dir_ / "target", "something longer that is replaced");
  EXPECT_TRUE(MVFile(dir_ / "file", dir_ / "target"));
  EXPECT_EQ(ReadText(dir_ / "target"), "text");
  EXPECT_FALSE(IsFileExist(dir_ / "file"));
  EXPECT_FALSE(MVFile(dir_ / "file", dir_ / "target"));
  EXPECT_FALSE(CPFile(dir_ / "file", dir_ / "target"));
  EXPECT_EQ(ReadText(dir_ / "target"), "text");
}

TEST_F(FileTest, OnlyTheRootOfAFileSystemIsAMountPoint) {
  EXPECT_TRUE(IsMountPoint("/proc"));
  EXPECT_FALSE(IsMountPoint(dir_ / "dir"));
  EXPECT_FALSE(IsMountPoint(dir_ / "gone"));
}

TEST_F(FileTest, APermissionIsGrantedOnlyWithAllItsBits) {
  ASSERT_EQ(chmod((dir_ / "file").c_str(), 0644), 0);
  EXPECT_TRUE(CheckACLPerm(dir_ / "file", VEXO_PERM_READ | VEXO_PERM_WRITE));
  EXPECT_FALSE(CheckACLPerm(dir_ / "file", VEXO_PERM_READ | VEXO_PERM_EXECUTE));
  EXPECT_TRUE(CheckACLPerm(dir_ / "dir", VEXO_PERM_EXECUTE));
  EXPECT_FALSE(CheckACLPerm(dir_ / "gone", 0));
}

TEST_F(FileTest, PermissionsAreThoseOfTheEffectiveUser) {
  if (geteuid() != 0) GTEST_SKIP() << "only root can be somebody else";
  ASSERT_EQ(chmod(dir_.path().c_str(), 0755), 0);
  ASSERT_EQ(chmod((dir_ / "file").c_str(), 0644), 0);
  const pid_t child = fork();
  if (child == 0) {
    const bool switched = setegid(65534) == 0 && seteuid(65534) == 0;
    const bool right = CheckACLPerm(dir_ / "file", VEXO_PERM_READ) && !CheckACLPerm(dir_ / "file", VEXO_PERM_WRITE);
    _exit(switched && right ? 0 : 1);
  }
  int status = -1;
  waitpid(child, &status, 0);
  EXPECT_EQ(status, 0);
}

TEST_F(FileTest, WithoutAServiceUserNothingIsGivenAway) {
  if (getpwnam("Quarrox") != nullptr) GTEST_SKIP() << "this machine has the service user";
  const support::SyslogCapture log;
  try {
    ChownQuarrox(dir_ / "file");
    FAIL();
  } catch (const Error& error) {
    EXPECT_EQ(error.code, kErrChown);
    EXPECT_EQ(error.reason, "");
  }
  ASSERT_EQ(log.texts().size(), 1U);
  EXPECT_THAT(log.texts()[0], ::testing::HasSubstr(") (ChownQuarrox) Failed ["));
}

}  // namespace
}  // namespace quarrox
