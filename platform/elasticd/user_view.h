// The file system as one user sees it.
#pragma once

#include <sys/stat.h>
#include <sys/types.h>

#include <optional>
#include <string>
#include <vector>

#include "common/peer.h"

namespace quarrox::elasticd {

// The kernel is asked as the user, so access lists and whatever else decides count, too. While the object lives, its
// thread has the user's groups; only while it looks has it the user's own rights and none of root's. To be used and
// destroyed by the thread that made it.
class UserView {
 public:
  // Throws Error 612 where the process may not act as the user.
  explicit UserView(const Identity& user);
  ~UserView();
  UserView(const UserView&) = delete;
  UserView& operator=(const UserView&) = delete;

  // Whether the user may look for names that they know in a directory.
  bool MayEnter(const std::string& directory) const;

  // What stands at a path, if the user may open it for reading. Nothing that a symbolic link on the way leads to; of a
  // link at the end, the link itself.
  std::optional<struct stat> Look(const std::string& path) const;

 private:
  class Acting;

  const uid_t own_user_;
  const gid_t own_group_;
  const uid_t user_;
  const bool changes_;  // not where the process is the user's own
  std::vector<gid_t> own_groups_;
};

}  // namespace quarrox::elasticd
