#include "linux/fs_types.h"

#include <linux/magic.h>

#include <algorithm>
#include <iterator>
#include <unordered_map>

#include "vexo/filesystem.h"

namespace platform {
namespace {

enum class Family { kLocal, kPseudo, kRemote, kImage };

// A number, and the types that it stands for, between blanks.
struct FsType {
  int number;
  Family family;
  std::string_view names;
};

// File systems on a disk that several machines write at once (gfs2, ocfs2) count as remote: what another machine does
// is told to nobody here. What a hypervisor lends (virtiofs, vboxsf) is remote for the same reason.
constexpr FsType kFsTypes[] = {
    {VEXO_FS_OTHER, Family::kLocal, ""},
    {VEXO_FS_EXT, Family::kLocal, "ext2 ext3 ext4"},
    {VEXO_FS_BTRFS, Family::kLocal, "btrfs"},
    {VEXO_FS_XFS, Family::kLocal, "xfs"},
    {VEXO_FS_TMPFS, Family::kLocal, "tmpfs ramfs rootfs"},
    {VEXO_FS_OVERLAY, Family::kLocal, "overlay aufs fuse.fuse-overlayfs"},
    {VEXO_FS_FAT, Family::kLocal, "vfat msdos exfat fuse.exfat"},
    {VEXO_FS_NTFS, Family::kLocal, "ntfs ntfs3 fuse.ntfs fuse.ntfs-3g"},
    {VEXO_FS_PSEUDO, Family::kPseudo,
     "apparmorfs autofs bdev binder binfmt_misc bpf cgroup cgroup2 configfs cpuset dax debugfs devfs devpts devtmpfs "
     "dlmfs drm efivarfs fuse.gvfs-fuse-daemon fuse.gvfsd-fuse fuse.lxcfs fuse.portal fuse.vmware-vmblock fusectl "
     "hugetlbfs mqueue nfsd nsfs pipefs proc pstore resctrl rpc_pipefs securityfs selinuxfs smackfs sockfs spufs sysfs "
     "tracefs"},
    {VEXO_FS_NFS, Family::kRemote, "nfs nfs4"},
    {VEXO_FS_SMB, Family::kRemote, "cifs smb3 smbfs fuse.smbnetfs"},
    {VEXO_FS_9P, Family::kRemote, "9p virtiofs"},
    {VEXO_FS_CEPH, Family::kRemote, "ceph fuse.ceph fuse.ceph-fuse"},
    {VEXO_FS_SSHFS, Family::kRemote, "fuse.sshfs"},
    {VEXO_FS_REMOTE, Family::kRemote,
     "afs beegfs coda davfs fuse.afpfs fuse.curlftpfs fuse.davfs2 fuse.gcsfuse fuse.glusterfs fuse.goofys fuse.juicefs "
     "fuse.moosefs fuse.rclone fuse.s3fs fuse.vmhgfs-fuse gfs2 glusterfs gpfs lustre ncpfs ocfs2 orangefs prl_fs pvfs2 "
     "vboxsf vmhgfs"},
    {VEXO_FS_ISO9660, Family::kImage, "iso9660 fuse.fuseiso"},
    {VEXO_FS_UDF, Family::kImage, "udf"},
    {VEXO_FS_SQUASHFS, Family::kImage, "squashfs fuse.snapfuse fuse.squashfuse fuse.squashfuse_ll"},
    {VEXO_FS_IMAGE, Family::kImage, "cramfs erofs romfs fuse.archivemount fuse.erofsfuse fuse.ratarmount"},
};

// Numbers that <linux/magic.h> lacks stand as they do in the kernel's sources of each file system.
constexpr struct {
  unsigned long magic;
  int number;
} kMagics[] = {
    {EXT4_SUPER_MAGIC, VEXO_FS_EXT},
    {BTRFS_SUPER_MAGIC, VEXO_FS_BTRFS},
    {XFS_SUPER_MAGIC, VEXO_FS_XFS},
    {TMPFS_MAGIC, VEXO_FS_TMPFS},
    {RAMFS_MAGIC, VEXO_FS_TMPFS},
    {OVERLAYFS_SUPER_MAGIC, VEXO_FS_OVERLAY},
    {MSDOS_SUPER_MAGIC, VEXO_FS_FAT},
    {EXFAT_SUPER_MAGIC, VEXO_FS_FAT},
    {0x5346544E, VEXO_FS_NTFS},  // ntfs
    {0x7366746E, VEXO_FS_NTFS},  // ntfs3
    {AUTOFS_SUPER_MAGIC, VEXO_FS_PSEUDO},
    {BINFMTFS_MAGIC, VEXO_FS_PSEUDO},
    {BPF_FS_MAGIC, VEXO_FS_PSEUDO},
    {CGROUP2_SUPER_MAGIC, VEXO_FS_PSEUDO},
    {CGROUP_SUPER_MAGIC, VEXO_FS_PSEUDO},
    {0x62656570, VEXO_FS_PSEUDO},  // configfs
    {DEBUGFS_MAGIC, VEXO_FS_PSEUDO},
    {DEVPTS_SUPER_MAGIC, VEXO_FS_PSEUDO},
    {EFIVARFS_MAGIC, VEXO_FS_PSEUDO},
    {0x65735543, VEXO_FS_PSEUDO},  // fusectl
    {HUGETLBFS_MAGIC, VEXO_FS_PSEUDO},
    {0x19800202, VEXO_FS_PSEUDO},  // mqueue
    {NSFS_MAGIC, VEXO_FS_PSEUDO},
    {PROC_SUPER_MAGIC, VEXO_FS_PSEUDO},
    {PSTOREFS_MAGIC, VEXO_FS_PSEUDO},
    {0x67596969, VEXO_FS_PSEUDO},  // rpc_pipefs
    {SECURITYFS_MAGIC, VEXO_FS_PSEUDO},
    {SELINUX_MAGIC, VEXO_FS_PSEUDO},
    {SYSFS_MAGIC, VEXO_FS_PSEUDO},
    {TRACEFS_MAGIC, VEXO_FS_PSEUDO},
    {NFS_SUPER_MAGIC, VEXO_FS_NFS},
    {0xFF534D42, VEXO_FS_SMB},  // cifs
    {0xFE534D42, VEXO_FS_SMB},  // smb2 and later
    {SMB_SUPER_MAGIC, VEXO_FS_SMB},
    {V9FS_MAGIC, VEXO_FS_9P},
    {0x00C36400, VEXO_FS_CEPH},
    {AFS_SUPER_MAGIC, VEXO_FS_REMOTE},
    {0x01161970, VEXO_FS_REMOTE},  // gfs2
    {0x7461636F, VEXO_FS_REMOTE},  // ocfs2
    {0x0BD00BD0, VEXO_FS_REMOTE},  // lustre
    {ISOFS_SUPER_MAGIC, VEXO_FS_ISO9660},
    {UDF_SUPER_MAGIC, VEXO_FS_UDF},
    {SQUASHFS_MAGIC, VEXO_FS_SQUASHFS},
    {CRAMFS_MAGIC, VEXO_FS_IMAGE},
    {EROFS_SUPER_MAGIC_V1, VEXO_FS_IMAGE},
    {0x7275, VEXO_FS_IMAGE},  // romfs
};

std::unordered_map<std::string_view, int> NumbersByName() {
  std::unordered_map<std::string_view, int> numbers;
  for (const FsType& type : kFsTypes) {
    for (std::string_view rest = type.names; !rest.empty();) {
      const size_t end = std::min(rest.find(' '), rest.size());
      numbers.emplace(rest.substr(0, end), type.number);
      rest.remove_prefix(std::min(end + 1, rest.size()));
    }
  }
  return numbers;
}

bool IsOfFamily(int number, Family family) {
  return std::any_of(std::begin(kFsTypes), std::end(kFsTypes),
                     [&](const FsType& type) { return type.number == number && type.family == family; });
}

}  // namespace

int FsTypeByName(std::string_view name) {
  static const auto numbers = NumbersByName();
  const auto found = numbers.find(name);
  return found != numbers.end() ? found->second : VEXO_FS_OTHER;
}

int FsTypeByMagic(unsigned long magic) {
  const auto* found =
      std::find_if(std::begin(kMagics), std::end(kMagics), [&](const auto& known) { return known.magic == magic; });
  return found != std::end(kMagics) ? found->number : VEXO_FS_OTHER;
}

}  // namespace platform

int VEXOFSIsRemoteFS(int type) {
  return platform::IsOfFamily(type, platform::Family::kRemote) ? 1 : 0;
}

int VEXOFSIsImageFS(int type) {
  return platform::IsOfFamily(type, platform::Family::kImage) ? 1 : 0;
}
