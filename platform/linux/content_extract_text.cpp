#include "linux/content_extract_text.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <string_view>
#include <system_error>

#include <unicode/utf8.h>

#include "common/unique_fd.h"
#include "linux/utf8.h"

using quarrox::UniqueFd;

namespace platform {
namespace {

constexpr std::string_view kByteOrderMark = "\xef\xbb\xbf";

// One byte past the longest text tells that there is more.
constexpr size_t kLongestRead = kByteOrderMark.size() + kLongestText + 1;

[[noreturn]] void Throw(const std::string& path) {
  throw std::system_error(errno, std::generic_category(), path);
}

// Reading for the index is no use of the file, so its access time stays; only the owner and root may ask for that.
int OpenUnnoticed(const std::string& path) {
  constexpr int kFlags = O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
  const int fd = open(path.c_str(), kFlags | O_NOATIME);
  return fd < 0 && errno == EPERM ? open(path.c_str(), kFlags) : fd;
}

// What cannot be opened as it is, whoever tries again: not readable, a symbolic link, a socket, a device that is not
// there.
bool HasNoContent(int error) {
  return error == EACCES || error == EPERM || error == ELOOP || error == ENXIO || error == ENODEV;
}

// Reads up to kLongestRead bytes; false at the first zero byte.
bool ReadWithoutZeros(int fd, const std::string& path, std::string* text) {
  char buffer[65536];
  while (text->size() < kLongestRead) {
    const size_t wanted = std::min(sizeof(buffer), kLongestRead - text->size());
    const ssize_t n = read(fd, buffer, wanted);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) Throw(path);
    if (n == 0) return true;
    const std::string_view part(buffer, static_cast<size_t>(n));
    if (part.find('\0') != std::string_view::npos) return false;
    text->append(part);
  }
  return true;
}

void Cut(std::string* text) {
  if (text->size() <= kLongestText) return;
  size_t end = kLongestText;
  while (end > kLongestText - U8_MAX_LENGTH && U8_IS_TRAIL((*text)[end])) --end;
  text->resize(end);
}

}  // namespace

std::optional<std::string> ReadPlainText(const std::string& path) {
  const UniqueFd fd(OpenUnnoticed(path));
  if (!fd) {
    if (HasNoContent(errno)) return std::nullopt;
    Throw(path);
  }
  struct stat info;
  if (fstat(fd.get(), &info) != 0) Throw(path);
  if (!S_ISREG(info.st_mode)) return std::nullopt;
  std::string text;
  if (!ReadWithoutZeros(fd.get(), path, &text)) return std::nullopt;
  if (text.compare(0, kByteOrderMark.size(), kByteOrderMark) == 0) text.erase(0, kByteOrderMark.size());
  Cut(&text);
  if (!IsUtf8(text)) return std::nullopt;
  return text;
}

}  // namespace platform
