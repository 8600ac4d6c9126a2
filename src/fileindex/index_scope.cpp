#include "fileindex/index_scope.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "common/error.h"
#include "common/file.h"
#include "common/json.h"
#include "common/log.h"
#include "common/sdk/share.h"
#include "common/strings.h"
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
  FolderKinds kinds;
  for (const auto& folder : folders->GetFolders()) {
    const std::string path = folder->GetFullPath();
    if (IsAtOrBelow(path, share.GetPath())) {
      kinds.Add(path.substr(share.GetPath().size()), Kinds::Of(folder->GetIndexCfg()));
    }
  }
  directory_ = share.GetPath();
  kinds_ = std::move(kinds);
  kinds_file_ = Dirname(share.GetDBPath()) + "/kinds";
  device_ = info.st_dev;
  inode_ = info.st_ino;
  folders_ = std::move(folders);
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

std::vector<std::string> IndexScope::Starts(const std::string& path) const {
  if (Covers(path)) return {path};
  std::vector<std::string> folders;
  for (const auto& folder : folders_->GetFolders()) {
    if (IsAtOrBelow(folder->GetFullPath(), path)) folders.push_back(folder->GetFullPath());
  }
  std::sort(folders.begin(), folders.end());  // a folder in another one comes behind it
  PathSet starts;
  for (const std::string& folder : folders) {
    if (!HoldsAtOrAbove(starts, folder)) starts.insert(folder);
  }
  return {starts.begin(), starts.end()};
}

}  // namespace quarrox::fileindex
