// Loaded before the C library, makes a disk on which files and directories named bad* cannot be read while
// /run/bad_disk is there.
#include <dlfcn.h>
#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

// By the names of the C library, which declares them otherwise.
#define REPLACES(name) asm(name) __attribute__((visibility("default")))
extern "C" long Syscall(long number, long a, long b, long c, long d, long e, long f) REPLACES("syscall");
extern "C" int Open(const char* path, int flags, unsigned mode) REPLACES("open");
extern "C" int Open64(const char* path, int flags, unsigned mode) REPLACES("open64");

static bool IsBad(const char* path) {
  const char* const slash = strrchr(path, '/');
  if (slash == nullptr || strncmp(slash, "/bad", 4) != 0 || access("/run/bad_disk", F_OK) != 0) return false;
  errno = EIO;
  return true;
}

// What calls the kernel by its number, as for openat2, which the C library has no name for.
long Syscall(long number, long a, long b, long c, long d, long e, long f) {
  using Syscall = long (*)(long, ...);
  static const auto real = reinterpret_cast<Syscall>(dlsym(RTLD_NEXT, "syscall"));
  if (number == SYS_openat2) {
    const auto* const how = reinterpret_cast<const open_how*>(c);
    if ((how->flags & O_PATH) == 0 && IsBad(reinterpret_cast<const char*>(b))) return -1;
  }
  return real(number, a, b, c, d, e, f);
}

int Open(const char* path, int flags, unsigned mode) {
  return IsBad(path) ? -1 : openat(AT_FDCWD, path, flags, mode);
}

int Open64(const char* path, int flags, unsigned mode) {
  return Open(path, flags, mode);
}
