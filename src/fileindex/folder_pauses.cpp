#include "fileindex/folder_pauses.h"

#include <unordered_set>
#include <utility>

#include "common/file.h"
#include "common/json.h"
#include "common/log.h"
#include "fileindex/util.h"

namespace quarrox::fileindex {

FolderPauses::FolderPauses() {
  if (!IsFileExist(kFolderPausesPath)) return;
  Json::Value data;
  if (!fromFile(data, kFolderPausesPath) || !data.isObject()) {
    QUARROX_LOG_FAILURE("%s cannot be read; folders that are paused stay so until they are resumed", kFolderPausesPath);
    return;
  }
  for (auto end = data.begin(); end != data.end(); ++end) {
    if (end->isInt64() && end.name().starts_with('/')) ends_.emplace(end.name(), end->asInt64());
  }
  read_ = ends_;
}

std::optional<int64_t> FolderPauses::EndOf(const Folder& folder) const {
  const auto found = ends_.find(folder.GetPath());
  if (!folder.IsPaused() || found == ends_.end()) return std::nullopt;
  return found->second;
}

bool FolderPauses::IsPausedAt(const Folder& folder, int64_t now) const {
  const int64_t end = EndOf(folder).value_or(0);
  return folder.IsPaused() && (end == 0 || end > now);
}

void FolderPauses::RenameShare(const std::string& share_from, const std::string& share_to) {
  Ends renamed;
  for (const auto& [path, end] : ends_) {
    const bool moves = GetShareNameByPath(path) == share_from;
    renamed.emplace(moves ? ReplacePathShare(path, share_to, share_from) : path, end);
  }
  ends_ = std::move(renamed);
}

void FolderPauses::KeepOnly(const std::vector<std::shared_ptr<Folder>>& folders) {
  if (ends_.empty()) return;
  std::unordered_set<std::string> paused;
  for (const auto& folder : folders) {
    if (folder->IsPaused()) paused.insert(folder->GetPath());
  }
  std::erase_if(ends_, [&](const auto& end) { return paused.count(end.first) == 0; });
}

void FolderPauses::Save() const {
  if (ends_ == read_) return;
  Json::Value data(Json::objectValue);
  for (const auto& [path, end] : ends_) data[path] = Json::Int64{end};
  MakeDirectoriesOf(kFolderPausesPath);
  if (!toFile(data, kFolderPausesPath))
    QUARROX_THROW("!toFile(data, kFolderPausesPath)", kErrJsonSave, kFolderPausesPath);
}

}  // namespace quarrox::fileindex
