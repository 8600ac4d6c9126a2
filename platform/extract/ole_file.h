// The container of the office formats before 2007: named streams in one file.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace platform::extract {

// A number in `size` bytes, the least first. Throws std::runtime_error past the end.
uint64_t LittleEndian(std::string_view bytes, uint64_t at, size_t size);

// Thread-safe. The bytes must stay.
class OleFile {
 public:
  // Throws std::runtime_error where the bytes are no such file, or damaged.
  explicit OleFile(std::string_view bytes);

  // Streams are known by names of ASCII letters.
  bool Has(std::string_view name) const { return !Entry(name).empty(); }

  // At most `limit` bytes from the beginning of a stream; nothing where there is none. Throws std::runtime_error.
  std::string Read(std::string_view name, uint64_t limit) const;

 private:
  std::string_view Entry(std::string_view name) const;
  std::string_view Sector(uint64_t number) const;
  std::string Chain(uint64_t start, uint64_t limit) const;

  std::string_view bytes_;
  uint64_t sector_size_;
  std::string tables_;  // the sectors that tell for each sector which one goes on with it
  std::string directory_;
};

}  // namespace platform::extract
