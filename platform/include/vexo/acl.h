// What the process may do with a file.
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

enum {
  VEXO_PERM_EXECUTE = 1, /* for a directory: enter */
  VEXO_PERM_WRITE = 2,
  VEXO_PERM_READ = 4
};

/* The rights that the effective user has on a path, access control lists included, as VEXO_PERM_* bits. 0 on success;
 * -1 with errno where the path cannot be looked at, *permission then 0. Thread-safe. */
int VEXOACLPermGet(const char* path, unsigned int* permission);

#ifdef __cplusplus
}
#endif
