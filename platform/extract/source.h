// One file that is looked into.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace platform::extract {

// Where a file lies is nothing that its content can depend on, so it comes as a descriptor.
struct Source {
  int fd = -1;            // open for reading, of a regular file; its offset is anybody's
  uint64_t size = 0;      // in bytes, as the file was opened
  std::string type;       // MIME, by the first bytes: "application/pdf"
  std::string extension;  // of its name, lower case, without the dot
};

// The longest file that is looked at as a whole; what is read in order may be longer, and is read as far as its
// extractor goes. In bytes.
inline constexpr uint64_t kLongestMapping = uint64_t{256} << 20;

// A file as memory. Where the file gets shorter meanwhile, a look past its end ends the process.
class Mapping {
 public:
  // Throws std::system_error; EFBIG where the file is longer than kLongestMapping.
  explicit Mapping(const Source& source);
  ~Mapping();
  Mapping(const Mapping&) = delete;
  Mapping& operator=(const Mapping&) = delete;

  std::string_view bytes() const { return bytes_; }

 private:
  std::string_view bytes_;
};

// Reads at most `size` bytes from a place, fewer only at the end of the file. Throws std::system_error.
size_t ReadAt(const Source& source, uint64_t offset, char* buffer, size_t size);

// The file's first bytes, at most `limit` of them. Throws std::system_error.
std::string ReadHead(const Source& source, size_t limit);

}  // namespace platform::extract
