#include "vexo/file_copy.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "common/unique_fd.h"

using quarrox::UniqueFd;

namespace {

bool WriteAll(int fd, const char* data, size_t size) {
  while (size > 0) {
    const ssize_t n = write(fd, data, size);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return false;
    data += n;
    size -= static_cast<size_t>(n);
  }
  return true;
}

bool CopyByBuffer(int from, int to) {
  char buffer[65536];
  for (;;) {
    const ssize_t n = read(from, buffer, sizeof(buffer));
    if (n == 0) return true;
    if (n < 0 && errno == EINTR) continue;
    if (n < 0 || !WriteAll(to, buffer, static_cast<size_t>(n))) return false;
  }
}

bool CopyContents(int from, int to) {
  constexpr size_t kStep = size_t{1} << 30;
  for (bool first = true;; first = false) {
    const ssize_t n = copy_file_range(from, nullptr, to, nullptr, kStep, 0);
    // Some file systems cannot, or answer 0 at once for files without a size of their own.
    if (first && n <= 0) return CopyByBuffer(from, to);
    if (n == 0) return true;
    if (n < 0 && errno != EINTR) return false;
  }
}

bool CopyAttributes(int to, const struct stat& info) {
  // Only root may give files away; a copy that stays the copier's is one, too.
  if (fchown(to, info.st_uid, info.st_gid) != 0 && errno != EPERM) return false;
  const timespec times[2] = {info.st_atim, info.st_mtim};
  return fchmod(to, info.st_mode & 07777) == 0 && futimens(to, times) == 0;
}

bool CopyTo(int to, int from, const struct stat& info) {
  return CopyContents(from, to) && CopyAttributes(to, info) && fsync(to) == 0;
}

int Copy(const char* from, const char* to) {
  const UniqueFd source(open(from, O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  struct stat info;
  if (source.get() < 0 || fstat(source.get(), &info) != 0) return -1;
  if (!S_ISREG(info.st_mode)) {
    errno = EINVAL;
    return -1;
  }
  std::string temporary = std::string(to) + ".XXXXXX";
  const UniqueFd target(mkostemp(temporary.data(), O_CLOEXEC));
  if (target.get() < 0) return -1;
  if (CopyTo(target.get(), source.get(), info) && rename(temporary.c_str(), to) == 0) return 0;
  const int error = errno;
  unlink(temporary.c_str());
  errno = error;
  return -1;
}

}  // namespace

int VEXOFileCopy(const char* from, const char* to, const VEXO_COPY_ARGS* args) {
  if (args->mode == VEXO_COPY_MODE_COPY) return Copy(from, to);
  if (rename(from, to) == 0) return 0;
  if (errno != EXDEV) return -1;
  return Copy(from, to) == 0 ? unlink(from) : -1;
}
