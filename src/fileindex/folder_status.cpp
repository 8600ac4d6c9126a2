// What a folder's files are going through: the members of Folder that look at the queue and the state of indexing.
#define QUARROX_LOG_UNIT "folder"
#include <ctime>

#include "common/json.h"
#include "common/log.h"
#include "common/sdk/share.h"
#include "fileindex/folder.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"

namespace quarrox::fileindex {

// Two texts are misspelled; callers know them so.
Json::Value Folder::GetDataWithAdditional(const Json::Value& additionals) const {
  if (!additionals.isArray()) QUARROX_THROW("!addiitionals.isArray()", kErrBadParameter, toString(additionals));
  Json::Value data = GetData();
  for (const Json::Value& it : additionals) {
    if (!it.isString()) QUARROX_THROW("!it.isString()", kErrBadParameter, toString(it));
    const std::string additional = it.asString();
    if (additional != "status") {
      QUARROX_THROW("additional != \"status\"", kErrBadParameter, "Unknown additioal: " + additional);
    }
    GetStatus(data["additional"]["status"]);
  }
  return data;
}

bool Folder::IsIndexing() const {
  const sdk::SDKShare share(GetShare());
  return QueueMgr(share.GetQueuePath()).IsFullPathProcessing(GetFullPath());
}

void Folder::GetStatus(Json::Value& out) const {
  if (!out.isObject()) out = Json::objectValue;
  const StatusMgr status;
  if (!CanPathBeIndexed(path_)) {
    out["text"] = "error";
    out["desc"] = "invalid_path";
  } else if ((status.GetShareStatus(GetShare()) & kShareNeedReindex) != 0) {
    out["text"] = "need_reindex";
  } else if (IsIndexing()) {
    const int64_t resume_time = status.GetPauseInfo();
    const bool running = resume_time != kPausedWithoutEnd && time(nullptr) >= resume_time;
    out["text"] = running ? "processing" : "paused";
  } else {
    out["text"] = "finished";
  }
}

}  // namespace quarrox::fileindex
