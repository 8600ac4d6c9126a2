#include "dir_handles.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <climits>
#include <cstddef>
#include <cstring>

#include "common/error.h"
#include "common/log.h"
#include "common/watchdog.h"

namespace quarrox::notifyd {
namespace {

constexpr std::string_view kDeletedSuffix = " (deleted)";

// Room for any handle, aligned as the kernel's structure is.
union HandleBuffer {
  file_handle handle;
  char bytes[sizeof(file_handle) + MAX_HANDLE_SZ];
};

int OpenHandle(int mount, const std::string& key) {
  HandleBuffer buffer = {};
  const size_t size = key.size() - sizeof(buffer.handle.handle_type);
  if (size > MAX_HANDLE_SZ) return errno = EINVAL, -1;
  buffer.handle.handle_bytes = static_cast<unsigned>(size);
  memcpy(buffer.bytes + offsetof(file_handle, handle_type), key.data(), key.size());
  return open_by_handle_at(mount, &buffer.handle, O_PATH | O_CLOEXEC | O_DIRECTORY);
}

std::string DescriptorPath(int fd) {
  return "/proc/self/fd/" + std::to_string(fd);
}

// A deleted directory's path ends in kDeletedSuffix; so may a living one's, which then leads to that directory.
bool IsDeleted(int fd, const std::string& path) {
  if (!path.ends_with(kDeletedSuffix)) return false;
  struct stat held = {};
  struct stat there = {};
  if (fstat(fd, &held) != 0 || lstat(path.c_str(), &there) != 0) return true;
  return held.st_dev != there.st_dev || held.st_ino != there.st_ino;
}

bool ReadPath(int fd, std::string& path) {
  const std::string link = DescriptorPath(fd);
  char buffer[PATH_MAX];
  const ssize_t size = readlink(link.c_str(), buffer, sizeof(buffer));
  if (size < 0) return false;
  path.assign(buffer, static_cast<size_t>(size));
  return true;
}

}  // namespace

DirHandles::DirHandles(const std::string& dir) : dir_(dir) {
  if (OpenMount() && Identify(dir, identity_)) return;
  const std::string why = strerror(errno);
  throw Error(kErrSystem, "The directory to watch cannot be opened, path=" + dir + ", reason=" + why);
}

bool DirHandles::OpenMount() {
  mount_ = UniqueFd(open(dir_.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  return static_cast<bool>(mount_);
}

// A descriptor of the mount; negative where the mount is gone, errno then says that the handles mean nothing any more.
int DirHandles::Mount() {
  if (mount_) return mount_.get();
  Identity now;
  const bool same = OpenMount() && Identify(DescriptorPath(mount_.get()), now) && now.mount == identity_.mount &&
                    now.device == identity_.device;
  if (same || (!mount_ && errno != ENOENT && errno != ENOTDIR)) return mount_.get();
  mount_ = UniqueFd();
  return errno = ESTALE, -1;
}

bool DirHandles::Works() {
  HandleBuffer buffer = {};
  buffer.handle.handle_bytes = MAX_HANDLE_SZ;
  int mount_id = 0;
  const int mount = Mount();
  if (name_to_handle_at(mount, "", &buffer.handle, &mount_id, AT_EMPTY_PATH) != 0) return false;
  return static_cast<bool>(UniqueFd(open_by_handle_at(mount, &buffer.handle, O_PATH | O_CLOEXEC | O_DIRECTORY)));
}

void DirHandles::Clear() {
  open_.clear();
  mount_ = UniqueFd();
}

int DirHandles::Open(const std::string& handle) {
  const auto found = open_.find(handle);
  if (found != open_.end()) return found->second.get();
  if (open_.size() >= kMaxOpen) open_.clear();
  const int mount = Mount();
  if (mount < 0) return -1;
  Watchdog::OfProcess().Alive();
  int fd = OpenHandle(mount, handle);
  if (fd < 0 && (errno == EMFILE || errno == ENFILE || errno == ENOMEM)) {
    open_.clear();
    fd = OpenHandle(mount, handle);
  }
  if (fd >= 0) open_.emplace(handle, UniqueFd(fd));
  return fd;
}

DirHandles::State DirHandles::Locate(const std::string& handle, std::string& path) {
  const int fd = Open(handle);
  if (fd < 0) return errno == ESTALE || errno == ENOENT ? State::kGone : State::kFailed;
  if (ReadPath(fd, path)) return IsDeleted(fd, path) ? State::kGone : State::kFound;
  if (errno != ENAMETOOLONG) return State::kFailed;
  // No reader could open such a path either, so what happens there concerns nobody.
  if (!too_long_logged_)
    QUARROX_LOG_FAILURE("Directories with paths too long to open are ignored, below=%s", dir_.c_str());
  too_long_logged_ = true;
  return State::kGone;
}

}  // namespace quarrox::notifyd
