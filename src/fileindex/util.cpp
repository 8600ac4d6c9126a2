#include "fileindex/util.h"

#include <algorithm>
#include <array>
#include <climits>
#include <cstdlib>
#include <string_view>

#include "common/log.h"
#include "common/sdk/share.h"
#include "common/strings.h"
#include "vexo/filesystem.h"
#include "vexo/recycle.h"
#include "vexo/share.h"

namespace quarrox::fileindex {
namespace {

using sdk::SDKMutex;
using sdk::SDKShare;

constexpr char kSnapshotMark[] = "#snapshot";
constexpr char kRecycleMark[] = "#recycle";
constexpr char kHomesShare[] = "homes";
constexpr int kUsersOfAllKinds = VEXO_USERS_LOCAL | VEXO_USERS_DOMAIN | VEXO_USERS_LDAP;

constexpr std::array<std::string_view, 11> kReservedNames = {".VEXOPPSDB",
                                                             ".TemporaryItems",
                                                             ".Spotlight-V100",
                                                             ".DocumentRevisions-V100",
                                                             ".HFS+ Private Directory Data",
                                                             ".Trashes",
                                                             ".fseventsd",
                                                             ".Maildir",
                                                             ".git",
                                                             ".DS_Store",
                                                             "Thumbs.db"};

bool IsReserved(const char* name) {
  return VEXOEAIsHiddenDir(name) == 1 ||
         std::find(kReservedNames.begin(), kReservedNames.end(), name) != kReservedNames.end();
}

bool IsInRecycleBin(const std::string& full_path, const std::string& share) {
  const LockMutex lock(SDKMutex());
  if (full_path.find(kRecycleMark) != std::string::npos && VEXOShareIsShareRecycle(full_path.c_str()) == 1) return true;
  return share == kHomesShare && VEXORecycleUserHomePathIsExist(full_path.c_str(), kUsersOfAllKinds) == 1;
}

bool IsInSnapshot(const std::string& full_path) {
  if (full_path.find(kSnapshotMark) == std::string::npos) return false;
  const LockMutex lock(SDKMutex());
  int in_snapshot = 0;
  return VLIBFhsPathInSnapshot(full_path.c_str(), &in_snapshot) == 0 && in_snapshot == 1;
}

PathVerdict JudgeFileSystem(const std::string& full_path) {
  const int type = VEXOGetFSType(full_path.c_str(), 0);
  if (type < 0) return {kPathNotFound};
  if (VEXOFSIsRemoteFS(type) != 0) return {kPathOnFileSystem, "a file system of another machine"};
  if (VEXOFSIsImageFS(type) != 0) return {kPathOnFileSystem, "an image that never changes"};
  if (type == VEXO_FS_PSEUDO) return {kPathOnFileSystem, "a file system that the kernel makes up"};
  return {};
}

// The first component that is a reserved name; empty where none is.
std::string FindReservedName(const std::string& full_path) {
  std::string name;
  for (size_t begin = 0; begin <= full_path.size();) {
    const size_t end = std::min(full_path.find('/', begin), full_path.size());
    name.assign(full_path, begin, end - begin);
    if (IsReserved(name.c_str())) return name;
    begin = end + 1;
  }
  return "";
}

PathVerdict JudgeCanonical(const std::string& full_path) {
  char resolved[PATH_MAX];
  if (realpath(full_path.c_str(), resolved) == nullptr) return {kPathNotCanonical};
  if (full_path != resolved) return {kPathNotCanonical, resolved};
  return {};
}

}  // namespace

std::string GetShareNameByPath(const std::string& share_path) {
  if (share_path.empty() || share_path.front() != '/') {
    QUARROX_THROW("1 > share_path.size() || '/' != share_path.at(0)", kErrBadParameter, share_path);
  }
  return share_path.substr(1, share_path.find('/', 1) - 1);
}

void GetShareNameByPath(std::string& share, const std::string& share_path) {
  share = GetShareNameByPath(share_path);
}

std::string GetFullPath(const std::string& share_path) {
  OpenShares shares;
  return GetFullPath(share_path, shares);
}

std::string GetFullPath(const std::string& share_path, OpenShares& shares) {
  const std::string share_dir = shares.Get(GetShareNameByPath(share_path)).GetPath();
  return share_dir.substr(0, share_dir.rfind('/')) + share_path;
}

void GetFullPath(std::string& full_path, const std::string& share_path) {
  full_path = GetFullPath(share_path);
}

void GetShareNamePathByFullPath(std::string& share, std::string& share_dir, const std::string& full_path) {
  char name[VEXO_SHARE_NAME_SIZE] = {};
  char dir[VEXO_PATH_SIZE] = {};
  {
    const LockMutex lock(SDKMutex());
    if (0 > VEXOShareNamePathGet(full_path.c_str(), name, sizeof(name), dir, sizeof(dir))) {
      QUARROX_THROW(
          "0 > VEXOShareNamePathGet(full_path.c_str(), szShareName, sizeof(szShareName), szSharePath, "
          "sizeof(szSharePath))",
          kErrSystem, "VEXOShareNamePathGet failed, full_path=" + full_path);
    }
  }
  share = name;
  share_dir = dir;
}

std::string ReplacePathShare(const std::string& path, const std::string& new_share, const std::string& old_share) {
  const size_t pos = (path + "/").find("/" + old_share + "/");
  if (pos == std::string::npos) {
    QUARROX_THROW("string::npos == pos", kErrBadParameter, "Cannot find share: " + old_share);
  }
  return path.substr(0, pos + 1) + new_share + path.substr(pos + 1 + old_share.size());
}

bool IsFullPathInRecycleBin(const std::string& full_path) {
  std::string share;
  std::string share_dir;
  GetShareNamePathByFullPath(share, share_dir, full_path);
  return IsInRecycleBin(full_path, share);
}

bool IsSystemPreservedFileName(const std::string& name) {
  return IsReserved(name.c_str());
}

PathVerdict JudgeFullPath(const std::string& full_path) {
  OpenShares shares;
  return JudgeFullPath(full_path, shares);
}

// All but what the path's text decides.
PathVerdict JudgePlace(const std::string& full_path, OpenShares& shares) {
  if (IsInSnapshot(full_path)) return {kPathInSnapshot};
  if (PathVerdict verdict = JudgeFileSystem(full_path); verdict.rule != kPathAccepted) return verdict;
  std::string name;
  std::string share_dir;
  GetShareNamePathByFullPath(name, share_dir, full_path);
  const SDKShare& share = shares.Get(name);
  if (!share.CanBeIndexed()) return {share.IsLocked() ? kPathShareLocked : kPathShareReadOnly, name};
  if (IsInRecycleBin(full_path, name)) return {kPathInRecycleBin};
  // Where an encrypted share is unlocked, its own directory is a mount point, and its files are to be indexed.
  if (VEXOFSDirIsMntPoint(full_path.c_str()) == 1 && !share.IsEncryption()) return {kPathIsMountPoint};
  return {};
}

PathVerdict JudgeFullPath(const std::string& full_path, OpenShares& shares) {
  if (PathVerdict verdict = JudgePlace(full_path, shares); verdict.rule != kPathAccepted) return verdict;
  if (const std::string reserved = FindReservedName(full_path); !reserved.empty()) return {kPathReservedName, reserved};
  return JudgeCanonical(full_path);
}

PathVerdict JudgeEntry(const std::string& full_path, OpenShares& shares) {
  if (PathVerdict verdict = JudgePlace(full_path, shares); verdict.rule != kPathAccepted) return verdict;
  const std::string name = Basename(full_path);
  return IsReserved(name.c_str()) ? PathVerdict{kPathReservedName, name} : PathVerdict{};
}

bool CanFullPathBeIndexed(const std::string& full_path) {
  return JudgeFullPath(full_path).rule == kPathAccepted;
}

bool CanPathBeIndexed(const std::string& share_path) {
  OpenShares shares;
  return CanPathBeIndexed(share_path, shares);
}

bool CanPathBeIndexed(const std::string& share_path, OpenShares& shares) {
  return JudgeFullPath(GetFullPath(share_path, shares), shares).rule == kPathAccepted;
}

}  // namespace quarrox::fileindex
