#include "common/file.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdlib>
#include <memory>

#include "common/log.h"
#include "common/mutex_lock.h"
#include "vexo/acl.h"
#include "vexo/file_copy.h"
#include "vexo/filesystem.h"
#include "vexo/user.h"

namespace quarrox {
namespace {

constexpr char kServiceUser[] = "Quarrox";
constexpr mode_t kDirectoryMode = 0755;
constexpr size_t kMaxLinkText = 4095;
constexpr int kMaxLinks = 40;  // what the kernel follows, too

bool MVFileImpl(const std::string& from, const std::string& to, int mode) {
  VEXO_COPY_ARGS args{};
  args.mode = mode;
  return 0 <= VEXOFileCopy(from.c_str(), to.c_str(), &args);
}

}  // namespace

bool IsFileExist(const std::string& path) {
  struct stat info;
  return 0 == stat(path.c_str(), &info);
}

bool IsDirExist(const std::string& path, bool follow_link) {
  std::string current = path;
  for (int links = 0; links <= kMaxLinks; ++links) {
    struct stat info;
    if (0 != lstat(current.c_str(), &info)) return false;
    if (S_ISDIR(info.st_mode)) return true;
    if (!follow_link || !S_ISLNK(info.st_mode)) return false;
    char target[kMaxLinkText];
    const ssize_t length = readlink(current.c_str(), target, sizeof(target));
    if (length < 0) return false;
    current.assign(target, static_cast<size_t>(length));
  }
  return false;
}

bool IsDirentDir(const dirent& entry, const std::string& dir) {
  if (entry.d_type != DT_UNKNOWN) return entry.d_type == DT_DIR;
  return IsDirExist(dir + "/" + entry.d_name, false);
}

bool IsMountPoint(const std::string& path) {
  return 1 == VEXOFSDirIsMntPoint(path.c_str());
}

bool CheckACLPerm(const std::string& path, unsigned int permission) {
  unsigned int granted = 0;
  return 0 <= VEXOACLPermGet(path.c_str(), &granted) && (granted & permission) == permission;
}

std::string RealPath(const std::string& path) {
  const std::unique_ptr<char, decltype(&free)> resolved(realpath(path.c_str(), nullptr), &free);
  return resolved ? resolved.get() : std::string();
}

void MakeDirectoriesOf(const std::string& path) {
  const int error = errno;
  for (size_t end = path.find('/', 1); end != std::string::npos; end = path.find('/', end + 1)) {
    const std::string directory = path.substr(0, end);
    if (mkdir(directory.c_str(), kDirectoryMode) == 0) chmod(directory.c_str(), kDirectoryMode);
  }
  errno = error;
}

bool Unlink(const std::string& path) {
  return 0 == unlink(path.c_str());
}

bool MVFile(const std::string& from, const std::string& to) {
  return MVFileImpl(from, to, VEXO_COPY_MODE_MOVE);
}

bool CPFile(const std::string& from, const std::string& to) {
  return MVFileImpl(from, to, VEXO_COPY_MODE_COPY);
}

void ChownQuarrox(const std::string& path) {
  uid_t uid = 0;
  gid_t gid = 0;
  {
    const LockMutex lock(PlatformMutex());
    VEXO_USER* user = nullptr;
    if (0 > VEXOUserGet(kServiceUser, &user) || user == nullptr) {
      QUARROX_THROW("0 > VEXOUserGet(kServiceUser, &user) || !user", kErrChown, std::string());
    }
    uid = user->uid;
    gid = user->gid;
    VEXOUserFree(user);
  }
  if (0 != chown(path.c_str(), uid, gid)) {
    QUARROX_THROW("0 != chown(path.c_str(), uid, gid)", kErrChown, std::string());
  }
}

}  // namespace quarrox
