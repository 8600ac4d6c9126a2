// The platform's users and groups, and whom the process acts as.
//
// Not thread-safe: callers hold the process-wide platform mutex. Users and groups come from every source that the
// machine's name service knows.
#pragma once

#include <stddef.h>
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

/* Looks a user up by login name or by number. On success 0, with *user a new record that the caller gives to
 * VEXOUserFree. -1 where there is no such user (VEXO_ERR_NO_SUCH_USER) or the name service cannot be asked
 * (VEXO_ERR_SYSTEM), *user then NULL. */
int VEXOUserGet(const char* name, VEXO_USER** user);
int VEXOUserGetByUID(uid_t uid, VEXO_USER** user);

/* Releases a record; NULL is allowed. */
void VEXOUserFree(VEXO_USER* user);

/* 1 where a user is an administrator, 0 where not, -1 where there is no such user (VEXO_ERR_NO_SUCH_USER). `flags` is
 * 0. */
int VLIBGroupIsAdminGroupMem(const char* name, int flags);

/* The directory of a user's home: the one in the share "homes" where that exists, else what the name service says. 0,
 * or -1 where there is no such user (VEXO_ERR_NO_SUCH_USER) or the text does not fit into `size` bytes with its
 * terminating zero (VEXO_ERR_BUFFER_TOO_SMALL); the buffer is then untouched. */
int VEXOServiceHomePathGet(const char* name, char* path, size_t size);

#ifdef __cplusplus
}

/* Makes a user the effective one of the whole process: user and group, and with `groups` the supplementary groups, too.
 * Works from any effective user as long as the process was started as root; a user that the process already is can
 * always be taken. True, or false with everything as it was: no such user (VEXO_ERR_NO_SUCH_USER), or the process may
 * not (VEXO_ERR_NOT_PERMITTED). Every thread changes with it. */
bool ResetCredentialsByName(const char* name, bool groups);
#endif
