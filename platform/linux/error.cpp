#include "vexo/error.h"

#include <cstring>

namespace {

struct LastError {
  int number = VEXO_ERR_NONE;
  const char* file = "";
  int line = 0;
};

thread_local LastError last;

}  // namespace

int VLIBCErrGet(void) {
  return last.number;
}

const char* VLIBCErrFileGet(void) {
  return last.file;
}

int VLIBCErrLineGet(void) {
  return last.line;
}

void VLIBCErrSetAt(int error, const char* file, int line) {
  const char* slash = strrchr(file, '/');
  last = {error, slash == nullptr ? file : slash + 1, line};
}
