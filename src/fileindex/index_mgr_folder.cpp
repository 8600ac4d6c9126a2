// The operations that tell of folders and change nothing.
#define QUARROX_LOG_UNIT "index_mgr"

#include <map>
#include <set>
#include <utility>
#include <vector>

#include "fileindex/folder_status.h"
#include "fileindex/index_mgr.h"
#include "fileindex/index_mgr_internal.h"

namespace quarrox::fileindex {
namespace {

// The first of equal elements: a request that asks for one extra a thousand times is not a thousand times the work.
Json::Value WithoutDoubles(const Json::Value& array) {
  if (!array.isArray()) return array;
  Json::Value result(Json::arrayValue);
  std::set<Json::Value> seen;
  for (const Json::Value& element : array) {
    if (seen.insert(element).second) result.append(element);
  }
  return result;
}

// Takes one more folder's text into that of several; index_mgr.h has the rule.
void MergeText(std::string& all, const std::string& text) {
  if (all == "error" || text == "finished") return;
  if (all == "need_reindex" && text == "paused") return;
  const bool stays = text == "error" || text == "need_reindex" || text == "paused";
  all = stays ? text : "processing";
}

// What a summary is made of: an item at a time, and the text of all.
class Summary {
 public:
  void Add(Json::Value item) {
    MergeText(text_, item["text"].asString());
    items_.append(std::move(item));
  }
  Json::Value End(const std::string& text) {
    MergeText(text_, text);
    Json::Value result(Json::objectValue);
    result["items"] = std::move(items_);
    result["status"] = text_;
    return result;
  }

 private:
  std::string text_ = "finished";
  Json::Value items_ = Json::arrayValue;
};

Json::Value ItemOf(const std::string& group, const std::vector<std::shared_ptr<Folder>>& folders,
                   FolderStatuses& statuses) {
  std::string text = "finished";
  for (const auto& folder : folders) {
    Json::Value status;
    statuses.GetStatus(status, *folder);
    MergeText(text, status["text"].asString());
  }
  Json::Value item(Json::objectValue);
  item["name"] = group;
  item["text"] = text;
  item["group"] = true;
  return item;
}

}  // namespace

void FolderList(Json::Value& result, unsigned int offset, unsigned int limit, const std::string& sort_by,
                const std::string& sort_direction, const std::string& group, const std::string& keyword,
                const Json::Value& additional) {
  const FolderMgr folder_mgr;
  std::vector<std::shared_ptr<Folder>> page;
  size_t total = 0;
  folder_mgr.List(page, total, offset, limit, sort_by, sort_direction, group, keyword);
  OpenShares shares;
  FolderStatuses statuses(folder_mgr, shares);
  const Json::Value extras = WithoutDoubles(additional);
  Json::Value folders(Json::arrayValue);
  for (const auto& folder : page) folders.append(statuses.GetDataWithAdditional(*folder, extras));
  result = Json::objectValue;
  result["folder"] = std::move(folders);
  result["total"] = static_cast<Json::UInt>(total);
  result["offset"] = offset;
}

void FolderGet(Json::Value& result, const std::string& path) {
  std::shared_ptr<Folder> folder;
  FolderMgr().Get(folder, path);
  result = folder->GetData();
}

void FolderListGroups(Json::Value& result) {
  const std::set<std::string> groups = FolderMgr().GetGroups();
  result = Json::arrayValue;
  for (const std::string& group : groups) result.append(group);
}

void FolderSummary(Json::Value& result) {
  const FolderMgr folder_mgr;
  OpenShares shares;
  FolderStatuses statuses(folder_mgr, shares);
  Summary summary;
  std::map<std::string, std::vector<std::shared_ptr<Folder>>> groups;
  for (const auto& folder : folder_mgr.GetFolders()) {
    if (!folder->GetGroup().empty()) {
      groups[folder->GetGroup()].push_back(folder);
      continue;
    }
    Json::Value item;
    statuses.GetStatus(item, *folder);
    item["name"] = folder->GetName();
    summary.Add(std::move(item));
  }
  for (const auto& [group, folders] : groups) summary.Add(ItemOf(group, folders, statuses));
  result = summary.End(IndexProcessingStatusOf(folder_mgr, shares));
}

}  // namespace quarrox::fileindex
