#include "extract/pieces.h"

#include <algorithm>
#include <string>

namespace platform::extract {

Pieces FilePieces(const Source& source) {
  return [&source, at = uint64_t{0}, buffer = std::string(kPiece, '\0')]() mutable {
    const size_t wanted = static_cast<size_t>(std::min<uint64_t>(kPiece, kLongestContent - at));
    const size_t n = ReadAt(source, at, buffer.data(), wanted);
    at += n;
    return std::string_view(buffer.data(), n);
  };
}

}  // namespace platform::extract
