#include "indexed_shares.h"

#include "common/error.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/folder_pauses.h"

namespace quarrox::fileindexd {
namespace {

bool IsSameTime(const timespec& a, const timespec& b) {
  return a.tv_sec == b.tv_sec && a.tv_nsec == b.tv_nsec;
}

bool IsSameFile(const struct stat& a, const struct stat& b) {
  return a.st_dev == b.st_dev && a.st_ino == b.st_ino && a.st_size == b.st_size && IsSameTime(a.st_mtim, b.st_mtim) &&
         IsSameTime(a.st_ctim, b.st_ctim);
}

}  // namespace

bool IndexedShares::Refresh() {
  // A list that is not there is an empty one, and bears no time.
  struct stat now = {};
  if (stat(fileindex::kFileIndexFoldersCfgPath, &now) != 0) now = {};
  if (seen_ && IsSameFile(*seen_, now)) return false;
  const fileindex::FolderPauses pauses;
  std::map<std::string, Share> shares;
  for (const auto& folder : fileindex::FolderMgr().GetFolders()) {
    try {
      Share& share = shares[folder->GetShare()];
      share.is_served = share.is_served || pauses.IsServed(*folder);
      share.paused += folder->IsPaused() ? 1 : 0;
    } catch (const Error&) {
      // Its path is none. It was logged, and keeps no other folder from being served.
    }
  }
  shares_.swap(shares);
  seen_ = now;
  return true;
}

}  // namespace quarrox::fileindexd
