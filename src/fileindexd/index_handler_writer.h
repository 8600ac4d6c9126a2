// Changes single documents of a share's index.
#pragma once

#include <sys/stat.h>

#include <functional>
#include <optional>
#include <string>
#include <unordered_set>
#include <vector>

#include "fileindex/index_failures.h"
#include "index_handler_scope.h"
#include "operation_handler.h"

namespace quarrox::fileindexd {

// What is at a path, a symbolic link itself. What cannot be looked at is there, or nothing may be concluded from it.
struct Entry {
  enum Presence { kThere, kGone, kUnknown } presence = kGone;
  struct stat info = {};
  int error = 0;  // why it cannot be looked at

  bool IsDirectory() const { return presence == kThere && S_ISDIR(info.st_mode); }
};
Entry LookAt(const std::string& path);

// What is wrong with one path is logged and written down, and the others go on: it cannot be looked at or read, the
// engine does not take its document. Everything else is thrown: the engine is not there or has other troubles. What
// cannot be read is indexed without its contents. What has failed for good is not tried again until it changes. A file
// that vanishes is deleted from the index. Not thread-safe.
class IndexWriter {
 public:
  IndexWriter(const IndexScope& scope, fileindex::IndexFailures& failures) : scope_(scope), failures_(failures) {}

  void Upsert(const std::string& path);

  // Refreshes what the file system says. False where the path is to be upserted instead: the index does not know it, or
  // something failed there before.
  bool RefreshAttributes(const std::string& path);

  void Delete(const std::string& path);
  void DeleteWithAllBelow(const std::string& path);

  // Some known ones, with one request.
  void Delete(const std::vector<std::string>& paths);

  // Moves the documents of a path and of all below it. What the engine refuses of it is logged, and is found by
  // comparing both paths. The check point is called now and then.
  void Move(const std::string& path, const std::string& path_old, const OperationHandler::CheckPoint& check_point);

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
  void Note(const std::string& path, const Entry& entry, Failure failure);
  void Done(const std::string& path);

  const IndexScope& scope_;
  fileindex::IndexFailures& failures_;
  Tally tally_;
  std::unordered_set<size_t> fresh_;  // hashes: a share may have millions of paths
};

}  // namespace quarrox::fileindexd
