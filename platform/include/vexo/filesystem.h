// File systems and what is mounted where.
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/* 1 where a file system is mounted at the path (a bind mount counts), 0 where none is, -1 with errno where the path
 * cannot be looked at. A symbolic link is not followed. Thread-safe. */
int VEXOFSDirIsMntPoint(const char* path);

#ifdef __cplusplus
}
#endif
