// Shares: directories that the machine offers under a name.
//
// Not thread-safe: callers hold the process-wide platform mutex for each call. Names are bytes, compared exactly, of at
// most 255 bytes. The list of shares is read again when its source has changed; a record that was handed out stays
// as it was. A call that opens, lists or finds a share sets VEXO_ERR_BAD_CONFIG where the list cannot be read at all.
#pragma once

#include <stddef.h>

#include "vexo/szlist.h"

#ifdef __cplusplus
extern "C" {
#endif

enum {
  VEXO_SHARE_NAME_SIZE = 492,  // a buffer that holds every share name with its terminating zero
  VEXO_PATH_SIZE = 4096        // a buffer that holds every path (PATH_MAX)
};

// What a user may do in a share, by VEXOShareUserPrivCalc.
enum { VEXO_SHARE_PRIV_NONE = 0, VEXO_SHARE_PRIV_READ = 1, VEXO_SHARE_PRIV_READ_WRITE = 2 };

typedef struct VEXO_SHARE {
  const char* szName;   // as it is configured, zero-terminated
  const char* szPath;   // its directory on the volume: absolute, no trailing or doubled slash, no "." or ".."
  int ftpPrivilege;     // restrictions that an FTP service puts on the share; 0 is none
  unsigned int status;  // for the calls below
} VEXO_SHARE;

/* Opens a share by name. On success 0, with *share a new record that the caller gives to VEXOShareFree. -1 where there
 * is no such share (VEXO_ERR_NO_SUCH_SHARE), *share then NULL. */
int VEXOShareGet(const char* name, VEXO_SHARE** share);

/* Releases a record; NULL is allowed. */
void VEXOShareFree(VEXO_SHARE* share);

/* Appends to *list the name of every share for which `filter` returns 0, in the order of the configuration. The number
 * of names appended, or -1. `filter` gets a record that is valid for the call only; it may not call the platform. */
int VLIBShareEnum(VLIBC_SZLIST** list, int (*filter)(const VEXO_SHARE* share));

/* Appends to *list one text for each thing that is wrong in the configuration of shares: which file, which line, what,
 * and what to do; one text where the list cannot be read at all. The number of texts appended, or -1. */
int VLIBShareConfigCheck(VLIBC_SZLIST** list);

/* Properties of a share; each 0 with *value 1 or 0, or -1 (VEXO_ERR_BAD_PARAMETER where share is NULL). */
int VLIBShareRecycleStatusGet(const VEXO_SHARE* share, int* value);  /* deleted files go to a recycle bin */
int VLIBShareIsEncryptionGet(const VEXO_SHARE* share, int* value);   /* the share's directory is encrypted on disk */
int VLIBShareIsEncryptedGet(const VEXO_SHARE* share, int* value);    /* ... and locked: its files cannot be read now */
int VLIBShareIsReadOnlyGet(const VEXO_SHARE* share, int* value);     /* clients may not write */
int VLIBShareHideUnreadableGet(const VEXO_SHARE* share, int* value); /* clients do not see what they may not read */

/* What a user may do in a share, as VEXO_SHARE_PRIV_*: by the rights on its directory, access control lists and the
 * user's groups included, and by the share's being read-only. -1 where there is no such user (VEXO_ERR_NO_SUCH_USER) or
 * the directory cannot be looked at (VEXO_ERR_SYSTEM). */
int VEXOShareUserPrivCalc(const char* user, const VEXO_SHARE* share);

/* The share that holds a path: of shares in one another the innermost. The path is taken as a text, by whole
 * components; nothing on it need exist. Fills both buffers with zero-terminated texts, the share's name and its own
 * directory. 0, or -1 where no share holds the path (VEXO_ERR_NO_SUCH_SHARE) or a buffer is too small
 * (VEXO_ERR_BUFFER_TOO_SMALL); the buffers are then untouched. */
int VEXOShareNamePathGet(const char* full_path, char* name, size_t name_size, char* path, size_t path_size);

#ifdef __cplusplus
}
#endif
