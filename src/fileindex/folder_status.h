// The status of many folders at once.
#pragma once

#include <optional>
#include <string>

#include <json/json.h>

#include "common/export.h"
#include "common/sdk/open_shares.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/queue_mgr_folders.h"
#include "fileindex/status_mgr.h"

namespace quarrox::fileindex {

// What Folder says of each folder, from one look at the machine: the state of indexing and each queue are read once, at
// the first folder that needs them, and each share is opened once. So a thousand folders cost little more than one; a
// single one is cheaper to ask itself. Lives for one operation. Not thread-safe.
class QUARROX_API FolderStatuses {
 public:
  // For folders of this list. Both must outlive this object, and the list must stay as it is.
  FolderStatuses(const FolderMgr& folders, sdk::OpenShares& shares) : shares_(shares), pending_(folders) {}

  // As Folder::GetStatus and Folder::GetDataWithAdditional.
  void GetStatus(Json::Value& out, const Folder& folder);
  Json::Value GetDataWithAdditional(const Folder& folder, const Json::Value& additionals);

 private:
  sdk::OpenShares& shares_;
  PendingFolders pending_;
  std::optional<StatusMgr> status_;
};

}  // namespace quarrox::fileindex
