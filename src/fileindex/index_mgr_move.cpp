#define QUARROX_LOG_UNIT "index_mgr"
#include "fileindex/index_mgr_move.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <set>

#include "common/error.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/sdk/share.h"
#include "common/strings.h"
#include "fileindex/folder_pauses.h"
#include "fileindex/index_mgr.h"
#include "fileindex/index_mgr_internal.h"
#include "fileindex/optree.h"
#include "fileindex/queue_mgr_search.h"

namespace quarrox::fileindex {
namespace {

// A share that is gone stands nowhere.
bool IsIndexedShareAt(const std::string& path, const FolderMgr& folder_mgr) {
  const std::set<std::string> names = folder_mgr.GetIndexedShares();
  return std::any_of(names.begin(), names.end(), [&](const std::string& name) {
    try {
      return sdk::SDKShare(name).GetPath() == path;
    } catch (const Error& error) {
      if (error.code != kErrNoSuchShare) throw;
      return false;
    }
  });
}

bool IsWatched(const std::string& share_name, const FolderMgr& folder_mgr) {
  const FolderPauses pauses;
  const auto& folders = folder_mgr.GetFolders();
  return std::any_of(folders.begin(), folders.end(),
                     [&](const auto& folder) { return folder->GetShare() == share_name && pauses.IsServed(*folder); });
}

// Adds from where the queues of a place say that the directory came there.
void AddPlacesBefore(const std::string& place, std::vector<std::string>& places) {
  const std::string queue = QueuePathOf(place);
  for (const std::string& file : {queue + ".tmp", queue}) {
    QueueSearch(file).Find([&](const EventView& event) {
      const bool is_move = event.event == kEventRename && event.path == place;
      if (is_move && std::find(places.begin(), places.end(), event.path_old) == places.end()) {
        places.emplace_back(event.path_old);
      }
      return false;
    });
  }
}

}  // namespace

std::vector<std::string> FindFormerPlaces(const std::string& share_name) {
  const FolderMgr folder_mgr;
  std::vector<std::string> places = {sdk::SDKShare(share_name).GetPath()};
  for (size_t i = 0; i < places.size(); ++i) {
    const std::string place = places[i];
    if (i == 0 || !IsIndexedShareAt(place, folder_mgr)) AddPlacesBefore(place, places);
  }
  places.erase(places.begin());
  return places;
}

void FollowMovedShare(const std::string& share_name, const std::string& path_old) {
  const LockFile lock(kFolderLockPath, true);
  FolderMgr folder_mgr;
  if (IsWatched(share_name, folder_mgr)) UpsertVEXONotifydCfg(share_name, folder_mgr);
  if (IsIndexedShareAt(path_old, folder_mgr)) return;
  const std::string from = Dirname(DBPathOf(path_old));
  const std::string to = Dirname(sdk::SDKShare(share_name).GetDBPath());
  for (const char* name : kMovableWorkerFiles) {
    if (rename((from + name).c_str(), (to + name).c_str()) != 0 && errno != ENOENT) {
      QUARROX_LOG_FAILURE("%s%s was not moved; the share's index lacks what it says", from.c_str(), name);
    }
  }
  errno = 0;
}

void CleanFormerPlace(const std::string& path_old) {
  const LockFile lock(kFolderLockPath, true);
  if (IsIndexedShareAt(path_old, FolderMgr())) return;
  DeleteMonitor(QueuePathOf(path_old), Basename(path_old));
  RemoveShareFiles(path_old);
}

}  // namespace quarrox::fileindex
