#include "fileindex/index_scope.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <ctime>

#include "common/error.h"
#include "common/file.h"
#include "common/json.h"
#include "common/log.h"
#include "common/sdk/share.h"
#include "common/strings.h"
#include "fileindex/folder_pauses.h"
#include "fileindex/queue_mgr_search.h"
#include "fileindex/util.h"

namespace quarrox::fileindex {
namespace {

struct stat LookAtDirectory(const std::string& path) {
  struct stat info;
  if (stat(path.c_str(), &info) == 0) return info;
  const int error = errno;
  throw Error(kErrSystem, "stat " + path + " failed, reason=" + strerror(error));
}

}  // namespace

Entry LookAt(const std::string& path) {
  Entry entry;
  if (lstat(path.c_str(), &entry.info) == 0) {
    entry.presence = Entry::kThere;
  } else if (errno != ENOENT && errno != ENOTDIR) {
    entry.presence = Entry::kUnknown;
    entry.error = errno;
    QUARROX_LOG_FAILURE("%.8192s cannot be looked at; what the index has of it stays", path.c_str());
  }
  errno = 0;
  return entry;
}

void IndexScope::Read() {
  const sdk::SDKShare share(share_);
  if (share.IsLocked())
    throw Error(kErrPathNotIndexable, "The share " + share_ + " is encrypted and locked; unlock it");
  const struct stat info = LookAtDirectory(share.GetPath());

  has_own_disk_ = info.st_dev != LookAtDirectory(share.GetPath() + "/..").st_dev;
  disk_note_ = Dirname(share.GetDBPath()) + "/own_disk";
  if (!has_own_disk_ && IsFileExist(disk_note_)) {
    throw Error(kErrSystem, "The disk of the share " + share_ + " is not mounted at " + share.GetPath() +
                                "; mount it, or delete " + disk_note_ + " if its files lie on the volume now");
  }

  auto folders = std::make_unique<FolderMgr>();
  // Other shares may be gone, and are not our concern.
  for (const std::string& other : folders->GetIndexedShares()) {
    if (other != share_) folders->DeleteByShare(other);
  }
  directory_ = share.GetPath();
  folders_ = std::move(folders);
  TakeFolders();
  kinds_file_ = Dirname(share.GetDBPath()) + "/kinds";
  device_ = info.st_dev;
  inode_ = info.st_ino;
}

// Of several folders at one place the first counts.
void IndexScope::TakeFolders() {
  const FolderPauses pauses;
  const int64_t now = time(nullptr);
  kinds_ = {};
  paused_.clear();
  next_resume_.reset();
  for (const auto& folder : folders_->GetFolders()) {
    const std::string path = folder->GetFullPath();
    if (!IsAtOrBelow(path, directory_) || folders_->GetMostSuitableCfg(path) != folder) continue;
    const bool is_paused = pauses.IsPausedAt(*folder, now);
    kinds_.Add(path.substr(directory_.size()), Kinds::Of(folder->GetIndexCfg()), is_paused);
    if (!is_paused) continue;
    paused_.insert(path);
    const int64_t end = pauses.EndOf(*folder).value_or(0);
    if (end != 0) next_resume_ = std::min(end, next_resume_.value_or(end));
  }
}

void IndexScope::NoteDisk() const {
  if (has_own_disk_ == IsFileExist(disk_note_)) return;
  const bool is_done =
      has_own_disk_ ? toFile(Json::Value(Json::objectValue), disk_note_) : unlink(disk_note_.c_str()) == 0;
  if (!is_done) QUARROX_LOG_FAILURE("%s cannot be written or deleted", disk_note_.c_str());
}

void IndexScope::CheckDirectory() const {
  const struct stat info = LookAtDirectory(directory_);
  if (info.st_dev == device_ && info.st_ino == inode_) return;
  throw Error(kErrSystem, "The directory of the share " + share_ + " was replaced meanwhile, path=" + directory_);
}

Kinds IndexScope::KindsAt(const std::string& path) const {
  if (!IsAtOrBelow(path, directory_)) return {};
  return kinds_.At(path.substr(directory_.size())).value_or(Kinds());
}

bool IndexScope::Accepts(const std::string& path) const {
  return Covers(path) && CanFullPathBeIndexed(path);
}

bool IndexScope::AcceptsDirectoryIn(const std::string& path) const {
  OpenShares shares;
  return Covers(path) && JudgeEntry(path, shares).rule == kPathAccepted;
}

bool IndexScope::AcceptsEntry(const std::string& name, mode_t mode) {
  return !S_ISLNK(mode) && !IsSystemPreservedFileName(name);
}

bool IndexScope::IsPaused(const std::string& path) const {
  if (paused_.empty()) return false;
  const auto folder = FolderOf(path);
  return folder != nullptr && paused_.contains(folder->GetFullPath());
}

bool IndexScope::HasPaused(const std::string& path) const {
  if (IsPaused(path)) return true;
  const auto below = paused_.upper_bound(path + '/');
  return below != paused_.end() && below->starts_with(path + '/');
}

std::vector<std::string> IndexScope::Starts(const std::string& path, Paused paused) const {
  const auto is_met = [&](const std::string& place) {
    return Covers(place) && (paused == Paused::kToo || !IsPaused(place));
  };
  PathSet starts;
  if (is_met(path)) starts.insert(path);
  for (const auto& folder : folders_->GetFolders()) {
    const std::string place = folder->GetFullPath();
    if (place == path || !IsAtOrBelow(place, path)) continue;
    if (is_met(place) && !is_met(Dirname(place))) starts.insert(place);
  }
  return {starts.begin(), starts.end()};
}

}  // namespace quarrox::fileindex
