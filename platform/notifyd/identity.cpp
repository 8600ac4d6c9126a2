#include "identity.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <utility>

#include "paths.h"

namespace quarrox::notifyd {
namespace {

// Numbers of mounts that are never used again; kernels before 6.8 do not have them and give the other ones.
constexpr unsigned kUniqueMountId = 0x4000;

constexpr unsigned kWanted = STATX_TYPE | STATX_INO | STATX_BTIME | STATX_MNT_ID | kUniqueMountId;

}  // namespace

bool Identify(const std::string& path, Identity& identity) {
  struct statx st;
  const int flags = AT_NO_AUTOMOUNT | AT_STATX_DONT_SYNC;
  if (statx(AT_FDCWD, path.c_str(), flags, kWanted, &st) != 0) {
    return false;
  }
  if (!S_ISDIR(st.stx_mode)) return errno = ENOTDIR, false;
  const uint64_t device = (uint64_t{st.stx_dev_major} << 32) | st.stx_dev_minor;
  const bool has_birth = (st.stx_mask & STATX_BTIME) != 0;
  const int64_t born = has_birth ? st.stx_btime.tv_sec * 1'000'000'000 + st.stx_btime.tv_nsec : 0;
  identity = {st.stx_mnt_id, device, st.stx_ino, born};
  return true;
}

std::string MountPoint(const std::string& path) {
  std::string top = path;
  Identity mine;
  if (!Identify(top, mine)) return path;
  while (top != "/") {
    std::string above = DirectoryAbove(top);
    Identity other;
    if (!Identify(above, other) || other.mount != mine.mount) break;
    top = std::move(above);
  }
  return top;
}

}  // namespace quarrox::notifyd
