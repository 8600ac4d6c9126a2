#include "vexo/quota.h"

#include <sys/statvfs.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <memory>

#include "linux/accounts.h"
#include "linux/mounts.h"
#include "linux/quota_room.h"
#include "vexo/error.h"

namespace {

int Fail(int error) {
  VLIBCErrSet(error);
  return 0;
}

enum class Answer { kEnough, kExceeded, kUnknown };

bool HasRoom(const struct statvfs& info, unsigned long long bytes) {
  // Some file systems do not count: tmpfs without a limit, many of FUSE.
  if (info.f_blocks == 0 || info.f_frsize == 0) return true;
  return info.f_bavail >= bytes / info.f_frsize + (bytes % info.f_frsize != 0 ? 1 : 0);
}

// The one or two quotas that count for a write are those of its user and of its group.
Answer AskQuota(const platform::Mount& mount, int type, unsigned int id, unsigned long long bytes) {
  dqblk quota = {};
  const int command = static_cast<int>(QCMD(static_cast<unsigned int>(Q_GETQUOTA), static_cast<unsigned int>(type)));
  if (quotactl(command, mount.source.c_str(), static_cast<int>(id), reinterpret_cast<caddr_t>(&quota)) != 0) {
    // Anything but these says that there is no quota: switched off, not in the kernel, none on such a source.
    return errno == EPERM || errno == EACCES || errno == EIO ? Answer::kUnknown : Answer::kEnough;
  }
  return platform::QuotaHasRoom(quota, bytes, time(nullptr)) ? Answer::kEnough : Answer::kExceeded;
}

// Whose quotas count. False where the user is not known.
bool Owners(unsigned int uid, uid_t* user, gid_t* group) {
  *user = geteuid();
  *group = getegid();
  if (uid == 0 || uid == *user) return true;
  platform::Account account;
  if (!platform::FindAccount(static_cast<uid_t>(uid), &account)) return false;
  *user = account.uid;
  *group = account.gid;
  return true;
}

Answer AskQuotas(const platform::Mount& mount, unsigned int uid, unsigned long long bytes) {
  uid_t user;
  gid_t group;
  if (!Owners(uid, &user, &group)) return Answer::kUnknown;
  if (user == 0) return Answer::kEnough;  // the kernel excepts root
  if (mount.user_quota) {
    if (const Answer answer = AskQuota(mount, USRQUOTA, user, bytes); answer != Answer::kEnough) return answer;
  }
  return mount.group_quota ? AskQuota(mount, GRPQUOTA, group, bytes) : Answer::kEnough;
}

}  // namespace

namespace platform {

// As the kernel judges a write: what would go past a limit is refused, up to the limit it is not.
bool QuotaHasRoom(const dqblk& quota, unsigned long long bytes, time_t now) {
  const bool grace_over = quota.dqb_btime != 0 && static_cast<uint64_t>(now) >= quota.dqb_btime;
  for (const uint64_t blocks : {quota.dqb_bhardlimit, grace_over ? quota.dqb_bsoftlimit : 0}) {
    if (blocks == 0 || blocks > UINT64_MAX / QIF_DQBLKSIZE) continue;
    const uint64_t limit = blocks * QIF_DQBLKSIZE;
    if (quota.dqb_curspace > limit || bytes > limit - quota.dqb_curspace) return false;
  }
  return true;
}

}  // namespace platform

int VEXOQuotaIsEnough(unsigned int uid, const char* path, unsigned long long bytes, int /*flags*/) {
  struct statvfs info;
  std::shared_ptr<const platform::Mount> mount;
  if (statvfs(path, &info) != 0 || platform::FindMount(path, &mount) != 0) return Fail(VEXO_ERR_SYSTEM);
  if (!HasRoom(info, bytes)) return Fail(VEXO_ERR_VOLUME_FULL);
  if (mount == nullptr || (!mount->user_quota && !mount->group_quota)) return 1;
  switch (AskQuotas(*mount, uid, bytes)) {
    case Answer::kEnough:
      return 1;
    case Answer::kExceeded:
      return Fail(VEXO_ERR_QUOTA_EXCEEDED);
    default:
      return Fail(VEXO_ERR_SYSTEM);
  }
}
