#include "linux/mounts.h"

#include <fcntl.h>
#include <mntent.h>
#include <poll.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <fstream>
#include <initializer_list>
#include <mutex>
#include <sstream>
#include <string_view>

#include "common/unique_fd.h"
#include "linux/fs_types.h"

using quarrox::UniqueFd;

namespace platform {
namespace {

constexpr char kMountInfo[] = "/proc/self/mountinfo";

// Blanks, line ends and backslashes in names stand as a backslash and three octal digits.
std::string Unescape(const std::string& text) {
  constexpr size_t kDigits = 3;
  std::string name;
  for (size_t at = 0; at < text.size(); ++at) {
    const bool escaped = text[at] == '\\' && text.find_first_not_of("01234567", at + 1) > at + kDigits;
    if (escaped && at + kDigits < text.size()) {
      name += static_cast<char>(std::stoi(text.substr(at + 1, kDigits), nullptr, 8));
      at += kDigits;
    } else {
      name += text[at];
    }
  }
  return name;
}

bool HasAnyOption(std::string options, std::initializer_list<const char*> names) {
  mntent entry = {};
  entry.mnt_opts = options.data();
  return std::any_of(names.begin(), names.end(), [&](const char* name) { return hasmntopt(&entry, name) != nullptr; });
}

// The mount's number stands first; its type, source and options stand behind a lone "-".
bool ParseLine(const std::string& line, uint64_t* number, Mount* mount) {
  constexpr std::string_view kBetween = " - ";
  const size_t end = line.find(kBetween);
  if (end == std::string::npos || !(std::istringstream(line) >> *number)) return false;
  std::istringstream rest(line.substr(end + kBetween.size()));
  std::string source;
  std::string options;
  if (!std::getline(rest, mount->type, ' ') || !std::getline(rest, source, ' ')) return false;
  if (!std::getline(rest, options)) return false;
  mount->fs_type = FsTypeByName(mount->type);
  mount->source = Unescape(source);
  // What file systems show while they enforce quotas. XFS shows others ("uqnoenforce") where it only counts.
  mount->user_quota = HasAnyOption(options, {"usrquota", "usrjquota", "uquota", "quota"});
  mount->group_quota = HasAnyOption(options, {"grpquota", "grpjquota", "gquota"});
  return true;
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
  std::ifstream lines(file);
  if (!lines) return nullptr;
  auto table = std::make_shared<MountTable>();
  uint64_t number = 0;
  Mount mount;
  for (std::string line; std::getline(lines, line);) {
    if (ParseLine(line, &number, &mount)) table->mounts_.emplace(number, mount);
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
