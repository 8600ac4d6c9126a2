#include "support/fake_platform/fake_platform.h"

#include <strings.h>
#include <unistd.h>

#include <algorithm>
#include <cstdarg>
#include <cstring>
#include <stdexcept>

#include "support/fake_platform/call.h"
#include "support/fake_platform/rules.h"
#include "vexo/acl.h"
#include "vexo/content_extract.h"
#include "vexo/exec.h"
#include "vexo/file_copy.h"
#include "vexo/notifyd.h"
#include "vexo/path_compose.h"
#include "vexo/quota.h"
#include "vexo/recycle.h"
#include "vexo/service.h"
#include "vexo/share.h"
#include "vexo/smb.h"
#include "vexo/unicode.h"
#include "vexo/user.h"

struct VLIBC_SZLIST {
  std::vector<std::string> texts = {};
};

using std::to_string;
using namespace quarrox::support;

namespace {

FakePlatform& world = FakePlatform::Get();

struct LastError {
  int number = VEXO_ERR_NONE;
  const char* file = "";
  int line = 0;
};
thread_local LastError last;

struct ShareRecord : FakeShare, VEXO_SHARE {
  explicit ShareRecord(const FakeShare& from)
      : FakeShare(from), VEXO_SHARE{name.c_str(), path.c_str(), ftp_privilege, 0} {}
};

struct UserRecord : FakeUser, VEXO_USER {
  explicit UserRecord(const FakeUser& from)
      : FakeUser(from), VEXO_USER{FakeUser::name.data(), from.uid, from.gid, FakeUser::home.data()} {}
};

std::string NameOf(const VEXO_SHARE* share) {
  return share == nullptr ? "" : share->szName;
}

const FakeShare& SourceOf(const VEXO_SHARE* share) {
  return share ? *static_cast<const ShareRecord*>(share) : throw int{VEXO_ERR_BAD_PARAMETER};
}

int Size(const VLIBC_SZLIST* list) {
  return static_cast<int>(list->texts.size());
}

int Append(VLIBC_SZLIST* list, const std::vector<std::string>& texts) {
  list->texts.insert(list->texts.end(), texts.begin(), texts.end());
  return static_cast<int>(texts.size());
}

int List(VLIBC_SZLIST* list, int (*filter)(const VEXO_SHARE* share)) {
  std::vector<std::string> names;
  for (const FakeShare& share : world.shares) {
    const ShareRecord record(share);
    if (filter(&record) == 0) names.push_back(share.name);
  }
  return Append(list, names);
}

int Privilege(FakeShare share, const FakeUser& user) {
  return std::min(share.privileges[user.name],
                  int{share.read_only ? VEXO_SHARE_PRIV_READ : VEXO_SHARE_PRIV_READ_WRITE});
}

int PutShare(const FakeShare& share, char* name, size_t name_size, char* path, size_t path_size) {
  if (share.name.size() >= name_size || share.path.size() >= path_size) throw int{VEXO_ERR_BUFFER_TOO_SMALL};
  return Put(share.name, name, name_size) + Put(share.path, path, path_size);
}

bool Become(FakeUser user, bool groups) {
  if (!groups) user.groups = world.effective_user().groups;
  world.Become(user);
  return true;
}

int Copy(const char* from, const char* to, int mode) {
  std::error_code error;
  mode == VEXO_COPY_MODE_MOVE ? fs::rename(from, to, error)
                              : void(fs::copy_file(from, to, fs::copy_options::overwrite_existing, error));
  return error ? Give(&errno, error.value(), -1) : 0;
}

bool Register(const Json::Value& config) {
  if (!IsMonitor(config)) throw int{VEXO_ERR_BAD_PARAMETER};
  const fs::path dir = fs::path(QueueOf(config)).parent_path();
  const fs::path volume = dir.parent_path().parent_path();
  if (volume.has_relative_path() && Exists(volume)) fs::create_directories(dir);
  world.monitors[QueueOf(config)] = config;
  return true;
}

void Merge(const std::string& path, Json::Value& document) {
  if (!world.documents.contains(path)) throw int{VEXO_ERR_SYSTEM};
  for (const auto& name : world.documents[path].getMemberNames()) document[name] = world.documents[path][name];
}

}  // namespace

#define PROPERTY(function, member) \
  INT(function, (const VEXO_SHARE* share, int* value), Give(value, SourceOf(share).member), NameOf(share))
