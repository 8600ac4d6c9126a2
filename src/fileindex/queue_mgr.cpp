#include "fileindex/queue_mgr.h"

#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <functional>
#include <iterator>
#include <optional>
#include <set>
#include <string_view>

#include "common/file.h"
#include "common/log.h"
#include "common/queue_file.h"
#include "common/strings.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/optree_fold.h"
#include "fileindex/queue_mgr_search.h"

namespace quarrox::fileindex {
namespace {

// Only what is known to be missing is: a file that cannot be looked at now must not be taken for a drained one. That a
// file is missing is no failure: it leaves no errno for the next line of the log.
bool Exists(const std::string& path) {
  const int error = errno;
  const bool missing = !IsFileExist(path) && (errno == ENOENT || errno == ENOTDIR);
  errno = error;
  return !missing;
}

std::shared_ptr<OPTree> BuiltTree(const std::string& path) {
  auto tree = newClass<OPTree>(path);
  tree->BuildTree();
  return tree;
}

// Which events say that something is pending for an indexed folder.
class FolderEvents {
 public:
  FolderEvents(const std::string& full_path, const FolderMgr& folders)
      : full_path_(full_path), folders_(folders), is_folder_(folders.IsFullPathHasOwnCfg(full_path)) {}

  bool Accepts(const EventView& event) {
    if ((event.event & kEventQueueDamaged) != 0) return true;
    if (Touches(event, event.path)) return true;
    return (event.event & kEventRename) != 0 && Touches(event, event.path_old) && CanHaveNode(event.path);
  }

 private:
  static constexpr uint32_t kConcernsAllBelow = kEventReindex | kEventRename;
  static constexpr uint32_t kConcernsAllBelowDirectory = kEventCreate | kEventDelete;  // they become reindexes

  // From a path that can have no node comes no operation.
  bool Touches(const EventView& event, std::string_view place) {
    const uint32_t all_below = kConcernsAllBelow | (event.is_dir ? kConcernsAllBelowDirectory : 0);
    if ((event.event & all_below) != 0 && IsAtOrBelow(full_path_, place)) return CanHaveNode(place);
    return is_folder_ && IsAtOrBelow(place, full_path_) && CanHaveNode(place) && IsGoverned(place);
  }
  bool IsGoverned(std::string_view place) {
    const auto next = inner_.upper_bound(place);
    if (next != inner_.begin() && place.starts_with(*std::prev(next))) return false;
    const std::shared_ptr<Folder> folder = folders_.GetMostSuitableCfg(NodePath(place));
    if (folder == nullptr) return false;
    if (folder->GetFullPath() == full_path_) return true;
    AddInner(folder->GetFullPath() + "/");
    return false;
  }
  void AddInner(const std::string& prefix) {
    auto covered = inner_.lower_bound(prefix);
    while (covered != inner_.end() && covered->starts_with(prefix)) covered = inner_.erase(covered);
    inner_.insert(prefix);
  }

  const std::string& full_path_;
  const FolderMgr& folders_;
  const bool is_folder_;
  // The folders below this one that were found to govern an event, with a slash at the end and none below another: so
  // what sorts before a path is the one that it lies in, if any.
  std::set<std::string, std::less<>> inner_;
};

}  // namespace

QueueMgr::QueueMgr(const std::string& queue_path) : queue_path_(queue_path), queue_path_tmp_(queue_path + ".tmp") {}

bool QueueMgr::PrepareTmpQueue() {
  const int error = errno;
  const bool renamed = TakeQueue(queue_path_, queue_path_tmp_);
  const bool missing = !renamed && (errno == ENOENT || errno == ENOTDIR);
  if (!renamed && !missing && errno != EEXIST) {
    QUARROX_THROW("0 > rename(queue_path_.c_str(), queue_path_tmp_.c_str())", kErrSystem,
                  std::string("rename failed, reason=") + strerror(errno));
  }
  errno = error;
  return !missing;
}

int QueueMgr::DeleteTmp() {
  return unlink(queue_path_tmp_.c_str());
}

std::shared_ptr<OPTree> QueueMgr::GetOPTree() const {
  return BuiltTree(queue_path_);
}

std::shared_ptr<OPTree> QueueMgr::GetOPTreeTmp() const {
  if (!WaitForProducers(queue_path_tmp_) && errno != ENOENT) {
    QUARROX_THROW("!WaitForProducers(queue_path_tmp_)", kErrSystem,
                  std::string("Failed to open queue, reason=") + strerror(errno));
  }
  return BuiltTree(queue_path_tmp_);
}

size_t QueueMgr::ProcessOP(const boost::function<void(std::shared_ptr<OP>)>& fn, bool tmp) const {
  const std::string& path = tmp ? queue_path_tmp_ : queue_path_;
  if (!Exists(path)) return 0;
  std::shared_ptr<OPTree> tree;
  try {
    tree = tmp ? GetOPTreeTmp() : GetOPTree();
  } catch (const Error&) {
    if (Exists(path)) throw;
    return 0;  // gone since it was looked at
  }
  return tree->ProcessOP(fn);
}

bool QueueMgr::IsFullPathProcessing(const std::string& path) const {
  std::optional<FolderMgr> folders;
  for (const std::string& queue_path : {queue_path_, queue_path_tmp_}) {
    QueueSearch queue(queue_path);
    if (queue.missing()) continue;
    if (!folders) folders.emplace();
    FolderEvents events(path, *folders);
    if (queue.Find([&](const EventView& event) { return events.Accepts(event); })) return true;
  }
  return false;
}

bool QueueMgr::IsFullPathHasReindex(const std::string& path) const {
  const auto covers = [&](const EventView& event) {
    return event.event == kEventReindex && CanHaveNode(event.path) && IsAtOrBelow(path, event.path);
  };
  for (const std::string& queue_path : {queue_path_, queue_path_tmp_}) {
    QueueSearch queue(queue_path);
    if (!queue.missing() && queue.Find(covers)) return true;
  }
  return false;
}

}  // namespace quarrox::fileindex
