#include "vexo/filesystem.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/vfs.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <string>
#include <string_view>

#include "linux/failure.h"
#include "linux/fs_types.h"
#include "linux/mounts.h"
#include "linux/share_list.h"

namespace {

// An absolute path without doubled and trailing slashes.
std::string Collapse(std::string_view path) {
  std::string collapsed;
  for (const char c : path) {
    if (c != '/' || collapsed.empty() || collapsed.back() != '/') collapsed += c;
  }
  if (collapsed.size() > 1 && collapsed.back() == '/') collapsed.pop_back();
  return collapsed;
}

bool IsSnapshotName(std::string_view name) {
  return name == "#snapshot" || name == ".snapshots";
}

bool HoldsSnapshots(const platform::ShareList& shares, std::string_view directory) {
  return shares.IsShareDirectory(directory) || shares.IsVolume(directory);
}

// The path is collapsed. Only directories that hold something of a snapshot's name are looked up.
bool IsInSnapshot(const platform::ShareList& shares, std::string_view path) {
  for (size_t slash = 0; slash < path.size();) {
    const size_t end = std::min(path.find('/', slash + 1), path.size());
    const std::string_view parent = path.substr(0, std::max<size_t>(slash, 1));
    if (IsSnapshotName(path.substr(slash + 1, end - slash - 1)) && HoldsSnapshots(shares, parent)) return true;
    slash = end;
  }
  return false;
}

}  // namespace

int VEXOGetFSType(const char* path, int /*flags*/) {
  std::shared_ptr<const platform::Mount> mount;
  if (platform::FindMount(path, &mount) != 0) return VEXO_FAILURE(VEXO_ERR_SYSTEM);
  if (mount != nullptr) return mount->fs_type;
  struct statfs info;
  if (statfs(path, &info) != 0) return VEXO_FAILURE(VEXO_ERR_SYSTEM);
  return platform::FsTypeByMagic(static_cast<unsigned long>(info.f_type));
}

// The kernel marks the root of a mount since 5.8, bind mounts included; Debian 12 has 6.1.
int VEXOFSDirIsMntPoint(const char* path) {
  struct statx info;
  const int flags = AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT | AT_STATX_DONT_SYNC;
  if (statx(AT_FDCWD, path, flags, STATX_TYPE, &info) != 0) return VEXO_FAILURE(VEXO_ERR_SYSTEM);
  if ((info.stx_attributes & info.stx_attributes_mask & STATX_ATTR_MOUNT_ROOT) == 0) return 0;
  const auto shares = platform::Shares();
  if (shares == nullptr) return -1;
  return shares->IsShareDirectory(Collapse(path)) ? 0 : 1;
}

int VLIBFhsPathInSnapshot(const char* full_path, int* in_snapshot) {
  if (full_path[0] != '/') return VEXO_FAILURE(VEXO_ERR_BAD_PARAMETER);
  const auto shares = platform::Shares();
  if (shares == nullptr) return -1;
  *in_snapshot = IsInSnapshot(*shares, Collapse(full_path)) ? 1 : 0;
  return 0;
}

int VEXOEAIsHiddenDir(const char* name) {
  const std::string_view text = name;
  return text == "@eaDir" || text == "@fileindex" ? 1 : 0;
}
