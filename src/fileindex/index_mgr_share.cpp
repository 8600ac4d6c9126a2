#define QUARROX_LOG_UNIT "index_mgr"

#include "common/error.h"
#include "common/file.h"
#include "common/log.h"
#include "fileindex/communication.h"
#include "fileindex/elastic_control.h"
#include "fileindex/folder_pauses.h"
#include "fileindex/index_mgr.h"
#include "fileindex/index_mgr_internal.h"
#include "fileindex/optree.h"
#include "fileindex/util.h"

namespace quarrox::fileindex {
namespace {

void SendWorkerCommand(const char* command, const std::string& share_name) {
  Json::Value data(Json::objectValue);
  data["share_name"] = share_name;
  SendCommandToDaemon(command, data);
}

// Does nothing for a share without folders.
void ChangePaused(const std::string& share_name, bool paused) {
  const FolderMgr folder_mgr;
  if (!folder_mgr.IsShareIndexed(share_name)) return;
  OpenShares shares;
  MonitorConfigs monitors(folder_mgr, shares);
  paused ? PauseShare(share_name, monitors) : ResumeShare(share_name, monitors);
  FolderPauses pauses;
  for (const auto& folder : folder_mgr.GetFolders()) {
    if (folder->GetShare() != share_name) continue;
    folder->SetPaused(paused);
    pauses.Forget(folder->GetPath());
  }
  pauses.Save();
  folder_mgr.Save();
}

// Queues that `path_old` became `path`, which lies in a share that is open already.
void AddRename(OpenShares& shares, const std::string& path, const std::string& path_old) {
  CustomEvents(shares).Add(kEventRename, path, path_old, Json::Value());
}

void AddReindex(OpenShares& shares, const std::string& path) {
  CustomEvents(shares).Add(kEventReindex, path, "", Json::Value());
}

}  // namespace

void PauseShare(const std::string& share_name, MonitorConfigs& monitors) {
  SendWorkerCommand("worker_delete", share_name);
  monitors.Delete(share_name);
  elastic::ShareIndexPause(share_name);
}

void ResumeShare(const std::string& share_name, MonitorConfigs& monitors) {
  elastic::ShareIndexResume(share_name);
  monitors.Upsert(share_name);
  SendWorkerCommand("worker_create", share_name);
}

void ShareRename(const std::string& share_from, const std::string& share_to) {
  if (share_from.empty()) QUARROX_THROW("share_from.empty()", kErrBadParameter, "Missing share_from");
  if (share_to.empty()) QUARROX_THROW("share_to.empty()", kErrBadParameter, "Missing share_to");
  RequirePossible(__func__, share_to);
  if (share_to.find('/') != std::string::npos) {
    QUARROX_THROW("share_to.find('/') != string::npos", kErrBadParameter, "No name of a share: " + share_to);
  }
  const FolderMgr folder_mgr;
  for (const auto& folder : folder_mgr.GetFolders()) {
    if (folder->GetShare() == share_from) folder->SetShare(share_to);
  }
  FolderPauses pauses;
  pauses.RenameShare(share_from, share_to);
  pauses.Save();
  folder_mgr.Save();
  OpenShares shares;
  const sdk::SDKShare& share = shares.Get(share_to);
  elastic::ShareIndexRename(share_from, share_to, share.GetDBPath());
  const std::string path = share.GetPath();
  AddRename(shares, path, ReplacePathShare(path, share_from, share_to));
}

void ShareMigrate(const std::string& share_name, const std::string& path_from, const std::string& path_to) {
  if (share_name.empty()) QUARROX_THROW("share_name.empty()", kErrBadParameter, "Missing share_name");
  if (path_from.empty()) QUARROX_THROW("path_from.empty()", kErrBadParameter, "Missing path_from");
  if (path_to.empty()) QUARROX_THROW("path_to.empty()", kErrBadParameter, "Missing path_to");
  for (const std::string& path : {path_from, path_to}) RequirePossible(__func__, path);
  if (!FolderMgr().IsShareIndexed(share_name)) return;
  OpenShares shares;
  elastic::ShareIndexMigrate(share_name, shares.Get(share_name).GetDBPath());
  AddRename(shares, path_to, path_from);
}

void ShareCheckRecycle(const std::string& share_name) {
  OpenShares shares;
  const std::string path = shares.Get(share_name).GetPath();
  if (IsDirExist(path, false)) AddReindex(shares, path + "/#recycle");
}

void SharePause(const std::string& share_name) {
  if (share_name.empty()) QUARROX_THROW("share_name.empty()", kErrBadParameter, "Missing share name");
  ChangePaused(share_name, true);
}

void ShareResume(const std::string& share_name) {
  if (share_name.empty()) QUARROX_THROW("share_name.empty()", kErrBadParameter, "Missing share name");
  ChangePaused(share_name, false);
}

void ShareRebuild(const std::string& share_name) {
  if (share_name.empty()) QUARROX_THROW("share_name.empty()", kErrBadParameter, "Missing share name");
  const FolderMgr folder_mgr;
  OpenShares shares;
  const sdk::SDKShare& share = shares.Get(share_name);
  if (!folder_mgr.IsShareIndexed(share_name)) return;
  elastic::ShareIndexDelete(share_name);
  elastic::ShareIndexCreate(share_name);
  MonitorConfigs(folder_mgr, shares).Upsert(share_name);
  AddReindex(shares, share.GetPath());
  SendWorkerCommand("worker_create", share_name);
}

void ShareAutoClean(const std::string& share_name) {
  if (share_name.empty()) QUARROX_THROW("share_name.empty()", kErrBadParameter, "Missing share name");
  const FolderMgr folder_mgr;
  OpenShares shares;
  const sdk::SDKShare& share = shares.Get(share_name);
  if (!folder_mgr.IsShareIndexed(share_name)) return;
  elastic::ShareIndexDelete(share_name);
  MonitorConfigs(folder_mgr, shares).Delete(share_name);
  CleanShareIndexData(share_name, share.GetPath());
}

void ShareClearPaused(const std::string& share_name, const std::string& share_path) {
  if (share_name.empty()) QUARROX_THROW("share_name.empty()", kErrBadParameter, "Missing share name");
  if (share_path.empty()) QUARROX_THROW("share_path.empty()", kErrBadParameter, "Missing share path");
  FolderMgr folder_mgr;
  CleanShareIndexData(share_name, share_path);
  elastic::ShareIndexDelete(share_name);
  folder_mgr.DeleteByShare(share_name);
  folder_mgr.Save();
  if (folder_mgr.GetFolders().empty()) SetupRelatedServices(false);
}

}  // namespace quarrox::fileindex
