// The operations that change folders, and FolderReindex. The file of the list changes in the middle of each: what is
// before can fail and leave it as it was, what is behind can be done again from it.
#define QUARROX_LOG_UNIT "index_mgr"

#include <climits>
#include <map>
#include <memory>
#include <set>
#include <utility>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "fileindex/communication.h"
#include "fileindex/elastic_control.h"
#include "fileindex/index_mgr.h"
#include "fileindex/index_mgr_internal.h"
#include "fileindex/optree.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"

namespace quarrox::fileindex {
namespace {

using FolderPtr = std::shared_ptr<Folder>;

constexpr char kUpsert[] = "FolderUpsert";

// Has the daemon look at what changed in each folder; an entry may be empty.
void QueueUpdates(const std::vector<FolderPtr>& folders, OpenShares& shares) {
  CustomEvents events(shares);
  for (const FolderPtr& folder : folders) {
    if (folder == nullptr) continue;
    events.Add(kEventUpdateDirectory, GetFullPath(folder->GetPath(), shares), "", folder->GetIndexCfg());
  }
}

// --- FolderAdd and FolderSet ---------------------------------------------------------------------------------------

class Upsertion {
 public:
  Upsertion(bool create, bool updater_mode) : create_(create), updater_mode_(updater_mode) {}

  // Checks a record and takes it into the list in memory.
  void Take(const Json::Value& data);

  // Takes the record of the list, with changes; returns it.
  Json::Value TakeChanged(const std::string& path, const Json::Value& changes);

  // Saves the list and brings everything else in line with it.
  void Finish();

 private:
  void Check(const Folder& folder);
  void CheckRoom(const std::string& share);

  const bool create_;
  const bool updater_mode_;
  FolderMgr folder_mgr_;
  OpenShares shares_;
  std::map<std::string, bool> touched_;  // shares: whether it had no folder before
  std::vector<FolderPtr> reindex_;
};

void Upsertion::Check(const Folder& folder) {
  if (!CanPathBeIndexed(folder.GetPath(), shares_) && !updater_mode_) {
    QUARROX_THROW_IN(kUpsert, "!CanPathBeIndexed(folder_new->GetPath()) && !updater_mode", kErrPathNotIndexable,
                     "Path cannot index: " + folder.GetPath());
  }
  RequirePossible(kUpsert, folder.GetPath());
  if (create_ && folder_mgr_.HasFolder(folder.GetPath())) {
    QUARROX_THROW_IN(kUpsert, "create && folder_mgr.HasFolder(folder_new->GetPath())", kErrFolderExists,
                     "Duplicated ID: " + folder.GetPath());
  }
}

void Upsertion::CheckRoom(const std::string& share) {
  if (shares_.Get(share).IsSpaceEnough()) return;
  QUARROX_THROW_IN(kUpsert, "!share.IsSpaceEnough()", kErrNoSpace, "Share (" + share + ") space not enough");
}

void Upsertion::Take(const Json::Value& data) {
  const auto folder = std::make_shared<Folder>(data);
  Check(*folder);
  const std::string share = folder->GetShare();
  const bool is_new = !folder_mgr_.IsShareIndexed(share);
  FolderPtr changed;
  folder_mgr_.Upsert(changed, folder);
  if (create_) {
    changed =
        std::make_shared<Folder>(folder->GetPath(), folder->GetName(), "", "", true, true, true, true, false, false);
  }
  reindex_.push_back(changed);
  if (touched_.emplace(share, is_new).second) CheckRoom(share);
}

Json::Value Upsertion::TakeChanged(const std::string& path, const Json::Value& changes) {
  FolderPtr folder;
  folder_mgr_.Get(folder, path);
  Json::Value record = folder->GetData();
  JsonApplyChanges(record, changes);
  if (record["path"] != path) {
    QUARROX_THROW_IN("FolderChange", "record[\"path\"] != path", kErrBadParameter,
                     "A folder keeps its path: " + toString(changes));
  }
  Take(record);
  return record;
}

void Upsertion::Finish() {
  SetupRelatedServices(true);
  MonitorConfigs monitors(folder_mgr_, shares_);
  for (const auto& [share, is_new] : touched_) {
    if (create_ && is_new) elastic::ShareIndexCreate(share);
    monitors.Upsert(share);
  }
  folder_mgr_.Save();
  for (const auto& [share, is_new] : touched_) notify_setting_changed(share, true);
  if (!updater_mode_) QueueUpdates(reindex_, shares_);
}

void FolderUpsert(const Json::Value& folder_list, bool create, bool updater_mode) {
  const LockFile lock(kFolderLockPath, true);
  Upsertion upsertion(create, updater_mode);
  if (!folder_list.isArray()) QUARROX_THROW("!folder_list.isArray()", kErrBadParameter, toString(folder_list));
  for (const Json::Value& data : folder_list) upsertion.Take(data);
  upsertion.Finish();
}

// --- FolderDelete --------------------------------------------------------------------------------------------------

class Deletion {
 public:
  // Takes a folder out of the list in memory.
  void Take(const std::string& path);

  // Saves the list and brings everything else in line with it.
  void Finish();

 private:
  void RemoveIndex(const std::string& share, MonitorConfigs& monitors);
  void QueueWhatIsLeft();

