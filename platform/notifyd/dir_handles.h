// Finds the directories that fanotify names by file handle.
//
// Opened directories are kept, at most kMaxOpen, so that a further event in the same directory costs no lookup. A path
// is always read anew, because directories move. Not thread-safe.
#pragma once

#include <string>
#include <unordered_map>

#include "common/unique_fd.h"
#include "identity.h"

namespace quarrox::notifyd {

class DirHandles {
 public:
  static constexpr size_t kMaxOpen = 512;

  enum class State {
    kFound,
    kGone,    // the directory was deleted; its parent's events say so
    kFailed,  // it could not be told, because of a lack of memory or descriptors or a broken disk
  };

  // `dir` is on the mount whose handles these are. Throws Error 502 where it cannot be opened.
  explicit DirHandles(const std::string& dir);

  // Whether this process may open directories by handle here; errno says why not.
  bool Works();

  // The present path of the directory with this handle: bytes of handle_type, then of f_handle.
  State Locate(const std::string& handle, std::string& path);

  // A descriptor (O_PATH) of the directory, valid until the next call; negative, errno set, where there is none.
  int Open(const std::string& handle);

  // Closes everything, so that nothing holds the mount busy, until it is needed again.
  void Clear();
  bool empty() const { return open_.empty() && !mount_; }

 private:
  int Mount();
  bool OpenMount();

  UniqueFd mount_;
  std::string dir_;
  Identity identity_;
  std::unordered_map<std::string, UniqueFd> open_;
  bool too_long_logged_ = false;
};

}  // namespace quarrox::notifyd
