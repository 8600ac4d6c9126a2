#include "vexo/user.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "linux/accounts.h"
#include "linux/failure.h"
#include "linux/share_list.h"

using platform::Account;

namespace {

int MakeRecord(const Account& account, VEXO_USER** user) {
  auto* record = static_cast<VEXO_USER*>(calloc(1, sizeof(VEXO_USER)));
  if (record == nullptr) return VEXO_FAILURE(VEXO_ERR_SYSTEM);
  *record = {strdup(account.name.c_str()), account.uid, account.gid, strdup(account.home.c_str())};
  if (record->name == nullptr || record->home == nullptr) {
    VEXOUserFree(record);
    return VEXO_FAILURE(VEXO_ERR_SYSTEM);
  }
  *user = record;
  return 0;
}

bool IsAdministrator(const Account& account) {
  if (account.uid == 0) return true;
  for (const char* name : {"administrators", "sudo", "wheel"}) {
    gid_t group;
    if (!platform::FindGroup(name, &group)) continue;
    const std::vector<gid_t> groups = platform::GroupsOf(account);
    return std::find(groups.begin(), groups.end(), group) != groups.end();
  }
  return false;
}

// A user's directory in the share "homes"; empty where there is none.
std::string HomeInShare(const platform::ShareList& shares, const std::string& name) {
  const platform::Share* homes = shares.FindByName("homes");
  // No account's name may lead out of the share.
  if (homes == nullptr || name.find('/') != std::string::npos || name == "." || name == "..") return "";
  std::string path = homes->path + "/" + name;
  struct stat info;
  return stat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode) ? path : "";
}

}  // namespace

int VEXOUserGet(const char* name, VEXO_USER** user) {
  *user = nullptr;
  Account account;
  return platform::FindAccount(name, &account) ? MakeRecord(account, user) : -1;
}

int VEXOUserGetByUID(uid_t uid, VEXO_USER** user) {
  *user = nullptr;
  Account account;
  return platform::FindAccount(uid, &account) ? MakeRecord(account, user) : -1;
}

void VEXOUserFree(VEXO_USER* user) {
  if (user == nullptr) return;
  free(user->name);
  free(user->home);
  free(user);
}

int VLIBGroupIsAdminGroupMem(const char* name, int /*flags*/) {
  Account account;
  if (!platform::FindAccount(name, &account)) return -1;
  return IsAdministrator(account) ? 1 : 0;
}

int VEXOServiceHomePathGet(const char* name, char* path, size_t size) {
  Account account;
  if (!platform::FindAccount(name, &account)) return -1;
  const auto shares = platform::Shares();
  if (shares == nullptr) return -1;
  std::string home = HomeInShare(*shares, name);
  if (home.empty()) home = account.home;
  if (home.size() >= size) return VEXO_FAILURE(VEXO_ERR_BUFFER_TOO_SMALL);
  memcpy(path, home.c_str(), home.size() + 1);
  return 0;
}
