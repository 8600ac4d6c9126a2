// File systems, what is mounted where, and names that are the platform's own.
//
// Thread-safe; the answers are those of a moment.
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

// Types of file systems. Only 12 is known to callers; the others are asked through the two tests below.
enum {
  VEXO_FS_OTHER = 0,  // a local one without a number of its own
  VEXO_FS_EXT = 1,    // ext2, ext3, ext4
  VEXO_FS_BTRFS = 2,
  VEXO_FS_XFS = 3,
  VEXO_FS_TMPFS = 4,  // also ramfs
  VEXO_FS_OVERLAY = 5,
  VEXO_FS_FAT = 6,  // also exFAT
  VEXO_FS_NTFS = 7,
  VEXO_FS_PSEUDO = 12,  // made by the kernel, no files of anybody's: proc, sysfs, cgroup, devtmpfs, ...
  VEXO_FS_NFS = 20,
  VEXO_FS_SMB = 21,
  VEXO_FS_9P = 22,  // also virtiofs
  VEXO_FS_CEPH = 23,
  VEXO_FS_SSHFS = 24,
  VEXO_FS_REMOTE = 29,  // another one whose files other machines change
  VEXO_FS_ISO9660 = 30,
  VEXO_FS_UDF = 31,
  VEXO_FS_SQUASHFS = 32,
  VEXO_FS_IMAGE = 39  // another one that is written once, as an image
};

/* The type of the file system that a path lies on, as VEXO_FS_*; -1 (VEXO_ERR_SYSTEM and errno) where the path cannot
 * be looked at. Symbolic links are followed. `flags` is 0. */
int VEXOGetFSType(const char* path, int flags);

/* 1 where files of this type lie on another machine, which may change them unseen; else 0, also for what is no type. */
int VEXOFSIsRemoteFS(int type);

/* 1 where files of this type lie in an image that is never changed; else 0, also for what is no type. */
int VEXOFSIsImageFS(int type);

/* 1 where a file system is mounted at the path (a bind mount counts), 0 where none is, -1 with errno where the path
 * cannot be looked at (VEXO_ERR_SYSTEM). A share's own directory never counts, so that a share may be a mounted disk.
 * A symbolic link is not followed. */
int VEXOFSDirIsMntPoint(const char* path);

/* Whether a path is, or lies in, a snapshot: a directory of a snapshot's name directly below a share or a volume. 0
 * with *in_snapshot 1 or 0, or -1 (VEXO_ERR_BAD_PARAMETER) where the path is not absolute. The path need not exist. */
int VLIBFhsPathInSnapshot(const char* full_path, int* in_snapshot);

/* 1 where a name (one component) is one of the platform's hidden directories, which hold no files of anybody's; else
 * 0. */
int VEXOEAIsHiddenDir(const char* name);

#ifdef __cplusplus
}
#endif
