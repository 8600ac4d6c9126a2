#include "vexo/filesystem.h"

#include <fcntl.h>
#include <sys/stat.h>

// The kernel marks the root of a mount since 5.8, bind mounts included; Debian 12 has 6.1.
int VEXOFSDirIsMntPoint(const char* path) {
  struct statx info;
  if (statx(AT_FDCWD, path, AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT, STATX_TYPE, &info) != 0) return -1;
  return (info.stx_attributes_mask & STATX_ATTR_MOUNT_ROOT) != 0 && (info.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0;
}
