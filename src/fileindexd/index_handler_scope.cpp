#include "index_handler_scope.h"

#include <sys/stat.h>

#include <algorithm>

#include "common/error.h"
#include "common/sdk/share.h"
#include "common/strings.h"
#include "fileindex/util.h"
#include "wait.h"

namespace quarrox::fileindexd {

using fileindex::FolderMgr;

void IndexScope::Read() {
  const sdk::SDKShare share(share_);
  if (share.IsLocked())
    throw Error(kErrPathNotIndexable, "The share " + share_ + " is encrypted and locked; unlock it");
  struct stat info;
  if (stat(share.GetPath().c_str(), &info) != 0) FailCall("stat " + share.GetPath());

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

void IndexScope::CheckDirectory() const {
  struct stat info;
  if (stat(directory_.c_str(), &info) != 0) FailCall("stat " + directory_);
  if (info.st_dev == device_ && info.st_ino == inode_) return;
  throw Error(kErrSystem, "The directory of the share " + share_ + " was replaced meanwhile, path=" + directory_);
}

bool IndexScope::Accepts(const std::string& path) const {
  return Covers(path) && fileindex::CanFullPathBeIndexed(path);
}

bool IndexScope::AcceptsEntry(const std::string& name, mode_t mode) {
  return !S_ISLNK(mode) && !fileindex::IsSystemPreservedFileName(name);
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

}  // namespace quarrox::fileindexd
