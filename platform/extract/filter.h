// Programs that make text of a format.
#pragma once

#include <sys/types.h>

#include <span>
#include <string>
#include <string_view>

#include "common/unique_fd.h"
#include "extract/pieces.h"

namespace platform::extract {

// What the program reads: the file itself, on its standard input, or a copy of it, which it opens again by the name of
// its standard input, kInputName. Where it is confined to what it was given it can open nothing else.
enum class Input { kFile, kCopy };
inline constexpr const char* kInputName = "/proc/self/fd/0";

// Runs a program while its output is read; it is killed where that ends before. What it says of errors is not heard.
class Filter {
 public:
  // `command` is a whole path and arguments. Throws std::system_error; EFBIG where a file is too long to be copied.
  Filter(const Source& source, Input input, std::span<const char* const> command);
  ~Filter();
  Filter(const Filter&) = delete;
  Filter& operator=(const Filter&) = delete;

  // The next part of its output; empty at the end. Throws std::runtime_error where it ended otherwise than well.
  std::string_view Piece();

 private:
  void CheckEnd(int status) const;
  int Wait();  // its status

  std::string program_;
  pid_t pid_ = -1;
  quarrox::UniqueFd output_;
  std::string buffer_;
};

}  // namespace platform::extract
