#include "vexo/user.h"

#include <pwd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "vexo/error.h"

namespace {

int Fail(int error) {
  VLIBCErrSet(error);
  return -1;
}

}  // namespace

int VEXOUserGet(const char* name, VEXO_USER** user) {
  *user = nullptr;
  std::vector<char> buffer(4096);
  passwd entry;
  passwd* found = nullptr;
  int result;
  while ((result = getpwnam_r(name, &entry, buffer.data(), buffer.size(), &found)) == ERANGE) {
    buffer.resize(buffer.size() * 2);
  }
  if (result != 0) {
    errno = result;
    return Fail(VEXO_ERR_SYSTEM);
  }
  if (found == nullptr) return Fail(VEXO_ERR_NO_SUCH_USER);
  auto* record = static_cast<VEXO_USER*>(calloc(1, sizeof(VEXO_USER)));
  if (record == nullptr) return Fail(VEXO_ERR_SYSTEM);
  *record = {strdup(entry.pw_name), entry.pw_uid, entry.pw_gid, strdup(entry.pw_dir)};
  if (record->name == nullptr || record->home == nullptr) {
    VEXOUserFree(record);
    return Fail(VEXO_ERR_SYSTEM);
  }
  *user = record;
  return 0;
}

void VEXOUserFree(VEXO_USER* user) {
  if (user == nullptr) return;
  free(user->name);
  free(user->home);
  free(user);
}
