// Copying and moving single files.
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

enum { VEXO_COPY_MODE_COPY = 0, VEXO_COPY_MODE_MOVE = 1 };

typedef struct {
  int mode; /* VEXO_COPY_MODE_* */
} VEXO_COPY_ARGS;

/* Copies or moves one regular file over what is at `to`, with contents, mode, times and, where permitted, owner. The
 * target appears whole or not at all. 0 on success; -1 with errno on failure, both files then as they were.
 * Thread-safe. */
int VEXOFileCopy(const char* from, const char* to, const VEXO_COPY_ARGS* args);

#ifdef __cplusplus
}
#endif
