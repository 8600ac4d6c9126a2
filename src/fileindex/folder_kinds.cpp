#include "fileindex/folder_kinds.h"

#include <cerrno>

#include "common/file.h"
#include "common/json.h"
#include "common/log.h"
#include "fileindex/util.h"

namespace quarrox::fileindex {

Kinds Kinds::Of(const Json::Value& data) {
  Kinds kinds;
  if (!data.isObject()) return kinds;
  GetJsonValue(kinds.document, data, "document", false);
  GetJsonValue(kinds.audio, data, "audio", false);
  GetJsonValue(kinds.video, data, "video", false);
  GetJsonValue(kinds.photo, data, "photo", false);
  return kinds;
}

bool Kinds::Has(const std::string& path) const {
  switch (GetFileTypeByFullPath(path)) {
    case kFileTypeDocument:
      return document;
    case kFileTypeAudio:
      return audio;
    case kFileTypeVideo:
      return video;
    case kFileTypePhoto:
      return photo;
    case kFileTypeOther:
      break;
  }
  return Any();
}

bool HoldsAtOrAbove(const PathSet& directories, const std::string& path) {
  if (directories.empty()) return false;
  for (size_t end = path.size(); end != 0 && end != std::string::npos; end = path.rfind('/', end - 1)) {
    if (directories.count(path.substr(0, end)) != 0) return true;
  }
  return false;
}

Json::Value Kinds::AsJson() const {
  Json::Value data(Json::objectValue);
  data["document"] = document;
  data["audio"] = audio;
  data["video"] = video;
  data["photo"] = photo;
  return data;
}

std::optional<Kinds> FolderKinds::At(const std::string& path) const {
  for (size_t end = path.size();; end = path.rfind('/', end - 1)) {
    const auto found = folders_.find(path.substr(0, end));
    if (found != folders_.end()) return found->second;
    if (end == 0) return std::nullopt;
  }
}

std::vector<std::pair<std::string, Kinds>> FolderKinds::DifferencesFrom(const FolderKinds& other) const {
  std::map<std::string, Kinds> places = folders_;
  places.insert(other.folders_.begin(), other.folders_.end());
  std::vector<std::pair<std::string, Kinds>> differences;
  for (const auto& place : places) {
    const std::optional<Kinds> now = At(place.first);
    const std::optional<Kinds> before = other.At(place.first);
    if (now != before) differences.emplace_back(place.first, now.value_or(Kinds()) ^ before.value_or(Kinds()));
  }
  return differences;
}

std::optional<FolderKinds> FolderKinds::Load(const std::string& file) {
  if (!IsFileExist(file)) return std::nullopt;
  Json::Value data;
  if (!fromFile(data, file) || !data.isObject()) {
    QUARROX_LOG_FAILURE("%s cannot be read; a change of folders that nobody told of would be missed", file.c_str());
    return std::nullopt;
  }
  FolderKinds kinds;
  for (auto folder = data.begin(); folder != data.end(); ++folder) kinds.Add(folder.name(), Kinds::Of(*folder));
  return kinds;
}

void FolderKinds::Save(const std::string& file) const {
  Json::Value data(Json::objectValue);
  for (const auto& [path, kinds] : folders_) data[path] = kinds.AsJson();
  if (!toFile(data, file)) QUARROX_LOG_FAILURE("%s cannot be written", file.c_str());
}

}  // namespace quarrox::fileindex
