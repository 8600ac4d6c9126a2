#include "common/sdk/share.h"

#include <cstdio>
#include <memory>

#include "common/log.h"
#include "vexo/error.h"
#include "vexo/path_compose.h"
#include "vexo/quota.h"
#include "vexo/share.h"
#include "vexo/szlist.h"

namespace quarrox::sdk {
namespace {

constexpr size_t kIndexIDSize = 1024;
constexpr size_t kNameListSize = 1024;
constexpr unsigned long long kRoomForIndex = 104857600;  // 100 MiB

int EnumEveryShare(VLIBC_SZLIST** list) {
  return VLIBShareEnum(list, [](const VEXO_SHARE*) { return 0; });
}

// Asks a composer once and keeps its text.
template <size_t kSize, typename Compose>
bool Composed(std::string& cache, const Compose& compose) {
  if (!cache.empty()) return true;
  char text[kSize] = {};
  {
    const LockMutex lock(SDKMutex());
    if (0 > compose(text, sizeof(text))) return false;
  }
  cache = text;
  return true;
}

// Asks for a property of a share; false where the call fails.
template <typename Get>
bool Ask(const Get& get, const VEXO_SHARE* share, int* value) {
  const LockMutex lock(SDKMutex());
  return 0 <= get(share, value);
}

// Collects the texts that `fill` appends to a list. Throws Error 121 in the name of the call that failed.
std::vector<std::string> Texts(int (*fill)(VLIBC_SZLIST**), const char* function, const char* condition,
                               const char* reason) {
  const LockMutex lock(SDKMutex());
  VLIBC_SZLIST* share_list = VLIBCSzListAlloc(kNameListSize);
  if (share_list == nullptr) {
    QUARROX_THROW_IN(function, "nullptr == (share_list = VLIBCSzListAlloc(BUFSIZ))", kErrShareEnum,
                     "VLIBCSzListAlloc failed");
  }
  const int count = fill(&share_list);
  const std::unique_ptr<VLIBC_SZLIST, decltype(&VLIBCSzListFree)> owner(share_list, &VLIBCSzListFree);
  if (0 > count) QUARROX_THROW_IN(function, condition, kErrShareEnum, reason);
  std::vector<std::string> texts;
  for (int i = 0; i < count; ++i) texts.emplace_back(VLIBCSzListGet(share_list, i));
  return texts;
}

}  // namespace

Mutex& SDKMutex() {
  return PlatformMutex();
}

SDKShare::SDKShare(const std::string& share_name) : name_(share_name) {
  const LockMutex lock(SDKMutex());
  // A call would take a name with a zero byte for what is before it: another share.
  const bool is_name = share_name.find('\0') == std::string::npos;
  if (!is_name || 0 > VEXOShareGet(share_name.c_str(), &share_info_) || share_info_ == nullptr) {
    QUARROX_THROW("0 > VEXOShareGet(share_name.c_str(), &share_info_) || !share_info_", kErrNoSuchShare, share_name);
  }
}

SDKShare::~SDKShare() {
  const LockMutex lock(SDKMutex());
  VEXOShareFree(share_info_);
}

std::set<std::string> SDKShare::Enum() {
  const std::vector<std::string> names =
      Texts(&EnumEveryShare, __func__, "0 > VLIBShareEnum(&share_list, &enum_func)", "VLIBShareEnum failed");
  return {names.begin(), names.end()};
}

std::vector<std::string> SDKShare::ConfigProblems() {
  return Texts(&VLIBShareConfigCheck, __func__, "0 > VLIBShareConfigCheck(&share_list)", "VLIBShareConfigCheck failed");
}

std::string SDKShare::GetPath() const {
  return share_info_->szPath;
}

std::string SDKShare::GetDBName() const {
  if (!Composed<kIndexIDSize>(
          db_name_, [this](char* name, size_t size) { return FILEIDXGetIndexID(share_info_->szName, name, size); })) {
    QUARROX_THROW("0 > FILEIDXGetIndexID(share_info_->szName, name, sizeof(name))", kErrSystem,
                  "FILEIDXGetIndexID failed, share=" + name_);
  }
  return db_name_;
}

std::string SDKShare::GetDBPath() const {
  if (!Composed<VEXO_PATH_SIZE>(db_path_, [this](char* path, size_t size) {
        return FILEIDXDBPathCompose(share_info_->szPath, path, size);
      })) {
    QUARROX_THROW("0 > FILEIDXDBPathCompose(share_info_->szPath, path, sizeof(path))", kErrSystem,
                  "FILEIDXDBPathCompose failed, share=" + name_);
  }
  return db_path_;
}

std::string SDKShare::GetQueuePath() const {
  if (!Composed<VEXO_PATH_SIZE>(queue_path_, [this](char* path, size_t size) {
        return FILEIDXQueuePathCompose(share_info_->szPath, path, size);
      })) {
    QUARROX_THROW("0 > FILEIDXQueuePathCompose(share_info_->szPath, path, sizeof(path))", kErrSystem,
                  "FILEIDXQueuePathCompose failed, share=" + name_);
  }
  return queue_path_;
}

bool SDKShare::IsEnableRecycleBin() const {
  int is_enabled = 0;
  if (!Ask(&VLIBShareRecycleStatusGet, share_info_, &is_enabled)) {
    QUARROX_THROW("0 > VLIBShareRecycleStatusGet(share_info_, &is_enabled)", kErrSystem,
                  "VLIBShareRecycleStatusGet failed, share=" + name_);
  }
  return is_enabled == 1;
}

bool SDKShare::IsEncryption() const {
  int is_encryption = 0;
  if (!Ask(&VLIBShareIsEncryptionGet, share_info_, &is_encryption)) {
    QUARROX_THROW("0 > VLIBShareIsEncryptionGet(share_info_, &is_encryption)", kErrSystem,
                  "VLIBShareIsEncryptionGet failed, share=" + name_);
  }
  return is_encryption == 1;
}

// The two reasons below spell the platform's functions with small letters in the middle. This is wanted: they are
// known so.
bool SDKShare::IsLocked() const {
  int is_encrypted = 0;
  if (!Ask(&VLIBShareIsEncryptedGet, share_info_, &is_encrypted)) {
    QUARROX_THROW_IN("CanBeIndexed", "0 > VLIBShareIsEncryptedGet(share_info_, &is_encrypted)", kErrSystem,
                     "VLIBShareis_encryptedGet failed, share=" + name_);
  }
  return is_encrypted != 0;
}

bool SDKShare::IsReadOnly() const {
  int is_readonly = 0;
  if (!Ask(&VLIBShareIsReadOnlyGet, share_info_, &is_readonly)) {
    QUARROX_THROW_IN("CanBeIndexed", "0 > VLIBShareIsReadOnlyGet(share_info_, &is_readonly)", kErrSystem,
                     "VLIBShareis_readonlyGet failed, share=" + name_);
  }
  return is_readonly != 0;
}

bool SDKShare::CanBeIndexed() const {
  const bool locked = IsLocked();  // both are asked, whatever the first says
  const bool read_only = IsReadOnly();
  return !locked && !read_only;
}

bool SDKShare::IsSpaceEnough() const {
  const LockMutex lock(SDKMutex());
  if (VEXOQuotaIsEnough(0, share_info_->szPath, kRoomForIndex, 0) != 0) return true;
  const int error = VLIBCErrGet();
  return error != VEXO_ERR_VOLUME_FULL && error != VEXO_ERR_QUOTA_EXCEEDED;
}

bool SDKShare::IsHideUnReadable() const {
  int hide = 0;
  return Ask(&VLIBShareHideUnreadableGet, share_info_, &hide) && hide == 1;
}

int SDKShare::GetFTPPrivilege() const {
  return share_info_->ftpPrivilege;
}

int SDKShare::GetPrivilege(const std::string& user) const {
  const auto known = privileges_.find(user);
  if (known != privileges_.end()) return known->second;
  const LockMutex lock(SDKMutex());
  return privileges_[user] = VEXOShareUserPrivCalc(user.c_str(), share_info_);
}

}  // namespace quarrox::sdk
