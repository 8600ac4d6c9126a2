#include "fileindex/queue_mgr.h"

#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <optional>

#include "common/file.h"
#include "common/log.h"
#include "common/queue_file.h"
#include "common/strings.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/optree_fold.h"
#include "fileindex/queue_mgr_folders.h"
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
