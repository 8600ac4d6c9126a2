// The text of plain text files, which this process reads itself: it takes no parsing.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace platform {

// How much text of one file is kept, in bytes of UTF-8.
inline constexpr size_t kLongestText = size_t{4} << 20;

// The content of a regular file, about so many bytes long, that is UTF-8 without zero bytes, a byte order mark left
// out, cut before the character that would pass kLongestText; what lies past the cut is not looked at. Nothing where
// the file is anything else, or by its extension (lower case) or its first bytes of a format that is parsed, though it
// is text. Throws std::system_error where reading fails. Thread-safe.
std::optional<std::string> ReadPlainText(int fd, size_t size, const std::string& extension);

// Whether a text begins as one of these formats.
bool BeginsParsed(std::string_view text);

}  // namespace platform
