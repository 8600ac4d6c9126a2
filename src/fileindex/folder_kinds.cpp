#include "fileindex/folder_kinds.h"

#include <cerrno>

#include "common/file.h"
#include "common/json.h"
#include "common/log.h"
#include "fileindex/util.h"

namespace quarrox::fileindex {
namespace {

constexpr char kUnseenSince[] = "unseen_since";

}  // namespace

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

const FolderKinds::Entry* FolderKinds::Find(const std::string& path) const {
  for (size_t end = path.size();; end = path.rfind('/', end - 1)) {
    const auto found = folders_.find(path.substr(0, end));
    if (found != folders_.end()) return &found->second;
    if (end == 0) return nullptr;
  }
}

std::optional<Kinds> FolderKinds::At(const std::string& path) const {
  const Entry* entry = Find(path);
  return entry == nullptr ? std::nullopt : std::optional<Kinds>(entry->kinds);
}

FolderKinds::Folders FolderKinds::PlacesOf(const FolderKinds& a, const FolderKinds& b) {
  Folders places = a.folders_;
  places.insert(b.folders_.begin(), b.folders_.end());
  return places;
}

FolderKinds FolderKinds::After(const FolderKinds& before, int64_t since) const {
  FolderKinds after = *this;
  for (const auto& place : PlacesOf(*this, before)) {
    const Entry* now = Find(place.first);
    if (now == nullptr || !now->unseen_since) continue;
    const Entry* then = before.Find(place.first);
    Entry entry = then == nullptr ? *now : *then;
    if (then == nullptr || !then->unseen_since) entry.unseen_since = since;
    after.folders_.insert_or_assign(place.first, entry);
  }
  return after;
}

std::vector<FolderKinds::Difference> FolderKinds::DifferencesFrom(const FolderKinds& other) const {
  static const Entry none = {};
  std::vector<Difference> differences;
  for (const auto& place : PlacesOf(*this, other)) {
    const Entry* now = Find(place.first);
    const Entry* before = other.Find(place.first);
    const bool is_same = now == nullptr || before == nullptr ? now == before : *now == *before;
    if (is_same || (now != nullptr && now->unseen_since)) continue;
    const Entry& was = before == nullptr ? none : *before;
    differences.push_back({place.first, (now == nullptr ? none : *now).kinds ^ was.kinds, was.unseen_since});
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
  for (auto folder = data.begin(); folder != data.end(); ++folder) {
    Entry& entry = kinds.folders_[folder.name()];
    entry.kinds = Kinds::Of(*folder);
    const Json::Value since = folder->isObject() ? folder->get(kUnseenSince, Json::Value()) : Json::Value();
    if (since.isInt64()) entry.unseen_since = since.asInt64();
  }
  return kinds;
}

void FolderKinds::Save(const std::string& file) const {
  Json::Value data(Json::objectValue);
  for (const auto& [path, entry] : folders_) {
    data[path] = entry.kinds.AsJson();
    if (entry.unseen_since) data[path][kUnseenSince] = Json::Int64{*entry.unseen_since};
  }
  if (!toFile(data, file)) QUARROX_LOG_FAILURE("%s cannot be written", file.c_str());
}

}  // namespace quarrox::fileindex
