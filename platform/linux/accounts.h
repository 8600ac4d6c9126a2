// Users and groups from every source that the machine's name service knows.
//
// Thread-safe. A call that fails sets the platform's error: VEXO_ERR_NO_SUCH_USER, or VEXO_ERR_SYSTEM with errno where
// the name service cannot be asked.
#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace platform {

struct Account {
  std::string name;
  uid_t uid = 0;
  gid_t gid = 0;  // primary group
  std::string home;
};

// False where there is none; *account is then as it was.
bool FindAccount(const char* name, Account* account);
bool FindAccount(uid_t uid, Account* account);

// All groups of an account, each once, its primary one included.
std::vector<gid_t> GroupsOf(const Account& account);

// Whether there is a group of this name; *gid is then its number. Never fails: a name service that cannot be asked
// knows no group.
bool FindGroup(const char* name, gid_t* gid);

}  // namespace platform