PROPERTY(VLIBShareRecycleStatusGet, recycle)
PROPERTY(VLIBShareIsEncryptionGet, encryption)
PROPERTY(VLIBShareIsEncryptedGet, locked)
PROPERTY(VLIBShareIsReadOnlyGet, read_only)
PROPERTY(VLIBShareHideUnreadableGet, hide_unreadable)
CALL(int, VEXOShareGet, (const char* name, VEXO_SHARE** share), Give(share, nullptr, -1),
     Give(share, new ShareRecord(Share(name))), name)
CALL(void, VEXOShareFree, (VEXO_SHARE * share), void(), delete static_cast<ShareRecord*>(share), NameOf(share))
INT(VLIBShareEnum, (VLIBC_SZLIST * *list, int (*filter)(const VEXO_SHARE*)), List(*list, filter))
INT(VLIBShareConfigCheck, (VLIBC_SZLIST * *list), Append(*list, world.share_problems))
INT(VEXOShareUserPrivCalc, (const char* user, const VEXO_SHARE* share), Privilege(SourceOf(share), User(user)), user,
    NameOf(share))
INT(VEXOShareNamePathGet, (const char* full_path, char* name, size_t name_size, char* path, size_t path_size),
    PutShare(ShareOf(full_path), name, name_size, path, path_size), full_path)
INT(VEXOShareIsShareRecycle, (const char* path), InRecycle(ShareOf(path), path), path)
INT(VEXORecycleUserHomePathIsExist, (const char* path, int users), InHomeRecycle(Share("homes").path, path), path,
    to_string(users))
INT(FILEIDXGetIndexID, (const char* name, char* id, size_t size), Put(IndexId(name), id, size), name)
INT(FILEIDXDBPathCompose, (const char* share, char* path, size_t size), Put(Compose(share, "db"), path, size), share)
INT(FILEIDXQueuePathCompose, (const char* share, char* path, size_t size), Put(Compose(share, "queue"), path, size),
    share)

CALL(VLIBC_SZLIST*, VLIBCSzListAlloc, (size_t size), nullptr, new VLIBC_SZLIST, to_string(size))
INT(VLIBCSzListPush, (VLIBC_SZLIST * *list, const char* text), (Append(*list, {text}), Size(*list)), text)
CALL(void, VLIBCSzListFree, (VLIBC_SZLIST * list), void(), delete list)
PLAIN(const char*, VLIBCSzListGet, (const VLIBC_SZLIST* list, int index),
      index >= 0 && index < Size(list) ? list->texts[static_cast<size_t>(index)].c_str() : nullptr)

CALL(int, VEXOUserGet, (const char* name, VEXO_USER** user), Give(user, nullptr, -1),
     Give(user, new UserRecord(User(name))), name)
CALL(int, VEXOUserGetByUID, (uid_t uid, VEXO_USER** user), Give(user, nullptr, -1),
     Give(user, new UserRecord(Find(world.users, &FakeUser::uid, uid, VEXO_ERR_NO_SUCH_USER))), to_string(uid))
CALL(void, VEXOUserFree, (VEXO_USER * user), void(), delete static_cast<UserRecord*>(user), user ? user->name : "")
INT(VLIBGroupIsAdminGroupMem, (const char* name, int flags), User(name).admin, name, to_string(flags))
INT(VEXOServiceHomePathGet, (const char* name, char* path, size_t size), Put(HomeOf(User(name)), path, size), name)
CALL(bool, ResetCredentialsByName, (const char* name, bool groups), false, Become(User(name), groups), name,
     to_string(groups))
PLAIN(uid_t, geteuid, () noexcept, world.effective_user().uid)
PLAIN(gid_t, getegid, () noexcept, world.effective_user().gid)

CALL(int, VEXOACLPermGet, (const char* path, unsigned int* permission), Give(permission, 0, -1),
     Give(permission, VEXO_PERM_READ | VEXO_PERM_WRITE | VEXO_PERM_EXECUTE), path)
INT(VEXOFileCopy, (const char* from, const char* to, const VEXO_COPY_ARGS* args), Copy(from, to, args->mode), from, to,
    to_string(args->mode))
