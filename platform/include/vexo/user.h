// The platform's users.
#pragma once

#include <sys/types.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef struct {
  char* name; /* login name, zero-terminated */
  uid_t uid;
  gid_t gid;  /* primary group */
  char* home; /* home directory, zero-terminated */
} VEXO_USER;

/* Looks a user up by login name. On success 0, with *user a new record that the caller gives to VEXOUserFree. -1 where
 * there is no such user or the directory cannot be asked, *user then NULL; VLIBCErrGet tells which. Not thread-safe:
 * callers hold the process-wide platform mutex. */
int VEXOUserGet(const char* name, VEXO_USER** user);

/* Releases a record; NULL is allowed. */
void VEXOUserFree(VEXO_USER* user);

#ifdef __cplusplus
}
#endif
