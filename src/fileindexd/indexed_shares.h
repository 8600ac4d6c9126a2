// The shares that hold indexed folders, from the folder list.
#pragma once

#include <sys/stat.h>

#include <map>
#include <optional>
#include <string>

namespace quarrox::fileindexd {

// Whether the shares exist is not asked. Not thread-safe.
class IndexedShares {
 public:
  // Reads the list where its file is another one than before: each change of the list makes a new file, and a change
  // of many shares announces each of them. True where it was read. Throws what FolderMgr throws; the shares are then as
  // they were.
  bool Refresh();

  // By name; true where at least one of the share's folders is not paused.
  const std::map<std::string, bool>& shares() const { return shares_; }

 private:
  std::optional<struct stat> seen_;
  std::map<std::string, bool> shares_;
};

}  // namespace quarrox::fileindexd
