// The text of a response while it is made. Its beginning is kept in memory, the rest in a file that has no name, so
// that a large answer to a slow reader costs disk and not memory.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "common/unique_fd.h"

namespace quarrox::elasticd {

// One object, one thread.
class Answer {
 public:
  static constexpr size_t kInMemory = size_t{1} << 20;

  // A frame's length is 32 bits wide and counts the zero byte.
  static constexpr uint64_t kLongest = UINT32_MAX - uint64_t{1};

  // `spool_directory` takes the file. It need not exist before an answer is that large.
  explicit Answer(std::string spool_directory) : spool_directory_(std::move(spool_directory)) { Clear(); }

  // Throws Error 618 where the file cannot be written, and 612 past 4 GiB less one byte, which no frame can carry; the
  // answer is then as it was. Not logged.
  void Append(std::string_view text);

  // From now on refuses to grow past `longest` bytes, with 612 as well.
  void Limit(uint64_t longest) { longest_ = longest; }

  // Forgets everything, or what came after the first `size` bytes.
  void Clear();
  void Cut(uint64_t size);

  uint64_t size() const { return size_; }

 private:
  friend class AnswerSender;

  // What goes to the file is collected to pieces of this size.
  static constexpr size_t kPiece = 65536;

  static constexpr size_t kFrameLength = sizeof(uint32_t);

  void Open();
  void Write(std::string_view text);
  void FlushTail();

  const std::string spool_directory_;
  std::string memory_;    // begins with room for the frame's length
  UniqueFd file_;         // what follows
  uint64_t spooled_ = 0;  // the file's size
  std::string tail_;      // what follows the file
  uint64_t size_ = 0;
  uint64_t longest_ = kLongest;
};

}  // namespace quarrox::elasticd
