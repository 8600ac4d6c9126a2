#include "linux/mounts.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <initializer_list>
#include <mutex>

#include <libmount/libmount.h>

#include "common/unique_fd.h"
#include "linux/fs_types.h"

using quarrox::UniqueFd;

namespace platform {
namespace {

constexpr char kMountInfo[] = "/proc/self/mountinfo";

std::string Text(const char* text) {
  return text != nullptr ? text : "";
}

bool HasAnyOption(const std::string& options, std::initializer_list<const char*> names) {
  for (const char* name : names) {
    if (mnt_optstr_get_option(options.c_str(), name, nullptr, nullptr) == 0) return true;
  }
  return false;
}

// What file systems show while they enforce quotas. XFS shows others ("uqnoenforce") where it only counts.
Mount ToMount(libmnt_fs* entry) {
  Mount mount;
  mount.type = Text(mnt_fs_get_fstype(entry));
  mount.fs_type = FsTypeByName(mount.type);
  mount.source = Text(mnt_fs_get_source(entry));
  const std::string options = Text(mnt_fs_get_fs_options(entry));
  mount.user_quota = HasAnyOption(options, {"usrquota", "usrjquota", "uquota", "quota"});
  mount.group_quota = HasAnyOption(options, {"grpquota", "grpjquota", "gquota"});
  return mount;
}

// Knows the table as it is now. Thread-safe.
class MountWatch {
 public:
  std::shared_ptr<const MountTable> Table() {
    const std::lock_guard lock(mutex_);
    if (table_ == nullptr || pid_ != getpid() || HasChanged()) ReadTable();
    return table_;
  }

  std::shared_ptr<const MountTable> FreshTable() {
    const std::lock_guard lock(mutex_);
    pid_ = 0;  // for a process that has gone over into another mount namespace
    ReadTable();
    return table_;
  }

 private:
  // The kernel tells each opening of the file once that something changed. A child process shares its parent's opening,
  // in which one takes the other's news away, so it opens the file itself.
  bool HasChanged() const {
    pollfd request = {events_.get(), POLLPRI, 0};
    return poll(&request, 1, 0) != 0;
  }

  // Opened before it is read, so that no change falls between.
  void ReadTable() {
    if (pid_ != getpid()) events_ = UniqueFd(open(kMountInfo, O_RDONLY | O_CLOEXEC));
    pid_ = getpid();
    table_ = events_ ? MountTable::Read(kMountInfo) : nullptr;
  }

  std::mutex mutex_;
  UniqueFd events_;
  pid_t pid_ = 0;
  std::shared_ptr<const MountTable> table_;
};

}  // namespace

std::shared_ptr<const MountTable> MountTable::Read(const char* file) {
  const std::unique_ptr<libmnt_table, void (*)(libmnt_table*)> parsed(mnt_new_table(), mnt_unref_table);
  const std::unique_ptr<libmnt_iter, void (*)(libmnt_iter*)> iterator(mnt_new_iter(MNT_ITER_FORWARD), mnt_free_iter);
  if (parsed == nullptr || iterator == nullptr) return nullptr;
  if (const int result = mnt_table_parse_file(parsed.get(), file); result != 0) {
    errno = result < 0 ? -result : EIO;
    return nullptr;
  }
  auto table = std::make_shared<MountTable>();
  libmnt_fs* entry = nullptr;
  while (mnt_table_next_fs(parsed.get(), iterator.get(), &entry) == 0) {
    table->mounts_.emplace(static_cast<uint64_t>(mnt_fs_get_id(entry)), ToMount(entry));
  }
  return table;
}

const Mount* MountTable::Find(uint64_t mount_id) const {
  const auto found = mounts_.find(mount_id);
  return found != mounts_.end() ? &found->second : nullptr;
}

int FindMount(const char* path, std::shared_ptr<const Mount>* mount) {
  static MountWatch watch;
  mount->reset();
  struct statx info;
  // What a server would say of the file's size and times is not waited for.
  if (statx(AT_FDCWD, path, AT_STATX_DONT_SYNC, STATX_MNT_ID, &info) != 0) return -1;
  if ((info.stx_mask & STATX_MNT_ID) == 0) return 0;
  const int error = errno;
  std::shared_ptr<const MountTable> table = watch.Table();
  const Mount* found = table != nullptr ? table->Find(info.stx_mnt_id) : nullptr;
  if (found == nullptr) {
    table = watch.FreshTable();
    found = table != nullptr ? table->Find(info.stx_mnt_id) : nullptr;
  }
  if (found != nullptr) *mount = {table, found};
  errno = error;
  return 0;
}

}  // namespace platform
