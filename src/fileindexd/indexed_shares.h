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

  struct Share {
    bool is_served = false;  // one of its folders at least is not paused, or only by itself
    size_t paused = 0;       // folders
  };

  // By name.
  const std::map<std::string, Share>& shares() const { return shares_; }

 private:
  std::optional<struct stat> seen_;
  std::map<std::string, Share> shares_;
};

}  // namespace quarrox::fileindexd
