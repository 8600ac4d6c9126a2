#define QUARROX_LOG_UNIT "index_mgr"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <ctime>
#include <exception>
#include <unordered_set>
#include <utility>

#include "common/file.h"
#include "common/log.h"
#include "common/unique_fd.h"
#include "fileindex/elastic_control.h"
#include "fileindex/index_mgr.h"
#include "fileindex/index_mgr_internal.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/status_mgr.h"

namespace quarrox::fileindex {
namespace {

// That a queue is missing is no failure: it leaves no errno for the next line of the log.
bool HasPendingWork(const sdk::SDKShare& share) {
  if (!share.CanBeIndexed()) return false;
  const int error = errno;
  const QueueMgr queue(share.GetQueuePath());
  const bool pending = IsFileExist(queue.queue_path()) || IsFileExist(queue.queue_path_tmp());
  errno = error;
  return pending;
}

bool HasPendingWork(const std::string& share, OpenShares& shares) {
  try {
    return HasPendingWork(shares.Get(share));
  } catch (const std::exception&) {
    QUARROX_SYSLOG_FAILURE_("GetIndexProcessingStatus", "Failed to get status from share[%s]", share.c_str());
    return false;
  }
}

// Says by its file that suggestions are being made anew. Stays where it does not end, so that the file is left.
class RunningMark {
 public:
  explicit RunningMark(const std::string& db_path) : path_(db_path + "/term.sugg.running") {
    const UniqueFd file(open(path_.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644));
    if (!file) QUARROX_SYSLOG_FAILURE_("UpdateTermSuggestion", "Failed [%s]", "!ofs");
  }

  void End() const {
    if (0 == unlink(path_.c_str())) return;
    QUARROX_SYSLOG_FAILURE_("UpdateTermSuggestion", "Failed [%s]", "0 != unlink(term_sugg_running.c_str())");
  }

 private:
  const std::string path_;
};

void RebuildSuggestions(const std::string& share_name, const sdk::SDKShare& share) {
  const std::string db = share.GetDBName();
  QUARROX_LOG_PROGRESS("Start building term sugg [%s]", db.c_str());
  const RunningMark mark(share.GetDBPath());
  std::vector<std::string> documents;
  elastic::IndexGetByPrefixPath(db, share.GetPath(), documents);
  elastic::UpdateTermSuggestion(db, documents);
  elastic::IndexCommit(share_name);
  QUARROX_LOG_PROGRESS("Done building term sugg [%s]", db.c_str());
  mark.End();
}

}  // namespace

std::string IndexProcessingStatusOf(const FolderMgr& folder_mgr, OpenShares& shares) {
  const std::set<std::string> names = folder_mgr.GetIndexedShares();
  const auto is_pending = [&](const std::string& name) { return HasPendingWork(name, shares); };
  if (std::none_of(names.begin(), names.end(), is_pending)) return "finished";
  const int64_t resume_time = StatusMgr().GetPauseInfo();
  return resume_time == kPausedWithoutEnd || time(nullptr) < resume_time ? "paused" : "processing";
}

std::string GetIndexProcessingStatus() {
  OpenShares shares;
  return IndexProcessingStatusOf(FolderMgr(), shares);
}

void UpdateTermSuggestion() {
  const FolderMgr folder_mgr;
  std::vector<std::string> listed;
  elastic::ListUnAvailTermSuggDB(listed);
  const std::unordered_set<std::string> unavailable(listed.begin(), listed.end());
  for (const std::string& name : folder_mgr.GetIndexedShares()) {
    const sdk::SDKShare share(name);
    if (unavailable.contains(share.GetDBName())) RebuildSuggestions(name, share);
  }
}

}  // namespace quarrox::fileindex
