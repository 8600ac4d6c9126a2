// Collects one request from the pieces in which it arrives: a 4-byte length in host byte order, then that many bytes,
// of which the last is zero.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace quarrox::elasticd {

// Its memory grows with what has arrived, whatever the length promises. Not thread-safe.
class RequestReader {
 public:
  // A document's text is capped far below this, and so is what the callers put into one compound request.
  static constexpr uint32_t kLongestRequest = uint32_t{256} << 20;

  // Takes from the front of `data` what belongs to the request, and returns how much that is. Throws Error 616, which
  // is not logged, as soon as it can be no request any more.
  size_t Add(std::string_view data);

  bool empty() const { return header_size_ == 0; }

  bool whole() const { return header_size_ == sizeof(length_) && received_ == length_; }

  // The whole request without its zero byte.
  const std::string& text() const { return text_; }

  // Bytes of memory that it takes, and will take once `more` bytes were added.
  size_t memory() const { return text_.capacity(); }
  size_t MemoryWith(size_t more) const;

  // Gives its memory back and begins the next request.
  void Clear();

 private:
  void TakeHeader(std::string_view& data);

  uint32_t length_ = 0;
  uint32_t header_size_ = 0;
  uint32_t received_ = 0;  // of the bytes that the length counts
  std::string text_;
};

}  // namespace quarrox::elasticd
