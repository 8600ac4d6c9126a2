#define QUARROX_LOG_UNIT "index_mgr"

#include <set>

#include "common/error.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/strings.h"
#include "fileindex/elastic_control.h"
#include "fileindex/folder_pauses.h"
#include "fileindex/index_mgr.h"
#include "fileindex/index_mgr_internal.h"

namespace quarrox::fileindex {
namespace {

constexpr char kHomesShare[] = "homes";

// A mount point as it stands in a folder's record: without slashes at its end, save the root's own.
std::string MarkOf(std::string mount_point) {
  while (mount_point.size() > 1 && mount_point.back() == '/') mount_point.pop_back();
  return mount_point;
}

std::string VolumeOf(const std::string& share_path) {
  const std::string volume = Dirname(share_path);
  return volume.empty() ? "/" : volume;
}

const sdk::SDKShare* FindShare(OpenShares& shares, const std::string& name) {
  try {
    return &shares.Get(name);
  } catch (const Error& error) {
    QUARROX_LOG_FAILURE("Leaving out share[%s], code=%d, reason=%s. If it is gone for good: share clear-paused",
                        name.c_str(), static_cast<int>(error.code), error.what());
    return nullptr;
  }
}

// The shares with folders whose directories lie on a volume.
std::set<std::string> SharesOn(const std::string& volume, const FolderMgr& folder_mgr, OpenShares& shares) {
  std::set<std::string> result;
  for (const std::string& name : folder_mgr.GetIndexedShares()) {
    const sdk::SDKShare* share = FindShare(shares, name);
    if (share != nullptr && VolumeOf(share->GetPath()) == volume) result.insert(name);
  }
  return result;
}

// The shares with folders that were marked when a volume was paused.
std::set<std::string> SharesMarked(const std::string& volume, const FolderMgr& folder_mgr, bool paused_only) {
  std::set<std::string> result;
  for (const auto& folder : folder_mgr.GetFolders()) {
    const bool counts = folder->IsPaused() || !paused_only;
    if (counts && folder->GetVolumeToBeClean() == volume) result.insert(folder->GetShare());
  }
  return result;
}

template <typename Change>
void ChangeFolders(const FolderMgr& folder_mgr, const std::set<std::string>& share_names, const Change& change) {
  for (const auto& folder : folder_mgr.GetFolders()) {
    if (share_names.contains(folder->GetShare())) change(*folder);
  }
}

}  // namespace

void VolumePause(const std::string& mount_point) {
  if (mount_point.empty()) QUARROX_THROW("mount_point.empty()", kErrBadParameter, "Missing mount point");
  const LockFile lock(kFolderLockPath, true);
  const std::string volume = MarkOf(mount_point);
  const FolderMgr folder_mgr;
  OpenShares shares;
  const std::set<std::string> names = SharesOn(volume, folder_mgr, shares);
  if (names.empty()) return;
  FolderPauses pauses;
  ChangeFolders(folder_mgr, names, [&](Folder& folder) {
    folder.SetVolumeToBeClean(volume);
    folder.SetPaused(true);
    pauses.Forget(folder.GetPath());
  });
  pauses.Save();
  folder_mgr.Save();
  MonitorConfigs monitors(folder_mgr, shares);
  for (const std::string& name : names) PauseShare(name, monitors);
}

void VolumeResume(const std::string& mount_point) {
  if (mount_point.empty()) QUARROX_THROW("mount_point.empty()", kErrBadParameter, "Missing mount point");
  const LockFile lock(kFolderLockPath, true);
  const FolderMgr folder_mgr;
  OpenShares shares;
  MonitorConfigs monitors(folder_mgr, shares);
  std::set<std::string> found;
  std::set<std::string> resumed;
  for (const std::string& name : SharesMarked(MarkOf(mount_point), folder_mgr, false)) {
    const sdk::SDKShare* share = FindShare(shares, name);
    if (share == nullptr) continue;
    found.insert(name);
    if (share->IsLocked()) continue;
    ResumeShare(name, monitors);
    resumed.insert(name);
  }
  if (found.empty()) return;
  ChangeFolders(folder_mgr, found, [](Folder& folder) { folder.SetVolumeToBeClean(""); });
  ChangeFolders(folder_mgr, resumed, [](Folder& folder) { folder.SetPaused(false); });
  folder_mgr.Save();
}

void VolumeClean(const std::string& mount_point) {
  if (mount_point.empty()) QUARROX_THROW("mount_point.empty()", kErrBadParameter, "Missing mount point");
  const LockFile lock(kFolderLockPath, true);
  const std::string volume = MarkOf(mount_point);
  FolderMgr folder_mgr;
  const std::set<std::string> names = SharesMarked(volume, folder_mgr, true);
  if (names.empty()) return;
  for (const std::string& name : names) {
    CleanShareIndexData(name, (volume == "/" ? "" : volume) + "/" + name);
    elastic::ShareIndexDelete(name);
    folder_mgr.DeleteByShare(name);
  }
  folder_mgr.Save();
  if (folder_mgr.GetFolders().empty()) SetupRelatedServices(false);
}

void HomeEnable(bool enable) {
  const LockFile lock(kFolderLockPath, true);
  enable ? ShareResume(kHomesShare) : SharePause(kHomesShare);
}

}  // namespace quarrox::fileindex