  FolderMgr folder_mgr_;
  OpenShares shares_;
  std::set<std::string> touched_;  // shares
  std::vector<FolderPtr> reindex_;
};

void Deletion::Take(const std::string& path) {
  if (!folder_mgr_.HasFolder(path)) RequirePossible("FolderDelete", path);
  FolderPtr out;
  folder_mgr_.Delete(out, path);
  reindex_.push_back(out);
  touched_.insert(GetShareNameByPath(path));
}

void Deletion::RemoveIndex(const std::string& share, MonitorConfigs& monitors) {
  const std::string path = shares_.Get(share).GetPath();
  elastic::ShareIndexDelete(share);
  monitors.Delete(share);
  CleanShareIndexData(share, path);
}

// A share that lost its index has nothing to be looked at.
void Deletion::QueueWhatIsLeft() {
  std::erase_if(reindex_, [&](const FolderPtr& folder) {
    return folder == nullptr || !folder_mgr_.IsShareIndexed(folder->GetShare());
  });
  QueueUpdates(reindex_, shares_);
}

void Deletion::Finish() {
  MonitorConfigs monitors(folder_mgr_, shares_);
  for (const std::string& share : touched_) {
    folder_mgr_.IsShareIndexed(share) ? monitors.Upsert(share) : RemoveIndex(share, monitors);
  }
  folder_mgr_.Save();
  for (const std::string& share : touched_) notify_setting_changed(share, false);
  QueueWhatIsLeft();
  if (folder_mgr_.GetFolders().empty()) SetupRelatedServices(false);
}

// --- FolderReindex -------------------------------------------------------------------------------------------------

// A new index for a share, and a reindex of all of it.
void Rebuild(const std::string& share, OpenShares& shares, CustomEvents& events) {
  const std::string path = shares.Get(share).GetPath();
  elastic::ShareIndexDelete(share);
  elastic::ShareIndexCreate(share);
  events.Add(kEventReindex, path, "", Json::Value());
}

}  // namespace

void notify_setting_changed(const std::string& share_name, bool is_upsert) {
  Json::Value data(Json::objectValue);
  data["share_name"] = share_name;
  data["is_upsert"] = is_upsert;
  SendCommandToDaemon("notify_setting_changed", data);
}

void RequirePossible(const char* operation, const std::string& path) {
  if (path.size() >= PATH_MAX) {
    QUARROX_THROW_IN(operation, "path.size() >= PATH_MAX", kErrBadParameter,
                     "Path too long: " + std::to_string(path.size()) + " bytes");
  }
  if (path.find('\0') != std::string::npos) {
    QUARROX_THROW_IN(operation, "path.find('\\0') != string::npos", kErrBadParameter,
                     "Path has a zero byte: " + toString(path));
  }
}

void FolderAdd(const Json::Value& folder_list, bool updater_mode) {
  FolderUpsert(folder_list, true, updater_mode);
}

void FolderSet(const Json::Value& folder_list, bool updater_mode) {
  FolderUpsert(folder_list, false, updater_mode);
}

void FolderChange(Json::Value& result, const std::string& path, const Json::Value& changes) {
  const LockFile lock(kFolderLockPath, true);
  Upsertion upsertion(false, false);
  if (!changes.isObject()) QUARROX_THROW("!changes.isObject()", kErrBadParameter, toString(changes));
  Json::Value record = upsertion.TakeChanged(path, changes);
  upsertion.Finish();
  result = std::move(record);
}

void FolderDelete(const Json::Value& path_list) {
  const LockFile lock(kFolderLockPath, true);
  Deletion deletion;
  if (!path_list.isArray()) QUARROX_THROW("!path_list.isArray()", kErrBadParameter, toString(path_list));
  for (const Json::Value& it : path_list) {
    if (!it.isString()) QUARROX_THROW("!it.isString()", kErrBadParameter, toString(it));
    deletion.Take(it.asString());
  }
  deletion.Finish();
}

void FolderDelete(const std::string& share_name) {
  Json::Value path_list(Json::arrayValue);
  for (const FolderPtr& folder : FolderMgr().GetFolders()) {
    if (folder->GetShare() == share_name) path_list.append(folder->GetPath());
  }
  FolderDelete(path_list);
}

void FolderReindex(const Json::Value& path_list) {
  StatusMgr status;
  const FolderMgr folder_mgr;
  if (!path_list.isArray()) QUARROX_THROW("!path_list.isArray()", kErrBadParameter, toString(path_list));
  OpenShares shares;
  CustomEvents events(shares);
  std::set<std::string> rebuild;
  std::set<std::string> touched;
  for (const Json::Value& it : path_list) {
    if (!it.isString()) QUARROX_THROW("!it.isString()", kErrBadParameter, toString(it));
    const std::string path = it.asString();
    RequirePossible(__func__, path);
    const std::string share = GetShareNameByPath(path);
    if (!folder_mgr.IsShareIndexed(share)) continue;
    if ((status.GetShareStatus(share) & kShareNeedRebuild) != 0) {
      rebuild.insert(share);
    } else {
      events.Add(kEventReindex, GetFullPath(path, shares), "", Json::Value());
    }
    touched.insert(share);
  }
  for (const std::string& share : rebuild) Rebuild(share, shares, events);
  for (const std::string& share : touched) {
    if ((status.GetShareStatus(share) & kShareNeedReindex) != 0) {
      status.UnsetShareStatus(share, kShareNeedReindex | kShareNeedRebuild);
    }
  }
}

}  // namespace quarrox::fileindex
