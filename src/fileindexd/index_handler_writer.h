// Changes single documents of a share's index.
#pragma once

#include <sys/stat.h>

#include <functional>
#include <string>
#include <unordered_set>
#include <vector>

#include "common/error.h"
#include "index_handler_scope.h"

namespace quarrox::fileindexd {

// What is at a path, a symbolic link itself. What cannot be looked at is there, or nothing may be concluded from it.
struct Entry {
  enum Presence { kThere, kGone, kUnknown } presence = kGone;
  struct stat info = {};

  bool IsDirectory() const { return presence == kThere && S_ISDIR(info.st_mode); }
};
Entry LookAt(const std::string& path);

// What is wrong with one file is logged, and the others go on: it cannot be read, the engine does not take its
// document. Everything else is thrown: the engine is not there or has other troubles. A file that vanishes is deleted
// from the index. Not thread-safe.
class IndexWriter {
 public:
  explicit IndexWriter(const IndexScope& scope) : scope_(scope) {}

  void Upsert(const std::string& path);

  // Refreshes what the file system says. False where the index does not know the path.
  bool RefreshAttributes(const std::string& path);

  void Delete(const std::string& path);
  void DeleteWithAllBelow(const std::string& path);

  // Some known ones, with one request.
  void Delete(const std::vector<std::string>& paths);

  // Whether the path was upserted since the last Forget, and its document is still the one from then.
  bool IsFresh(const std::string& path) const { return fresh_.count(std::hash<std::string>()(path)) != 0; }
  void Forget() { fresh_.clear(); }
  void Forget(const std::string& path) { fresh_.erase(std::hash<std::string>()(path)); }

 private:
  void HandleFailure(const Error& error, const std::string& path);

  const IndexScope& scope_;
  std::unordered_set<size_t> fresh_;  // hashes: a share may have millions of paths
};

}  // namespace quarrox::fileindexd
