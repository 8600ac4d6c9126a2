// The text of a plain text file.
#pragma once

#include <cstddef>
#include <optional>
#include <string>

namespace platform {

// How much text of one file is kept, in bytes of UTF-8.
inline constexpr size_t kLongestText = size_t{4} << 20;

// The content of a regular file that is UTF-8 without zero bytes, a byte order mark left out, cut before the character
// that would pass kLongestText. No text where the file is anything else or may not be read; what lies past the cut is
// not looked at. Neither blocks on what is no regular file nor follows a symbolic link. Throws std::system_error where
// reading fails. Thread-safe.
std::optional<std::string> ReadPlainText(const std::string& path);

}  // namespace platform
