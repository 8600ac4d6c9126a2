#include "fileindex/util.h"

#include <filesystem>
#include <map>
#include <string>

#include <gtest/gtest.h>

#include "common/error.h"
#include "support/errors.h"
#include "support/fake_platform/fake_platform.h"
#include "support/syslog_capture.h"
#include "support/temp_dir.h"

namespace quarrox::fileindex {
namespace {

namespace fs = std::filesystem;
using support::ReasonOf;

class UtilTest : public ::testing::Test {
 protected:
  UtilTest() {
    world_.Reset();
    for (const char* place :
         {"docs/.git/x", "docs/.gitignore", "docs/#snapshot/x", "docs/a#snapshot", "docs/#recycle/x", "docs/disk",
          "docs/nfs", "docs/iso", "docs/@eaDir", "vault/x", "ro/x", "homes/alice/#recycle"}) {
      fs::create_directories(volume_ / place);
    }
    fs::create_symlink("disk", volume_ / "docs/link");
    world_.AddShare({.name = "docs", .path = volume_ / "docs", .recycle = true});
    world_.AddShare({.name = "vault", .path = volume_ / "vault", .encryption = true});
    world_.AddShare({.name = "locked", .path = volume_ / "locked", .encryption = true, .locked = true});
    world_.AddShare({.name = "ro", .path = volume_ / "ro", .read_only = true});
    world_.AddShare({.name = "homes", .path = volume_ / "homes"});
    world_.Mount(volume_ / "docs/disk");
    world_.Mount(volume_ / "vault/x");
    world_.Mount(volume_ / "docs/nfs", VEXO_FS_NFS);
    world_.Mount(volume_ / "docs/iso", VEXO_FS_ISO9660);
    world_.Mount("/proc", VEXO_FS_PSEUDO);
  }
  support::FakePlatform& world_ = support::FakePlatform::Get();
  support::SyslogCapture log_;
  support::TempDir volume_;
};

TEST_F(UtilTest, SharePathsAndFullPathsAreMadeOfEachOther) {
  EXPECT_EQ(GetShareNameByPath("/docs"), "docs");
  EXPECT_EQ(GetShareNameByPath("/docs/a/b"), "docs");
  EXPECT_EQ(ReasonOf(120, [] { GetShareNameByPath("docs/a"); }), "docs/a");
  EXPECT_THROW(GetShareNameByPath(""), Error);
  EXPECT_EQ(GetFullPath("/docs/a"), volume_ / "docs/a");
  EXPECT_EQ(ReasonOf(800, [] { GetFullPath("/gone/a"); }), "gone");
  EXPECT_EQ(ReplacePathShare("/volume1/old/old/x", "new", "old"), "/volume1/new/old/x");
  EXPECT_EQ(ReplacePathShare("/volume1/old", "new", "old"), "/volume1/new");
  EXPECT_EQ(ReasonOf(120, [] { ReplacePathShare("/volume1/older/x", "new", "old"); }), "Cannot find share: old");
}

TEST_F(UtilTest, TheFirstRuleThatAppliesRefusesAPath) {
  const std::map<std::string, PathRule> rules = {
      {"docs", kPathAccepted},
      {"docs/.gitignore", kPathAccepted},
      {"docs/a#snapshot", kPathAccepted},
      {"docs/#snapshot/x", kPathInSnapshot},
      {"docs/nfs/x", kPathOnFileSystem},
      {"docs/iso", kPathOnFileSystem},
      {"locked/x", kPathShareLocked},
      {"ro/x", kPathShareReadOnly},
      {"docs/#recycle/x", kPathInRecycleBin},
      {"homes/alice/#recycle", kPathInRecycleBin},
      {"docs/disk", kPathIsMountPoint},
      {"vault/x", kPathAccepted},  // a mount in an encrypted share
      {"docs/.git/x", kPathReservedName},
      {"docs/@eaDir", kPathReservedName},
      {"docs/link", kPathNotCanonical},
      {"docs/", kPathNotCanonical},
      {"docs/x/..", kPathNotCanonical},
      {"docs//disk", kPathNotCanonical},
      {"docs/gone", kPathNotCanonical},
  };
  for (const auto& [path, rule] : rules) {
    const PathVerdict verdict = JudgeFullPath(volume_ / path);
    EXPECT_EQ(verdict.rule, rule) << path << ": " << DescribeVerdict(verdict);
    EXPECT_EQ(CanFullPathBeIndexed(volume_ / path), rule == kPathAccepted) << path;
    EXPECT_EQ(RemedyOf(verdict).empty(), rule == kPathAccepted) << path;
  }
  EXPECT_EQ(JudgeFullPath("/proc/1").rule, kPathOnFileSystem);
  EXPECT_TRUE(CanPathBeIndexed("/docs") && log_.lines().empty());
  EXPECT_EQ(ReasonOf(502, [] { JudgeFullPath("/nowhere"); }), "VEXOShareNamePathGet failed, full_path=/nowhere");
  world_.Fail("VEXOGetFSType");
  EXPECT_EQ(JudgeFullPath(volume_ / "docs").rule, kPathNotFound);
}

TEST_F(UtilTest, ANameTellsTheTypeOfAFile) {
  const std::map<std::string, FileType> types = {
      {"Report.PDF", kFileTypeDocument}, {"a.tar.gz", kFileTypeDocument}, {"a.q&a", kFileTypeDocument},
      {"x.prc", kFileTypeDocument},      {"none", kFileTypeDocument},     {"dot.", kFileTypeDocument},
      {"a.b/file", kFileTypeDocument},   {".cue", kFileTypeAudio},        {"song.Mp3", kFileTypeAudio},
      {"clip.MKV", kFileTypeVideo},      {"x.dvr-ms", kFileTypeVideo},    {"IMG.CR2", kFileTypePhoto},
      {"x.xyzw", kFileTypeOther},        {"x.txa ", kFileTypeOther},      {"x.pdf\xc3\x84", kFileTypeOther}};
  for (const auto& [name, type] : types) EXPECT_EQ(GetFileTypeByFullPath("/volume1/docs/" + name), type) << name;
}

}  // namespace
}  // namespace quarrox::fileindex
