// Texts for people.
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/* Compares two UTF-8 texts without regard to case, by Unicode's full case folding: negative, 0 or positive, as strcmp.
 * Texts that are no UTF-8 are compared all the same, always in the same order. Thread-safe. */
int VLIBCUnicodeUTF8StrCaseCmp(const char* a, const char* b);

#ifdef __cplusplus
}
#endif
