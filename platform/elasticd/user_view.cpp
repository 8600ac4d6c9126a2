#include "user_view.h"

#include <fcntl.h>
#include <sys/fsuid.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cstdlib>

#include "common/log.h"
#include "common/open_file.h"
#include "common/unique_fd.h"
#include "error_code.h"

namespace quarrox::elasticd {
namespace {

constexpr auto kNobodysId = static_cast<uid_t>(-1);

// The library's own function changes all threads.
bool SetGroups(const std::vector<gid_t>& groups) {
  return syscall(SYS_setgroups, groups.size(), groups.data()) == 0;
}

std::vector<gid_t> Groups() {
  std::vector<gid_t> groups(64);
  for (;;) {
    const int count = getgroups(static_cast<int>(groups.size()), groups.data());
    if (count >= 0) {
      groups.resize(static_cast<size_t>(count));
      return groups;
    }
    groups.resize(groups.size() * 2);
  }
}

// Both tell what was set before, and what is no number of anybody changes nothing.
bool HasUser(uid_t user) {
  return static_cast<uid_t>(setfsuid(kNobodysId)) == user;
}
bool HasGroup(gid_t group) {
  return static_cast<gid_t>(setfsgid(kNobodysId)) == group;
}

}  // namespace

// Leaving root's user for another one takes root's rights to files away as well, and coming back gives them back.
class UserView::Acting {
 public:
  explicit Acting(const UserView& view) : view_(view) {
    if (view.changes_) setfsuid(view.user_);
  }
  ~Acting() {
    if (view_.changes_) setfsuid(view_.own_user_);
  }
  Acting(const Acting&) = delete;
  Acting& operator=(const Acting&) = delete;

 private:
  const UserView& view_;
};

UserView::UserView(const Identity& user)
    : own_user_(geteuid()), own_group_(getegid()), user_(user.user), changes_(user.user != own_user_) {
  if (!changes_) return;
  own_groups_ = Groups();
  bool is_user = own_user_ == 0 && SetGroups(user.groups);
  if (is_user) {
    setfsgid(user.group);
    const Acting acting(*this);
    is_user = HasGroup(user.group) && HasUser(user_);
  }
  if (is_user) return;
  setfsgid(own_group_);
  if (own_user_ == 0) SetGroups(own_groups_);
  throw Error(kBadArgument,
              "The engine cannot look at files as another user: it does not run as root, or may not change");
}

// A thread that would go on with somebody else's groups is worse than no engine.
UserView::~UserView() {
  if (!changes_) return;
  setfsgid(own_group_);
  if (SetGroups(own_groups_) && HasGroup(own_group_) && HasUser(own_user_)) return;
  QUARROX_LOG_FAILURE("%s", "The engine ends: it cannot leave a user's rights");
  abort();
}

bool UserView::MayEnter(const std::string& directory) const {
  const Acting acting(*this);
  return faccessat(AT_FDCWD, directory.empty() ? "/" : directory.c_str(), X_OK, AT_EACCESS) == 0;
}

// Everybody may read a link, where they may look for its name.
std::optional<struct stat> UserView::Look(const std::string& path) const {
  const Acting acting(*this);
  const UniqueFd fd(OpenWithoutLinks(path, O_PATH));
  struct stat info;
  if (!fd || fstatat(fd.get(), "", &info, AT_EMPTY_PATH) != 0) return std::nullopt;
  if (!S_ISLNK(info.st_mode) && faccessat(fd.get(), "", R_OK, AT_EACCESS | AT_EMPTY_PATH) != 0) return std::nullopt;
  return info;
}

}  // namespace quarrox::elasticd
