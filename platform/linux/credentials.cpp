#include <grp.h>
#include <unistd.h>

#include <cerrno>
#include <vector>

#include "linux/accounts.h"
#include "vexo/error.h"
#include "vexo/user.h"

// All through the C library's calls, which change every thread; the kernel's own change only the one that calls. The
// real and the saved ids stay, which is what lets the process come back.
namespace {

struct Identity {
  uid_t uid;
  gid_t gid;
  std::vector<gid_t> groups;  // supplementary
};

bool ReadGroups(std::vector<gid_t>* groups) {
  const int count = getgroups(0, nullptr);
  if (count < 0) return false;
  groups->resize(static_cast<size_t>(count));
  return getgroups(count, groups->data()) == count;
}

bool BecomeRoot() {
  return geteuid() == 0 || seteuid(0) == 0;
}

// From root. The user last: without root's rights the groups could no longer be set.
bool Take(const Identity& identity, bool groups) {
  return (!groups || setgroups(identity.groups.size(), identity.groups.data()) == 0) && setegid(identity.gid) == 0 &&
         seteuid(identity.uid) == 0;
}

}  // namespace

bool ResetCredentialsByName(const char* name, bool groups) {
  platform::Account account;
  if (!platform::FindAccount(name, &account)) return false;
  Identity before = {geteuid(), getegid(), {}};
  const bool is_already = before.uid == account.uid && before.gid == account.gid;
  if (is_already && !groups) return true;
  const Identity target = {account.uid, account.gid, platform::GroupsOf(account)};
  if (ReadGroups(&before.groups) && BecomeRoot()) {
    if (Take(target, groups)) return true;
    // Still root, as the user is taken last.
    const int error = errno;
    Take(before, groups);
    errno = error;
  }
  if (is_already) return true;
  VLIBCErrSet(VEXO_ERR_NOT_PERMITTED);
  return false;
}