INT(VEXOGetFSType, (const char* path, int flags), Innermost(world.mounts, path), path, to_string(flags))
INT(VEXOFSIsRemoteFS, (int type), IsInFamily(type, VEXO_FS_NFS, VEXO_FS_SSHFS, VEXO_FS_REMOTE), to_string(type))
INT(VEXOFSIsImageFS, (int type), IsInFamily(type, VEXO_FS_ISO9660, VEXO_FS_SQUASHFS, VEXO_FS_IMAGE), to_string(type))
INT(VEXOFSDirIsMntPoint, (const char* path), IsMountPoint(path), path)
INT(VLIBFhsPathInSnapshot, (const char* path, int* in_snapshot), Give(in_snapshot, InSnapshot(path)), path)
INT(VEXOEAIsHiddenDir, (const char* name), strcmp(name, "@eaDir") == 0 || strcmp(name, "@fileindex") == 0, name)
CALL(int, VEXOQuotaIsEnough, (unsigned int uid, const char* path, unsigned long long bytes, int flags), 0,
     Enough(Innermost(world.rooms, path)), to_string(uid), path, to_string(bytes), to_string(flags))
INT(VLIBServiceRestart, (const char* name), 0, name)
INT(VLIBServiceStart, (const char* name, int wait), 0, name, to_string(wait))
INT(VLIBServicectlStart, (const char* name, int kind), 0, name, to_string(kind))
INT(VLIBServicectlStop, (const char* name, int kind), 0, name, to_string(kind))
INT(VEXOSMBIsEnableSpotlight, (), world.spotlight)
INT(VEXOSMBSetSpotlight, (int enable), Give(&world.spotlight, enable != 0), to_string(enable))
PLAIN(int, VLIBCUnicodeUTF8StrCaseCmp, (const char* a, const char* b), strcasecmp(a, b))
PLAIN(int, VLIBCErrGet, (), last.number)
PLAIN(const char*, VLIBCErrFileGet, (), last.file)
PLAIN(int, VLIBCErrLineGet, (), last.line)
PLAIN(void, VLIBCErrSetAt, (int error, const char* file, int line), void(last = {error, basename(file), line}))

#define EXEC(function, last_parameter, parameters, ...)                            \
  int function parameters {                                                        \
    std::vector<std::string> texts = {__VA_ARGS__};                                \
    va_list rest;                                                                  \
    va_start(rest, last_parameter);                                                \
    while (const char* text = va_arg(rest, const char*)) texts.emplace_back(text); \
    va_end(rest);                                                                  \
    return Answer<int>(                                                            \
        #function, texts, [] { return 0; }, [] { return -1; });                    \
  }
EXEC(VLIBCExec, path, (const char* path, ...), path)
EXEC(VLIBCExecl, flags, (const char* path, int flags, ...), path, to_string(flags))

namespace VEXO::VEXONOTIFYD {
MonitorQueue::MonitorQueue(const Json::Value& config) : config_(config) {}
CALL(bool, MonitorQueue::Upsert, (const MonitorQueue& queue, const std::string& application, MONITOR_QUEUE_TYPE type),
     false, Register(queue.config_), QueueOf(queue.config_), application, to_string(type))
CALL(bool, MonitorQueue::Delete, (const std::string& queue, const std::string& application, MONITOR_QUEUE_TYPE type),
     false, world.monitors.erase(queue) <= 1, queue, application, to_string(type))
}  // namespace VEXO::VEXONOTIFYD

namespace VEXO::CONTENT_EXTRACT {
CALL(void, ParseFile, (const std::string& path, const Json::Value& options, Json::Value& document),
     throw std::runtime_error("cannot look at " + path), Merge(path, document), path, options["need_meta"].asString())
PLAIN(std::string, LastFailure, (), world.last_read_failure)
PLAIN(Json::Value, ReaderFeatures, (), Json::Value(Json::objectValue))
}  // namespace VEXO::CONTENT_EXTRACT

namespace quarrox::support {

FakePlatform& FakePlatform::Get() {
  static FakePlatform platform;
  return platform;
}

size_t FakePlatform::CountCalls(const std::string& function) const {
  const auto is_of = [&](const std::string& call) { return call.starts_with(function + "("); };
  return static_cast<size_t>(std::ranges::count_if(calls_, is_of));
}

void FakePlatform::Begin(const std::string& function, const std::vector<std::string>& arguments) {
  std::string texts;
  for (const std::string& argument : arguments) texts += (texts.empty() ? "" : ", ") + argument;
  if (on_call) on_call(function);
  calls_.push_back(function + "(" + texts + ")");
  const auto fault = faults_.find(function);
  if (fault == faults_.end()) return;
  errno = fault->second.second;
  throw fault->second.first;
}

}  // namespace quarrox::support
