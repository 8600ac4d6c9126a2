// One share's event queue, and its hand-over from those who write it to the one daemon that drains it.
//
// Producers append to the queue through AppendToQueue at any time. The daemon renames the queue aside to its ".tmp"
// twin, hands out every operation that it holds, and deletes it:
//
//   PrepareTmpQueue();        // a ".tmp" left by a pass that did not end stays and is drained first
//   ProcessOP(fn, true);
//   DeleteTmp();
//
// Whatever dies in between: the next pass hands out all of the ".tmp" again. So an operation is handed out at least
// once, and events that are newer than the ".tmp" wait in the queue.
#pragma once

#include <cstddef>
#include <memory>
#include <string>

#include <boost/function.hpp>

#include "common/export.h"
#include "fileindex/optree.h"

namespace quarrox::fileindex {

// A file that is missing, or goes missing between a test and its opening, is an empty queue. Nothing here makes a
// queue. Not thread-safe: one object, one thread. At most one process drains a queue; the questions may be asked by
// any.
class QUARROX_API QueueMgr {
 public:
  explicit QueueMgr(const std::string& queue_path);

  // Renames the queue to its ".tmp" under the lock that producers take; where there is a ".tmp" already, both stay as
  // they are. Returns false where there is no queue, whether or not a ".tmp" was left: ProcessOP drains that all the
  // same. Throws Error 502 where the queue cannot be locked or renamed.
  bool PrepareTmpQueue();

  // The result of unlink: 0, or -1 with errno. Never throws.
  int DeleteTmp();

  // The operations of the queue as it is now, or of the ".tmp", for which it waits until nobody holds its lock any
  // more. Throws Error 502 where the file is missing or cannot be read.
  std::shared_ptr<OPTree> GetOPTree() const;
  std::shared_ptr<OPTree> GetOPTreeTmp() const;

  // Hands out the operations of the ".tmp" or of the queue, as OPTree::ProcessOP, and returns what that returns; 0
  // where the file is missing. Throws as GetOPTree does, and what `fn` throws.
  size_t ProcessOP(const boost::function<void(std::shared_ptr<OP>)>& fn, bool tmp) const;

  // The questions look at the queue and then at the ".tmp", so that a queue that is renamed meanwhile is not missed.
  // They read an event line only as far as it may be their answer: a bad line that cannot be is passed over, any other
  // is logged as OPTree does and skipped. They throw Error 502 where a file cannot be read.

  // Whether anything is pending for the indexed folder with the full path `path`:
  // - an event that this folder governs (FolderMgr::GetMostSuitableCfg of the event's path has the full path `path`);
  // - a reindex or a rename of `path` or of a directory above it, or its creation or deletion as a directory;
  // - a mark that events were lost: all of the share will be looked at.
  // A rename counts at its old path as at its new one, because the documents of both ends change. Loads the folder
  // list once, and only where there is a queue or a ".tmp"; throws what that throws.
  bool IsFullPathProcessing(const std::string& path) const;

  // Whether a reindex of `path` or of a directory above it is pending: an event that is nothing but a reindex.
  bool IsFullPathHasReindex(const std::string& path) const;

  // Whether an event of `path` is pending: one on it, or one on a directory above it that concerns everything below, as
  // in IsFullPathProcessing.
  bool IsFullPathPending(const std::string& path) const;

  const std::string& queue_path() const { return queue_path_; }
  const std::string& queue_path_tmp() const { return queue_path_tmp_; }

 private:
  std::string queue_path_;
  std::string queue_path_tmp_;
};

}  // namespace quarrox::fileindex
