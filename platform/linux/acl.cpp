#include "vexo/acl.h"

#include <fcntl.h>
#include <unistd.h>

// The kernel judges access control lists itself, so it is asked for each right.
int VEXOACLPermGet(const char* path, unsigned int* permission) {
  *permission = 0;
  if (faccessat(AT_FDCWD, path, F_OK, AT_EACCESS) != 0) return -1;
  if (faccessat(AT_FDCWD, path, R_OK, AT_EACCESS) == 0) *permission |= VEXO_PERM_READ;
  if (faccessat(AT_FDCWD, path, W_OK, AT_EACCESS) == 0) *permission |= VEXO_PERM_WRITE;
  if (faccessat(AT_FDCWD, path, X_OK, AT_EACCESS) == 0) *permission |= VEXO_PERM_EXECUTE;
  return 0;
}
