#define QUARROX_LOG_UNIT "index_mgr"

#include <unistd.h>

#include <cerrno>

#include "common/error.h"
#include "common/log.h"
#include "common/mutex_lock.h"
#include "common/sdk/share.h"
#include "common/strings.h"
#include "fileindex/index_mgr.h"
#include "fileindex/index_mgr_internal.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"
#include "vexo/error.h"
#include "vexo/exec.h"
#include "vexo/notifyd.h"
#include "vexo/path_compose.h"
#include "vexo/service.h"
#include "vexo/share.h"
#include "vexo/smb.h"

namespace quarrox::fileindex {
namespace {

using VEXO::VEXONOTIFYD::MONITOR_QUEUE_TYPE_APPLICATION;
using VEXO::VEXONOTIFYD::MonitorQueue;

constexpr char kAppName[] = "fileindex";
constexpr char kDaemonService[] = "pkg-Quarrox-fileindexd";
constexpr char kClean[] = "CleanShareIndexData";

// What the notification daemon reports of a watched directory, in its own bits. Single writes (0x02) are left out: the
// close behind them (0x08) says as much.
constexpr int kEventMask = 0xFFCC;

// Holds the platform's own data on a directory's files.
constexpr char kIgnoredName[] = "@eaDir";

Json::Value MonitorOf(const std::string& full_path) {
  Json::Value config(Json::objectValue);
  config["path"] = full_path;
  config["mask"] = kEventMask;
  config["ignore"].append(kIgnoredName);
  return config;
}

void LogPlatformError(const char* call) {
  QUARROX_LOG_PROGRESS("%s failed: err=[0x%04X %s:%d]", call, static_cast<unsigned int>(VLIBCErrGet()),
                       VLIBCErrFileGet(), VLIBCErrLineGet());
}

// Clients may search through the index only while there is one.
void SetSearchSwitch(bool enable) {
  {
    const LockMutex lock(sdk::SDKMutex());
    if ((VEXOSMBIsEnableSpotlight() == 1) == enable) return;
    if (0 > VEXOSMBSetSpotlight(enable ? 1 : 0)) return LogPlatformError("VEXOSMBSetSpotlight");
  }
  if (0 > VLIBServiceRestart("samba")) LogPlatformError("VLIBServiceRestart");
}

void RemoveTree(const std::string& path) {
  VLIBCExec("/bin/rm", "-rf", path.c_str(), static_cast<const char*>(nullptr));
}

// A call would take a path with a zero byte for what is before it: the directory of another share.
bool HasZeroByte(const std::string& path) {
  return path.find('\0') != std::string::npos;
}

// What a share's worker keeps beside the database. A directory in which others keep files stays.
void RemoveWorkerFiles(const std::string& directory) {
  const int error = errno;
  for (const char* name : kMovableWorkerFiles) unlink((directory + name).c_str());
  for (const char* name : kOtherWorkerFiles) unlink((directory + name).c_str());
  rmdir(directory.c_str());
  errno = error;
}

}  // namespace

void DeleteMonitor(const std::string& queue_path, const std::string& share_name) {
  if (!MonitorQueue::Delete(queue_path, kAppName, MONITOR_QUEUE_TYPE_APPLICATION)) {
    QUARROX_THROW_IN("DeleteVEXONotifydCfg",
                     "!MonitorQueue::Delete(share.GetQueuePath(), kAppName, MONITOR_QUEUE_TYPE_APPLICATION)",
                     kErrSystem, "MonitorQueue::Delete failed, share=" + share_name);
  }
}

const std::vector<std::shared_ptr<Folder>>& MonitorConfigs::FoldersOf(const std::string& share_name) {
  if (!grouped_) {
    for (const auto& folder : folder_mgr_.GetFolders()) folders_[folder->GetShare()].push_back(folder);
    grouped_ = true;
  }
  return folders_[share_name];
}

void MonitorConfigs::Upsert(const std::string& share_name) {
  const sdk::SDKShare& share = shares_.Get(share_name);
  Json::Value configs(Json::arrayValue);
  for (const auto& folder : FoldersOf(share_name)) configs.append(MonitorOf(GetFullPath(folder->GetPath(), shares_)));
  Json::Value data(Json::objectValue);
  data["queue"] = share.GetQueuePath();
  data["config"] = configs;
  const MonitorQueue monitor_queue(data);
  if (!MonitorQueue::Upsert(monitor_queue, kAppName, MONITOR_QUEUE_TYPE_APPLICATION)) {
    QUARROX_THROW_IN("UpsertVEXONotifydCfg",
                     "!MonitorQueue::Upsert(monitor_queue, kAppName, MONITOR_QUEUE_TYPE_APPLICATION)", kErrSystem,
                     "MonitorQueue::Upsert failed, share=" + share_name);
  }
}

void MonitorConfigs::Delete(const std::string& share_name) {
  DeleteMonitor(shares_.Get(share_name).GetQueuePath(), share_name);
}

void UpsertVEXONotifydCfg(const std::string& share_name, FolderMgr& folder_mgr) {
  OpenShares shares;
  MonitorConfigs(folder_mgr, shares).Upsert(share_name);
}

void DeleteVEXONotifydCfg(const std::string& share_name) {
  DeleteMonitor(sdk::SDKShare(share_name).GetQueuePath(), share_name);
}

void SetupRelatedServices(bool enable) {
  SetSearchSwitch(enable);
  if (!enable) {
    if (0 > VLIBServicectlStop(kDaemonService, VLIB_SERVICECTL_UPSTART)) {
      QUARROX_LOG_FAILED(R"(0 > VLIBServicectlStop("pkg-Quarrox-fileindexd", VLIB_SERVICECTL_UPSTART))");
    }
    return;
  }
  if (0 > VLIBServiceStart("vexocontentextractd", TRUE)) {
    QUARROX_LOG_FAILED(R"(0 > VLIBServiceStart("vexocontentextractd", TRUE))");
  }
  if (0 > VLIBServicectlStart(kDaemonService, VLIB_SERVICECTL_UPSTART)) {
    QUARROX_LOG_FAILED(R"(0 > VLIBServicectlStart("pkg-Quarrox-fileindexd", VLIB_SERVICECTL_UPSTART))");
  }
}

void PrepareServices() {
  SetupRelatedServices(!FolderMgr().GetFolders().empty());
}

std::string QueuePathOf(const std::string& share_path) {
  char path[VEXO_PATH_SIZE] = {};
  if (HasZeroByte(share_path) || 0 > FILEIDXQueuePathCompose(share_path.c_str(), path, sizeof(path))) {
    QUARROX_THROW_IN(kClean, "0 > FILEIDXQueuePathCompose(share_path.c_str(), path, sizeof(path))", kErrSystem,
                     "FILEIDXQueuePathCompose failed, share_path=" + share_path);
  }
  return path;
}

std::string DBPathOf(const std::string& share_path) {
  char path[VEXO_PATH_SIZE] = {};
  if (HasZeroByte(share_path) || 0 > FILEIDXDBPathCompose(share_path.c_str(), path, sizeof(path))) {
    QUARROX_THROW_IN(kClean, "0 > FILEIDXDBPathCompose(share_path.c_str(), path, sizeof(path))", kErrSystem,
                     "FILEIDXDBPathCompose failed, share_path=" + share_path);
  }
  return path;
}

void RemoveShareFiles(const std::string& share_path) {
  const std::string queue = QueuePathOf(share_path);
  RemoveTree(queue);
  RemoveTree(queue + ".tmp");
  const std::string db = DBPathOf(share_path);
  RemoveTree(db);
  RemoveWorkerFiles(Dirname(db));
}

void CleanShareIndexData(const std::string& share_name, const std::string& share_path) {
  RemoveShareFiles(share_path);
  StatusMgr().ClearShareStatus(share_name);
}

}  // namespace quarrox::fileindex
