#include "extract/source.h"

#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <system_error>

namespace platform::extract {

Mapping::Mapping(const Source& source) {
  if (source.size > kLongestMapping) throw std::system_error(EFBIG, std::generic_category(), "mmap");
  if (source.size == 0) return;
  const auto size = static_cast<size_t>(source.size);
  void* const start = mmap(nullptr, size, PROT_READ, MAP_PRIVATE, source.fd, 0);
  if (start == MAP_FAILED) throw std::system_error(errno, std::generic_category(), "mmap");
  bytes_ = std::string_view(static_cast<const char*>(start), size);
}

Mapping::~Mapping() {
  if (!bytes_.empty()) munmap(const_cast<char*>(bytes_.data()), bytes_.size());
}

size_t ReadAt(const Source& source, uint64_t offset, char* buffer, size_t size) {
  size_t done = 0;
  while (done < size) {
    const ssize_t n = pread(source.fd, buffer + done, size - done, static_cast<off_t>(offset + done));
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) throw std::system_error(errno, std::generic_category(), "read");
    if (n == 0) break;
    done += static_cast<size_t>(n);
  }
  return done;
}

std::string ReadHead(const Source& source, size_t limit) {
  std::string head(static_cast<size_t>(std::min<uint64_t>(limit, source.size)), '\0');
  head.resize(ReadAt(source, 0, head.data(), head.size()));
  return head;
}

}  // namespace platform::extract
