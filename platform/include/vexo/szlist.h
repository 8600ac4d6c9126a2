// Lists of texts that the platform's calls fill.
#pragma once

#include <stddef.h>

#ifdef __cplusplus
extern "C" {
#endif

// A list of zero-terminated byte strings in the order of their insertion. The members are read through the calls below
// only. Not thread-safe.
typedef struct VLIBC_SZLIST VLIBC_SZLIST;

/* A new empty list with room for `size` bytes of text; it grows as needed. The caller gives it to VLIBCSzListFree.
 * NULL where there is no memory (VEXO_ERR_SYSTEM). */
VLIBC_SZLIST* VLIBCSzListAlloc(size_t size);

/* Releases a list; NULL is allowed. */
void VLIBCSzListFree(VLIBC_SZLIST* list);

/* The text at an index, owned by the list and valid until it changes; NULL past the end or below 0. */
const char* VLIBCSzListGet(const VLIBC_SZLIST* list, int index);

/* Appends a copy of a text. The list may move; *list is then the new one. The number of texts, or -1 (VEXO_ERR_SYSTEM)
 * with the list as it was. */
int VLIBCSzListPush(VLIBC_SZLIST** list, const char* text);

#ifdef __cplusplus
}
#endif
