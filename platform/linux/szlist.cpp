#include "vexo/szlist.h"

#include <cerrno>
#include <cstring>
#include <exception>
#include <new>
#include <vector>

#include "vexo/error.h"

// The texts one after the other, each with its zero byte, and where each begins.
struct VLIBC_SZLIST {
  std::vector<char> texts;
  std::vector<size_t> starts;
};

namespace {

// What the containers throw, as the callers of C know it.
int NoMemory() {
  errno = ENOMEM;
  VLIBCErrSet(VEXO_ERR_SYSTEM);
  return -1;
}

}  // namespace

VLIBC_SZLIST* VLIBCSzListAlloc(size_t size) {
  auto* const list = new (std::nothrow) VLIBC_SZLIST;
  try {
    if (list != nullptr) list->texts.reserve(size);
  } catch (const std::exception&) {
    delete list;
    NoMemory();
    return nullptr;
  }
  if (list == nullptr) NoMemory();
  return list;
}

void VLIBCSzListFree(VLIBC_SZLIST* list) {
  delete list;
}

const char* VLIBCSzListGet(const VLIBC_SZLIST* list, int index) {
  if (index < 0 || static_cast<size_t>(index) >= list->starts.size()) return nullptr;
  return list->texts.data() + list->starts[static_cast<size_t>(index)];
}

int VLIBCSzListPush(VLIBC_SZLIST** list, const char* text) {
  VLIBC_SZLIST& target = **list;
  const size_t start = target.texts.size();
  try {
    target.texts.insert(target.texts.end(), text, text + strlen(text) + 1);
    target.starts.push_back(start);
  } catch (const std::exception&) {
    target.texts.resize(start);
    return NoMemory();
  }
  return static_cast<int>(target.starts.size());
}
