// Pausing of single folders.
#define QUARROX_LOG_UNIT "index_mgr"

#include <algorithm>
#include <cerrno>
#include <ctime>

#include "common/error.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "fileindex/folder_pauses.h"
#include "fileindex/index_mgr.h"
#include "fileindex/index_mgr_internal.h"
#include "fileindex/optree.h"
#include "fileindex/util.h"

namespace quarrox::fileindex {
namespace {

// The record of a folder whose share is not paused.
std::shared_ptr<Folder> FindServed(const char* operation, const std::string& path, const FolderMgr& folder_mgr,
                                   const FolderPauses& pauses) {
  std::shared_ptr<Folder> found;
  folder_mgr.Get(found, path);
  const std::string share = found->GetShare();
  const auto folders = folder_mgr.GetFolders();
  const bool is_served = std::any_of(folders.begin(), folders.end(), [&](const auto& folder) {
    return folder->GetShare() == share && pauses.IsServed(*folder);
  });
  if (!is_served) {
    QUARROX_THROW_IN(operation, "!is_served", kErrBadParameter,
                     "The share " + share + " is paused; resume it first: fileindexctl share resume " + share);
  }
  return found;
}

// The end of a pause is known to the share's worker from the list; this makes sure that it compares the folder.
void QueueReindex(const std::vector<std::shared_ptr<Folder>>& folders) {
  OpenShares shares;
  CustomEvents events(shares);
  for (const auto& folder : folders) {
    events.Add(kEventReindex, GetFullPath(folder->GetPath(), shares), "", Json::Value());
  }
}

// Marks folders of a share whose pause is over; returns them.
std::vector<std::shared_ptr<Folder>> Resumed(const std::string& share, const FolderMgr& folder_mgr) {
  const FolderPauses pauses;
  std::vector<std::shared_ptr<Folder>> resumed;
  for (const auto& folder : folder_mgr.GetFolders()) {
    if (!folder->IsPaused() || pauses.IsPausedAt(*folder, time(nullptr)) || folder->GetShare() != share) continue;
    folder->SetPaused(false);
    resumed.push_back(folder);
  }
  return resumed;
}

}  // namespace

void FolderPause(const std::string& path, int64_t resume_time) {
  const LockFile lock(kFolderLockPath, true);
  if (resume_time < 0) QUARROX_THROW("resume_time < 0", kErrBadParameter, "Pause length should NOT be negative");
  const FolderMgr folder_mgr;
  FolderPauses pauses;
  const auto folder = FindServed(__func__, path, folder_mgr, pauses);
  folder->SetPaused(true);
  pauses.Set(path, resume_time);
  pauses.Save();
  folder_mgr.Save();
  notify_setting_changed(folder->GetShare(), true);
}

void FolderResume(const std::string& path) {
  const LockFile lock(kFolderLockPath, true);
  const FolderMgr folder_mgr;
  const auto folder = FindServed(__func__, path, folder_mgr, FolderPauses());
  if (!folder->IsPaused()) return;
  folder->SetPaused(false);
  folder_mgr.Save();
  notify_setting_changed(folder->GetShare(), true);
  QueueReindex({folder});
}

void EndFolderPauses(const std::string& share_name) {
  if (FolderPauses().empty() || Resumed(share_name, FolderMgr()).empty()) return;
  try {
    const LockFile lock(kFolderLockPath, true);
    const FolderMgr folder_mgr;
    const auto resumed = Resumed(share_name, folder_mgr);
    if (resumed.empty()) return;
    folder_mgr.Save();
    QueueReindex(resumed);
  } catch (const Error& error) {
    errno = 0;
    QUARROX_LOG_FAILURE("The list still says that folders of share[%s] are paused, code=%d, reason=%s",
                        share_name.c_str(), error.code, error.reason.c_str());
  }
}

}  // namespace quarrox::fileindex
