#include "linux/accounts.h"

#include <grp.h>
#include <pwd.h>

#include <cerrno>

#include "vexo/error.h"

namespace platform {
namespace {

// A group's entry holds the names of all its members; a source that asks for more than this is broken.
constexpr size_t kMaxEntrySize = size_t{64} << 20;

// Calls one of the name service's look-ups with a buffer that grows until the entry fits. Its result, 0 or an error
// number.
template <typename LookUp>
int AskWithBuffer(std::vector<char>* buffer, const LookUp& look_up) {
  int result = ERANGE;
  for (size_t size = 4096; result == ERANGE && size <= kMaxEntrySize; size *= 2) {
    buffer->resize(size);
    result = look_up(buffer->data(), buffer->size());
  }
  return result;
}

template <typename LookUp>
bool Find(Account* account, const LookUp& look_up) {
  std::vector<char> buffer;
  passwd entry;
  passwd* found = nullptr;
  const int result =
      AskWithBuffer(&buffer, [&](char* data, size_t size) { return look_up(&entry, data, size, &found); });
  if (found != nullptr) {
    *account = {entry.pw_name, entry.pw_uid, entry.pw_gid, entry.pw_dir};
    return true;
  }
  // Some sources tell with an error what others tell with no entry.
  if (result != 0 && result != ENOENT && result != ESRCH) {
    errno = result;
    VLIBCErrSet(VEXO_ERR_SYSTEM);
  } else {
    VLIBCErrSet(VEXO_ERR_NO_SUCH_USER);
  }
  return false;
}

}  // namespace

bool FindAccount(const char* name, Account* account) {
  return Find(account, [&](passwd* entry, char* data, size_t size, passwd** found) {
    return getpwnam_r(name, entry, data, size, found);
  });
}

bool FindAccount(uid_t uid, Account* account) {
  return Find(account, [&](passwd* entry, char* data, size_t size, passwd** found) {
    return getpwuid_r(uid, entry, data, size, found);
  });
}

std::vector<gid_t> GroupsOf(const Account& account) {
  std::vector<gid_t> groups(64);
  for (;;) {
    int count = static_cast<int>(groups.size());
    const int result = getgrouplist(account.name.c_str(), account.gid, groups.data(), &count);
    const size_t wanted = static_cast<size_t>(count);
    if (result >= 0) {
      groups.resize(wanted);
      return groups;
    }
    // The list may have grown since it was counted.
    groups.resize(wanted > groups.size() ? wanted : groups.size() * 2);
  }
}

bool FindGroup(const char* name, gid_t* gid) {
  std::vector<char> buffer;
  group entry;
  group* found = nullptr;
  AskWithBuffer(&buffer, [&](char* data, size_t size) { return getgrnam_r(name, &entry, data, size, &found); });
  if (found != nullptr) *gid = entry.gr_gid;
  return found != nullptr;
}

}  // namespace platform
