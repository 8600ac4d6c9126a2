#include "vexo/share.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>
#include <string>
#include <vector>

#include "linux/failure.h"
#include "linux/share_list.h"

namespace {

// Looks at one bit of a share.
int StatusGet(const VEXO_SHARE* share, unsigned int bit, int* value) {
  if (share == nullptr) return VEXO_FAILURE(VEXO_ERR_BAD_PARAMETER);
  *value = (share->status & bit) != 0 ? 1 : 0;
  return 0;
}

}  // namespace

int VEXOShareGet(const char* name, VEXO_SHARE** share) {
  *share = nullptr;
  const auto list = platform::Shares();
  if (list == nullptr) return -1;
  const platform::Share* found = list->FindByName(name);
  if (found == nullptr) return VEXO_FAILURE(VEXO_ERR_NO_SUCH_SHARE);
  // One block: the record, then its two texts.
  const size_t name_size = found->name.size() + 1;
  const size_t path_size = found->path.size() + 1;
  void* const block = malloc(sizeof(VEXO_SHARE) + name_size + path_size);
  if (block == nullptr) return VEXO_FAILURE(VEXO_ERR_SYSTEM);
  char* const texts = static_cast<char*>(block) + sizeof(VEXO_SHARE);
  memcpy(texts, found->name.c_str(), name_size);
  memcpy(texts + name_size, found->path.c_str(), path_size);
  *share = new (block) VEXO_SHARE{texts, texts + name_size, 0, found->status};
  return 0;
}

void VEXOShareFree(VEXO_SHARE* share) {
  free(share);
}

int VLIBShareEnum(VLIBC_SZLIST** list, int (*filter)(const VEXO_SHARE* share)) {
  const auto shares = platform::Shares();
  if (shares == nullptr) return -1;
  int count = 0;
  for (const platform::Share& share : shares->shares()) {
    const VEXO_SHARE record = {share.name.c_str(), share.path.c_str(), 0, share.status};
    if (filter(&record) != 0) continue;
    if (VLIBCSzListPush(list, share.name.c_str()) < 0) return -1;
    ++count;
  }
  return count;
}

int VLIBShareConfigCheck(VLIBC_SZLIST** list) {
  std::string failure;
  const auto shares = platform::Shares(&failure);
  const std::vector<std::string> problems = shares != nullptr ? shares->problems() : std::vector{failure};
  for (const std::string& problem : problems) {
    if (VLIBCSzListPush(list, problem.c_str()) < 0) return -1;
  }
  return static_cast<int>(problems.size());
}

int VLIBShareRecycleStatusGet(const VEXO_SHARE* share, int* value) {
  return StatusGet(share, platform::kShareRecycle, value);
}

int VLIBShareIsEncryptionGet(const VEXO_SHARE* share, int* value) {
  return StatusGet(share, platform::kShareEncryption, value);
}

int VLIBShareIsEncryptedGet(const VEXO_SHARE* share, int* value) {
  return StatusGet(share, platform::kShareLocked, value);
}

int VLIBShareIsReadOnlyGet(const VEXO_SHARE* share, int* value) {
  return StatusGet(share, platform::kShareReadOnly, value);
}

int VLIBShareHideUnreadableGet(const VEXO_SHARE* share, int* value) {
  return StatusGet(share, platform::kShareHideUnreadable, value);
}

int VEXOShareNamePathGet(const char* full_path, char* name, size_t name_size, char* path, size_t path_size) {
  const auto list = platform::Shares();
  if (list == nullptr) return -1;
  const platform::Share* found = list->FindByPath(full_path);
  if (found == nullptr) return VEXO_FAILURE(VEXO_ERR_NO_SUCH_SHARE);
  if (found->name.size() >= name_size || found->path.size() >= path_size)
    return VEXO_FAILURE(VEXO_ERR_BUFFER_TOO_SMALL);
  memcpy(name, found->name.c_str(), found->name.size() + 1);
  memcpy(path, found->path.c_str(), found->path.size() + 1);
  return 0;
}
