// Changes single documents of a share's index.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <unordered_set>
#include <vector>

#include <json/json.h>

#include "fileindex/index_failures.h"
#include "fileindex/index_scope.h"
#include "operation_handler.h"
#include "recent_reads.h"

namespace quarrox::fileindexd {

// What is wrong with one path is logged and written down, and the others go on: it cannot be looked at or read, the
// engine does not take its document. Everything else is thrown: the engine is not there or has other troubles. What
// cannot be read is indexed without its contents. What has failed for good is not tried again until it changes. A file
// that vanishes is deleted from the index. Not thread-safe.
class IndexWriter {
 public:
  IndexWriter(const fileindex::IndexScope& scope, fileindex::IndexFailures& failures)
      : scope_(scope), failures_(failures) {}

  void Upsert(const std::string& path);

  // Refreshes what the file system says. False where the path is to be upserted instead: the index does not know it, or
  // as another file, or something failed there before.
  bool RefreshAttributes(const std::string& path);

  void Delete(const std::string& path);
  void DeleteWithAllBelow(const std::string& path);

  // Some known ones, or what is below some paths, with one request.
  void Delete(const std::vector<std::string>& paths);
  void DeleteBelow(const std::vector<std::string>& paths);

  // What was upserted lately.
  RecentReads& recent_reads() { return recent_reads_; }

  // Moves the documents of a path and of all below it. What the engine refuses of it is logged, and is found by
  // comparing both paths: the result is false then. The check point is called now and then.
  bool Move(const std::string& path, const std::string& path_old, const OperationHandler::CheckPoint& check_point);

  // Writes down that a path cannot be looked at, or a directory cannot be read, for this errno.
  void NoteUnread(const std::string& path, int error);

  // Whether the path was upserted since the last Forget, and its document is still the one from then.
  bool IsFresh(const std::string& path) const { return fresh_.count(std::hash<std::string>()(path)) != 0; }
  void Forget() { fresh_.clear(); }
  void Forget(const std::string& path) { fresh_.erase(std::hash<std::string>()(path)); }

  // A path as failures are written down; nothing for one outside of the share's directory.
  std::optional<std::string> PlaceOf(const std::string& path) const;

  // What was written since the last Reset.
  void Reset();
  const Tally& tally() const { return tally_; }

 private:
  using Failure = fileindex::IndexFailure;

  std::optional<Failure> Try(const std::function<void()>& change) const;
  void Note(const std::string& path, const fileindex::Entry& entry, Failure failure);
  void Done(const std::string& path);
  void SendAll(Json::Value items);

  const fileindex::IndexScope& scope_;
  fileindex::IndexFailures& failures_;
  RecentReads recent_reads_;
  Tally tally_;
  std::unordered_set<size_t> fresh_;  // hashes: a share may have millions of paths
};

}  // namespace quarrox::fileindexd
