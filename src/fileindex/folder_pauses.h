// The folders that are paused by themselves, and until when.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "common/export.h"
#include "fileindex/folder.h"

namespace quarrox::fileindex {

inline constexpr char kFolderPausesPath[] = "/var/packages/Quarrox/etc/fileindex.pauses";

// A record says that its folder is paused; beside the list stands here which of them were paused one by one. The
// others were paused with their share, which is not served meanwhile: its index is closed, and nobody listens to what
// changes in it. An entry counts while its folder's record is in the list and paused; FolderMgr::Save drops the others.
//
// As short-lived as a FolderMgr, and changed under the same lock. Not thread-safe.
class QUARROX_API FolderPauses {
 public:
  // Reads the file. One that cannot be read is logged and holds none.
  FolderPauses();

  bool empty() const { return ends_.empty(); }

  // Until when a folder is paused by itself, in seconds since the epoch: 0 for without end; nothing where it is not.
  std::optional<int64_t> EndOf(const Folder& folder) const;

  // Whether a folder's files are not to be looked at now. A pause is over at its end, also before its record says so.
  bool IsPausedAt(const Folder& folder, int64_t now) const;

  // Whether its share is served at least for the sake of this folder.
  bool IsServed(const Folder& folder) const { return !folder.IsPaused() || EndOf(folder); }

  void Set(const std::string& path, int64_t end) { ends_[path] = end; }
  void Forget(const std::string& path) { ends_.erase(path); }
  void RenameShare(const std::string& share_from, const std::string& share_to);
  void KeepOnly(const std::vector<std::shared_ptr<Folder>>& folders);

  // Writes the file where something has changed. Throws Error 505.
  void Save() const;

 private:
  using Ends = std::map<std::string, int64_t>;

  Ends ends_;  // by the folder's path
  Ends read_;
};

}  // namespace quarrox::fileindex
