// A content that is read in order, and never needed as a whole.
#pragma once

#include <cstdint>
#include <functional>
#include <string_view>

#include "extract/source.h"

namespace platform::extract {

// The next piece, good until the next is asked for; empty at the end.
using Pieces = std::function<std::string_view()>;

// How much of any content is looked at, whatever it is unpacked from: what has no text by then has little. In bytes.
inline constexpr uint64_t kLongestContent = uint64_t{64} << 20;

// How long a piece of a file is. In bytes.
inline constexpr size_t kPiece = size_t{64} << 10;

// A file from its beginning. The source must stay. Throws std::system_error.
Pieces FilePieces(const Source& source);

}  // namespace platform::extract
