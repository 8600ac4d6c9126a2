#include "fileindex/folder_mgr_table.h"

#include <utility>
#include <vector>

namespace quarrox::fileindex {

FolderIndex::Key::Key(const std::string& key) : text(key) {
  Hash mixed;
  for (const char c : key) mixed.Mix(c);
  hash = mixed.value;
}

void FolderIndex::Remove(const std::string& key, FolderPosition position) {
  const auto found = positions_.find(Key(key));
  if (found == positions_.end()) return;
  found->second.erase(position);
  if (found->second.empty()) positions_.erase(found);
}

const FolderIndex::Positions* FolderIndex::Find(const std::string& key) const {
  const auto found = positions_.find(Key(key));
  return found == positions_.end() ? nullptr : &found->second;
}

const FolderIndex::Positions* FolderIndex::FindCovering(const std::string& path) const {
  const Positions* deepest = nullptr;
  Hash hash;
  for (size_t end = 0; end <= path.size(); ++end) {
    if (end == path.size() || path[end] == '/') {
      const auto found = positions_.find(View{std::string_view(path).substr(0, end), hash.value});
      if (found != positions_.end()) deepest = &found->second;
    }
    if (end < path.size()) hash.Mix(path[end]);
  }
  return deepest;
}

template <typename KeyOf>
FolderIndex& FolderTable::Require(std::optional<FolderIndex>& index, const KeyOf& key_of) {
  if (!index) {
    FolderIndex made;
    for (const auto& [position, folder] : records_) made.Add(key_of(*folder), position);
    index = std::move(made);
  }
  return *index;
}

FolderIndex& FolderTable::Paths() {
  ForgetChangedKeys();
  return Require(paths_, [](const Folder& folder) { return folder.GetPath(); });
}

FolderIndex& FolderTable::Shares() {
  ForgetChangedKeys();
  return Require(shares_, [](const Folder& folder) { return folder.GetShare(); });
}

FolderIndex& FolderTable::FullPaths() {
  return Require(full_paths_, [this](const Folder& folder) { return FullPathOf(folder); });
}

// A full path is kept for good once it is known, a path and a share are not.
void FolderTable::ForgetChangedKeys() {
  const uint64_t changes = Folder::ShareChanges();
  if (changes == share_changes_) return;
  paths_.reset();
  shares_.reset();
  share_changes_ = changes;
}

void FolderTable::Append(const std::shared_ptr<Folder>& folder) {
  ForgetChangedKeys();
  // What may throw comes before the change.
  const std::string share = shares_ ? folder->GetShare() : "";
  const std::string full_path = full_paths_ ? FullPathOf(*folder) : "";
  records_.emplace_hint(records_.end(), next_, folder);
  if (paths_) paths_->Add(folder->GetPath(), next_);
  if (shares_) shares_->Add(share, next_);
  if (full_paths_) full_paths_->Add(full_path, next_);
  ++next_;
}

void FolderTable::Remove(FolderPosition position) {
  const auto found = records_.find(position);
  const Folder& folder = *found->second;
  if (paths_) paths_->Remove(folder.GetPath(), position);
  if (shares_) shares_->Remove(folder.GetShare(), position);
  if (full_paths_) full_paths_->Remove(FullPathOf(folder), position);
  records_.erase(found);
}

void FolderTable::RemoveFirst(const std::string& path) {
  const FolderIndex::Positions* positions = Paths().Find(path);
  if (positions != nullptr) Remove(*positions->begin());
}

void FolderTable::RemoveShare(const std::string& share) {
  const FolderIndex::Positions* found = Shares().Find(share);
  if (found == nullptr) return;
  const std::vector<FolderPosition> positions(found->begin(), found->end());
  for (const FolderPosition position : positions) Remove(position);
}

std::shared_ptr<Folder> FolderTable::First(const FolderIndex::Positions* positions) const {
  return positions == nullptr ? nullptr : records_.at(*positions->begin());
}

std::shared_ptr<Folder> FolderTable::FindByPath(const std::string& path) {
  return First(Paths().Find(path));
}

std::shared_ptr<Folder> FolderTable::FindByFullPath(const std::string& full_path) {
  return First(FullPaths().Find(full_path));
}

std::shared_ptr<Folder> FolderTable::FindCovering(const std::string& full_path) {
  return First(FullPaths().FindCovering(full_path));
}

bool FolderTable::HasShare(const std::string& share) {
  return Shares().Find(share) != nullptr;
}

}  // namespace quarrox::fileindex
