#include "server_request_reader.h"

#include <algorithm>
#include <cstring>

#include "error_code.h"

namespace quarrox::elasticd {

void RequestReader::TakeHeader(std::string_view& data) {
  const size_t count = std::min(data.size(), sizeof(length_) - header_size_);
  memcpy(reinterpret_cast<char*>(&length_) + header_size_, data.data(), count);
  header_size_ += static_cast<uint32_t>(count);
  data.remove_prefix(count);
  if (header_size_ < sizeof(length_)) return;
  if (length_ == 0) {
    throw Error(kMalformedRequest, "The request is empty; its length counts the zero byte that ends it");
  }
  if (length_ > kLongestRequest) {
    throw Error(kMalformedRequest, "A request of " + std::to_string(length_) + " bytes is too long; the longest has " +
                                       std::to_string(kLongestRequest));
  }
}

size_t RequestReader::MemoryWith(size_t more) const {
  const size_t needed = text_.size() + more;
  if (needed <= text_.capacity()) return text_.capacity();
  const size_t grown = std::max(needed, 2 * text_.capacity());
  return header_size_ < sizeof(length_) ? grown : std::min<size_t>(grown, length_);
}

size_t RequestReader::Add(std::string_view data) {
  const size_t given = data.size();
  if (header_size_ < sizeof(length_)) TakeHeader(data);
  if (header_size_ < sizeof(length_)) return given;
  const std::string_view mine = data.substr(0, length_ - received_);
  data.remove_prefix(mine.size());
  received_ += static_cast<uint32_t>(mine.size());
  const bool ends = received_ == length_;
  if (ends && !mine.empty() && mine.back() != '\0') {
    throw Error(kMalformedRequest, "The request does not end with a zero byte, which its length counts");
  }
  const std::string_view text = mine.substr(0, mine.size() - (ends && !mine.empty() ? 1 : 0));
  const size_t memory = MemoryWith(text.size());
  if (memory > text_.capacity()) text_.reserve(memory);
  text_ += text;
  return given - data.size();
}

// Swapped, because assigning an empty string would keep the memory.
void RequestReader::Clear() {
  std::string().swap(text_);
  length_ = header_size_ = received_ = 0;
}

}  // namespace quarrox::elasticd
