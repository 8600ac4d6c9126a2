// Which paths of a share are to be indexed, and how.
#pragma once

#include <sys/types.h>

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "fileindex/folder_mgr.h"
#include "index_handler_kinds.h"

namespace quarrox::fileindexd {

// A path is indexed where a folder covers it and nothing speaks against it. A folder counts also while its record says
// that it is paused: whoever pauses a share ends its worker first, and starts it before the records are unmarked;
// taking the paths of a paused folder for not indexed would then empty the index.
//
// It holds the share and the folder list as they were when they were last read. Not thread-safe.
class IndexScope {
 public:
  explicit IndexScope(std::string share) : share_(std::move(share)) {}

  // Reads both. Throws Error 800 where the share is gone, 502 where its directory is not there, 903 where the share is
  // encrypted and locked: nothing may be concluded from what is not on the disk then. Throws what FolderMgr throws.
  void Read();

  // Throws Error 502 where the share's directory is not the one that Read() found: its disk went away.
  void CheckDirectory() const;

  const std::string& share() const { return share_; }
  const std::string& directory() const { return directory_; }

  // Whether a folder covers the path.
  bool Covers(const std::string& path) const { return folders_->IsFullPathIndexed(path); }

  // Whether the path is to be in the index. Throws Error 502 or 800 where that cannot be told.
  bool Accepts(const std::string& path) const;

  // The same for an entry, other than a directory, of a directory that is accepted.
  static bool AcceptsEntry(const std::string& name, mode_t mode);

  // Whether what is in the file is to be in the index, too.
  bool NeedsMeta(const std::string& path) const { return folders_->IsFullPathNeedMeta(path); }

  // The folders of the share, and the file beside its index that takes them.
  const FolderKinds& kinds() const { return kinds_; }
  const std::string& kinds_file() const { return kinds_file_; }

  // Where walks begin that together meet everything covered at a path and below it, each once.
  std::vector<std::string> Starts(const std::string& path) const;

 private:
  const std::string share_;
  std::string directory_;
  dev_t device_ = 0;
  ino_t inode_ = 0;
  std::unique_ptr<fileindex::FolderMgr> folders_;
  FolderKinds kinds_;
  std::string kinds_file_;
};

}  // namespace quarrox::fileindexd
