#include "vexo/error.h"

namespace {
thread_local int last_error = VEXO_ERR_NONE;
}  // namespace

int VLIBCErrGet(void) {
  return last_error;
}

void VLIBCErrSet(int error) {
  last_error = error;
}
