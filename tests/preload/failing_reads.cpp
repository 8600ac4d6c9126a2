// Loaded before the C library, makes a disk on which files and directories named bad* cannot be read while
// /run/bad_disk is there.
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#define OPEN(name)                                                                                         \
  extern "C" __attribute__((visibility("default"))) int name(const char* path, int flags, unsigned mode) { \
    const char* slash = strrchr(path, '/');                                                                \
    if (slash == nullptr || strncmp(slash, "/bad", 4) != 0 || access("/run/bad_disk", F_OK) != 0) {        \
      return static_cast<int>(syscall(SYS_open, path, flags, mode));                                       \
    }                                                                                                      \
    errno = EIO;                                                                                           \
    return -1;                                                                                             \
  }
OPEN(open)
OPEN(open64)
