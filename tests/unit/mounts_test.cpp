#include "linux/mounts.h"

#include <string>

#include <gtest/gtest.h>

#include "linux/fs_types.h"
#include "linux/quota_room.h"
#include "support/temp_dir.h"
#include "vexo/filesystem.h"

namespace platform {
namespace {

TEST(MountTableTest, NamesSourcesAndQuotasAreReadAndABrokenLineIsLeftOut) {
  const quarrox::support::TempDir dir;
  quarrox::support::WriteText(
      dir / "mountinfo",
      "30 1 8:1 / / rw,relatime shared:1 - ext4 /dev/sda1 rw,usrquota,grpjquota=aquota.group\n"
      "31 30 0:40 / /mnt/a\\040b rw - cifs //nas/my\\040docs rw,vers=3.0\nno mount\n"
      "32 30 0:41 / /f rw,nosuid shared:9 master:2 - fuse.sshfs alice@nas:/x rw,user_id=0\n"
      "33 30 8:2 /sub /x rw - xfs /dev/sdb rw,uqnoenforce,gqnoenforce\n"
      "34 30 0:42 / /- rw - tmpfs  rw\n35 30 0:43 / /g rw - ext4 /dev/a\\04\\1344 rw,noquota\n");
  const auto table = MountTable::Read((dir / "mountinfo").c_str());
  ASSERT_TRUE(table != nullptr && table->Find(30) != nullptr && table->Find(33) != nullptr);
  EXPECT_EQ(table->Find(31)->source, "//nas/my docs");
  EXPECT_EQ(table->Find(32)->fs_type, VEXO_FS_SSHFS);
  EXPECT_TRUE(table->Find(30)->user_quota && table->Find(30)->group_quota && !table->Find(33)->user_quota);
  EXPECT_TRUE(table->Find(34) != nullptr && table->Find(34)->fs_type == VEXO_FS_TMPFS &&
              table->Find(34)->source.empty());
  EXPECT_TRUE(table->Find(35) != nullptr && table->Find(35)->source == "/dev/a\\04\\4" && !table->Find(35)->user_quota);
  EXPECT_EQ(MountTable::Read((dir / "missing").c_str()), nullptr);
}

// A letter a type: local, pseudo, remote, image.
std::string Families(std::initializer_list<const char*> names) {
  std::string families;
  for (const char* name : names) {
    const int type = FsTypeByName(name);
    families += VEXOFSIsRemoteFS(type) ? "r" : VEXOFSIsImageFS(type) ? "i" : type == VEXO_FS_PSEUDO ? "p" : "l";
  }
  return families;
}

TEST(FsTypesTest, ImagesPseudoFileSystemsAndOtherMachinesFilesAreSetApart) {
  EXPECT_EQ(Families({"ext4", "tmpfs", "overlay", "fuse", "fuse.mergerfs", "unheard-of"}), "llllll");
  EXPECT_EQ(Families({"nfs4", "cifs", "smb3", "9p", "ceph", "fuse.sshfs", "glusterfs"}), "rrrrrrr");
  EXPECT_EQ(Families({"iso9660", "udf", "squashfs", "fuse.squashfuse", "proc", "cgroup2", "autofs"}), "iiiippp");
}

TEST(QuotaRoomTest, TheHardLimitCountsAlwaysAndTheSoftOneAfterItsGrace) {
  dqblk quota = {};  // limits count in blocks of 1024 bytes
  quota.dqb_bhardlimit = 20, quota.dqb_bsoftlimit = 10, quota.dqb_curspace = 10 * 1024;
  EXPECT_TRUE(QuotaHasRoom(quota, 10 * 1024, 100) && !QuotaHasRoom(quota, 10 * 1024 + 1, 100));
  quota.dqb_curspace += 1, quota.dqb_btime = 100;
  EXPECT_TRUE(QuotaHasRoom(quota, 1, 99) && !QuotaHasRoom(quota, 1, 100));
}

}  // namespace
}  // namespace platform
