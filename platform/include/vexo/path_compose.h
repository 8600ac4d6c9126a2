// Where a share's index and its event queue lie.
//
// Each call writes a zero-terminated text into the caller's buffer of `size` bytes. Results: 0, or -1 with the buffer
// untouched where the text does not fit (VEXO_ERR_BUFFER_TOO_SMALL) or the argument is no share's name or path
// (VEXO_ERR_BAD_PARAMETER). Nothing is made on disk and nothing need exist. Thread-safe.
#pragma once

#include <stddef.h>

#ifdef __cplusplus
extern "C" {
#endif

/* The identifier of a share's index in the search engine: "fileindex_" and the share's name, unchanged. */
int FILEIDXGetIndexID(const char* share_name, char* id, size_t size);

/* The directory of a share's index, on the share's own volume, from the share's directory. */
int FILEIDXDBPathCompose(const char* share_path, char* path, size_t size);

/* The file into which a share's events are written, on the share's own volume, from the share's directory. */
int FILEIDXQueuePathCompose(const char* share_path, char* path, size_t size);

#ifdef __cplusplus
}
#endif
