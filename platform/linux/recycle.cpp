#include "vexo/recycle.h"

#include <sys/stat.h>

#include <cerrno>
#include <string>
#include <string_view>

#include "linux/failure.h"
#include "linux/share_list.h"

namespace {

constexpr char kHomes[] = "homes";
constexpr char kHomeBin[] = "#recycle";

// Whether a path is another, or lies below it.
bool IsIn(std::string_view path, std::string_view directory) {
  return path.starts_with(directory) && (path.size() == directory.size() || path[directory.size()] == '/');
}

bool IsDirectory(const std::string& path) {
  const int error = errno;
  struct stat info;
  const bool found = stat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode);
  errno = error;
  return found;
}

}  // namespace

int VEXOShareIsShareRecycle(const char* full_path) {
  const auto list = platform::Shares();
  if (list == nullptr) return -1;
  const platform::Share* const share = list->FindByPath(full_path);
  if (share == nullptr) return VEXO_FAILURE(VEXO_ERR_NO_SUCH_SHARE);
  return !share->recycle.empty() && IsIn(full_path, share->path + "/" + share->recycle) ? 1 : 0;
}

int VEXORecycleUserHomePathIsExist(const char* full_path, int users) {
  const auto list = platform::Shares();
  if (list == nullptr) return -1;
  const platform::Share* const homes = list->FindByName(kHomes);
  if (homes == nullptr) return VEXO_FAILURE(VEXO_ERR_NO_SUCH_SHARE);
  const std::string_view path = full_path;
  if ((users & (VEXO_USERS_LOCAL | VEXO_USERS_DOMAIN | VEXO_USERS_LDAP)) == 0 || !IsIn(path, homes->path)) return 0;
  const size_t user = homes->path.size() + 1;
  const size_t user_end = path.find('/', user);
  if (user_end == std::string_view::npos || user_end == user) return 0;
  for (const std::string& name : {std::string(kHomeBin), homes->recycle}) {
    const std::string bin = std::string(path.substr(0, user_end)) + "/" + name;
    if (!name.empty() && IsIn(path, bin) && IsDirectory(bin)) return 1;
  }
  return 0;
}
