// What the exported operations have in common. Nothing here takes the folder lock.
#pragma once

#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "fileindex/custom_events.h"
#include "fileindex/folder_mgr.h"

namespace quarrox::fileindex {

// The monitor configurations of several shares, made from one list: goes through the list once, when the first is
// written, and opens each share once. What changes in the list afterwards is not seen.
class MonitorConfigs {
 public:
  // Both must outlive this object.
  MonitorConfigs(const FolderMgr& folder_mgr, OpenShares& shares) : folder_mgr_(folder_mgr), shares_(shares) {}

  // As UpsertVEXONotifydCfg and DeleteVEXONotifydCfg.
  void Upsert(const std::string& share_name);
  void Delete(const std::string& share_name);

 private:
  const std::vector<std::shared_ptr<Folder>>& FoldersOf(const std::string& share_name);

  const FolderMgr& folder_mgr_;
  OpenShares& shares_;
  bool grouped_ = false;
  std::unordered_map<std::string, std::vector<std::shared_ptr<Folder>>> folders_;  // by share
};

// Tells the daemon that the folders of a share are others than before.
void notify_setting_changed(const std::string& share_name, bool is_upsert);

// Switches on or off what indexing needs of the machine: the SMB service's search, content extraction (never off) and
// the indexing daemon. Failures are logged and not thrown.
void SetupRelatedServices(bool enable);

// Refuses a text that is no path of any file system, before it gets into the list, a queue or a call that ends it at
// its zero byte: Error 120, in the name of the operation.
void RequirePossible(const char* operation, const std::string& path);

// Where the events and the index of a share with the directory `share_path`, a full path, are kept. Throw Error 502.
std::string QueuePathOf(const std::string& share_path);
std::string DBPathOf(const std::string& share_path);

// What a share's worker keeps beside the database. With which folders the index was made and what could not be indexed
// stays true where the share moves.
inline constexpr const char* kMovableWorkerFiles[] = {"/kinds", "/failures"};
inline constexpr const char* kOtherWorkerFiles[] = {"/own_disk", "/progress"};

// Takes the configuration of a queue back from the notification daemon. Throws Error 502 in the name of
// DeleteVEXONotifydCfg.
void DeleteMonitor(const std::string& queue_path, const std::string& share_name);

// Removes queue, database and what is beside it. Throws Error 502 where the places cannot be told; a file that cannot
// be removed stays.
void RemoveShareFiles(const std::string& share_path);

// Removes the queue and the database of the share with the directory `share_path`, a full path, and forgets its status
// flags. The share need not exist. Throws Error 502 where its places cannot be told from its path, and what changing
// the status throws; a file that cannot be removed stays.
void CleanShareIndexData(const std::string& share_name, const std::string& share_path);

// What pausing and resuming of a share does outside the folder list.
void PauseShare(const std::string& share_name, MonitorConfigs& monitors);
void ResumeShare(const std::string& share_name, MonitorConfigs& monitors);

// GetIndexProcessingStatus for a list that is loaded already.
std::string IndexProcessingStatusOf(const FolderMgr& folder_mgr, OpenShares& shares);

}  // namespace quarrox::fileindex
