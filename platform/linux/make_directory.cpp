#include "linux/make_directory.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "common/strings.h"
#include "common/unique_fd.h"

using quarrox::UniqueFd;

namespace platform {
namespace {

bool SyncParent(const std::string& path) {
  const std::string parent = quarrox::Dirname(path) + "/";
  const UniqueFd fd(open(parent.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  return fd && fsync(fd.get()) == 0;
}

bool MakeOne(const std::string& path, mode_t mode, const Owner& owner) {
  if (mkdir(path.c_str(), 0700) != 0) return errno == EEXIST;
  const UniqueFd fd(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  if (!fd) return false;
  // Only root may give files away; a directory that is the process's own serves as well.
  if (fchown(fd.get(), owner.user, owner.group) != 0 && errno != EPERM) return false;
  return fchmod(fd.get(), mode) == 0 && SyncParent(path);
}

}  // namespace

bool MakeDirectory(const std::string& path, mode_t mode, const Owner& owner) {
  for (size_t end = path.find('/', 1); end != std::string::npos; end = path.find('/', end + 1)) {
    if (path[end - 1] != '/' && !MakeOne(path.substr(0, end), mode, owner)) return false;
  }
  if (!MakeOne(path, mode, owner)) return false;
  struct stat info;
  if (stat(path.c_str(), &info) != 0) return false;
  errno = S_ISDIR(info.st_mode) ? errno : ENOTDIR;
  return S_ISDIR(info.st_mode);
}

}  // namespace platform
