// What a folder's files are going through: the members of Folder that look at the queue and the state of indexing.
#define QUARROX_LOG_UNIT "folder"

#include "fileindex/folder_status.h"

#include <ctime>
#include <functional>

#include "common/json.h"
#include "common/log.h"
#include "common/sdk/share.h"
#include "fileindex/folder.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/util.h"

namespace quarrox::fileindex {
namespace {

constexpr char kFunction[] = "GetDataWithAdditional";

// `can_be_indexed` and `is_indexing` are asked in this order, and only where the answer depends on them.
template <typename CanBeIndexed, typename IsIndexing>
void Fill(Json::Value& out, const Folder& folder, const StatusMgr& status, const CanBeIndexed& can_be_indexed,
          const IsIndexing& is_indexing) {
  if (!out.isObject()) out = Json::objectValue;
  if (!can_be_indexed()) {
    out["text"] = "error";
    out["desc"] = "invalid_path";
  } else if ((status.GetShareStatus(folder.GetShare()) & kShareNeedReindex) != 0) {
    out["text"] = "need_reindex";
  } else if (is_indexing()) {
    const int64_t resume_time = status.GetPauseInfo();
    const bool running = resume_time != kPausedWithoutEnd && time(nullptr) >= resume_time;
    out["text"] = running ? "processing" : "paused";
  } else {
    out["text"] = "finished";
  }
}

// Two texts are misspelled; callers know them so.
Json::Value WithAdditional(const Folder& folder, const Json::Value& additionals,
                           const std::function<void(Json::Value&)>& fill_status) {
  if (!additionals.isArray()) {
    QUARROX_THROW_IN(kFunction, "!addiitionals.isArray()", kErrBadParameter, toString(additionals));
  }
  Json::Value data = folder.GetData();
  for (const Json::Value& it : additionals) {
    if (!it.isString()) QUARROX_THROW_IN(kFunction, "!it.isString()", kErrBadParameter, toString(it));
    const std::string additional = it.asString();
    if (additional != "status") {
      QUARROX_THROW_IN(kFunction, "additional != \"status\"", kErrBadParameter, "Unknown additioal: " + additional);
    }
    fill_status(data["additional"]["status"]);
  }
  return data;
}

}  // namespace

Json::Value Folder::GetDataWithAdditional(const Json::Value& additionals) const {
  return WithAdditional(*this, additionals, [&](Json::Value& out) { GetStatus(out); });
}

bool Folder::IsIndexing() const {
  const sdk::SDKShare share(GetShare());
  return QueueMgr(share.GetQueuePath()).IsFullPathProcessing(GetFullPath());
}

void Folder::GetStatus(Json::Value& out) const {
  Fill(
      out, *this, StatusMgr(), [&] { return CanPathBeIndexed(path_); }, [&] { return IsIndexing(); });
}

void FolderStatuses::GetStatus(Json::Value& out, const Folder& folder) {
  if (!status_) status_.emplace();
  Fill(
      out, folder, *status_, [&] { return CanPathBeIndexed(folder.GetPath(), shares_); },
      [&] {
        return pending_.IsProcessing(shares_.Get(folder.GetShare()).GetQueuePath(),
                                     GetFullPath(folder.GetPath(), shares_));
      });
}

Json::Value FolderStatuses::GetDataWithAdditional(const Folder& folder, const Json::Value& additionals) {
  return WithAdditional(folder, additionals, [&](Json::Value& out) { GetStatus(out, folder); });
}

}  // namespace quarrox::fileindex
