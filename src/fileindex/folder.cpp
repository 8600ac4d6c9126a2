#include "fileindex/folder.h"

#include <atomic>

#include "common/json.h"
#include "common/log.h"
#include "fileindex/util.h"

namespace quarrox::fileindex {
namespace {

std::atomic<uint64_t> share_changes = 0;

}  // namespace

std::string ShareVolumes::GetFullPath(const std::string& share_path) {
  const std::string share = GetShareNameByPath(share_path);
  const auto known = volumes_.find(share);
  if (known != volumes_.end()) return known->second + share_path;
  std::string full_path = fileindex::GetFullPath(share_path);
  volumes_.emplace(share, full_path.substr(0, full_path.size() - share_path.size()));
  return full_path;
}

Folder::Folder(const Json::Value& data) {
  GetJsonValue(path_, data, "path", true);
  GetJsonValue(name_, data, "name", true);
  GetJsonValue(document_, data, "document", true);
  GetJsonValue(audio_, data, "audio", true);
  GetJsonValue(video_, data, "video", true);
  GetJsonValue(photo_, data, "photo", true);
  GetJsonValue(owner_, data, "owner", false);
  GetJsonValue(group_, data, "group", false);
  GetJsonValue(privileged_, data, "privileged", false);
  GetJsonValue(paused_, data, "paused", false);
  GetJsonValue(volume_to_be_clean_, data, "volume_to_be_clean", false);
  Validate();
}

Folder::Folder(const std::string& path, const std::string& name, const std::string& owner,
               const std::string& /*not_stored*/, bool document, bool audio, bool video, bool photo, bool privileged,
               bool paused)
    : path_(path),
      name_(name),
      owner_(owner),
      document_(document),
      audio_(audio),
      video_(video),
      photo_(photo),
      privileged_(privileged),
      paused_(paused) {
  Validate();
}

Json::Value Folder::GetData() const {
  Json::Value data(Json::objectValue);
  data["path"] = path_;
  data["name"] = name_;
  data["document"] = document_;
  data["audio"] = audio_;
  data["video"] = video_;
  data["photo"] = photo_;
  data["paused"] = paused_;
  data["owner"] = owner_;
  data["group"] = group_;
  data["privileged"] = privileged_;
  data["volume_to_be_clean"] = volume_to_be_clean_;
  return data;
}

Json::Value Folder::GetIndexCfg() const {
  Json::Value kinds(Json::objectValue);
  kinds["document"] = document_;
  kinds["audio"] = audio_;
  kinds["video"] = video_;
  kinds["photo"] = photo_;
  return kinds;
}

void Folder::Validate() const {
  if (kAll == group_) QUARROX_THROW("kAll == group_", kErrBadParameter, "\"all\" is reserved group name");
}

std::string Folder::GetShare() const {
  if (share_.empty()) share_ = GetShareNameByPath(path_);
  return share_;
}

std::string Folder::GetFullPath() const {
  if (full_path_.empty()) full_path_ = fileindex::GetFullPath(path_);
  return full_path_;
}

std::string Folder::GetFullPath(ShareVolumes& volumes) const {
  if (full_path_.empty()) full_path_ = volumes.GetFullPath(path_);
  return full_path_;
}

void Folder::SetShare(const std::string& new_share) {
  path_ = ReplacePathShare(path_, new_share, GetShare());
  share_ = new_share;
  ++share_changes;
}

uint64_t Folder::ShareChanges() {
  return share_changes;
}

}  // namespace quarrox::fileindex
