#include "common/open_file.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>

namespace quarrox {

int OpenWithoutLinks(const std::string& path, int flags) {
  flags |= O_NOFOLLOW | O_CLOEXEC;
  open_how how = {};
  how.flags = static_cast<uint64_t>(flags);
  how.resolve = RESOLVE_NO_SYMLINKS;
  const long fd = syscall(SYS_openat2, AT_FDCWD, path.c_str(), &how, sizeof(how));
  return fd < 0 && errno == ENOSYS ? open(path.c_str(), flags) : static_cast<int>(fd);
}

}  // namespace quarrox
