// An array that grows without moving: indices and references stay, and growing never holds two copies.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <stdexcept>
#include <string_view>
#include <vector>

namespace quarrox::fileindex {

// Elements are numbered with 32 bits; one too many throws std::length_error.
template <typename T>
class ChunkedArray {
 public:
  uint32_t Add(const T& value) {
    if ((size_ & kMask) == 0) {
      if (size_ >= kMaxSize) throw std::length_error("ChunkedArray");
      // Not value-initialised: a page that is not used is not touched.
      chunks_.emplace_back(new T[kMask + 1]);
    }
    chunks_.back()[size_ & kMask] = value;
    return size_++;
  }
  T& operator[](uint32_t i) { return chunks_[i >> kShift][i & kMask]; }
  const T& operator[](uint32_t i) const { return chunks_[i >> kShift][i & kMask]; }
  uint32_t size() const { return size_; }

 private:
  static constexpr uint32_t kShift = 12;
  static constexpr uint32_t kMask = (1U << kShift) - 1;
  static constexpr uint32_t kMaxSize = 1U << 29;  // what the bit fields that refer to elements can hold

  std::vector<std::unique_ptr<T[]>> chunks_;
  uint32_t size_ = 0;
};

// Texts of at most kMaxText bytes, stored once each and named by a number.
class TextStore {
 public:
  static constexpr size_t kMaxText = 65536;

  uint32_t Add(std::string_view text) {
    const size_t need = text.size() + (text.size() < 0xff ? 1 : 4);
    if (used_ + need > kChunk) {
      if (chunks_.size() >= kMaxChunks) throw std::length_error("TextStore");
      chunks_.emplace_back(new char[kChunk]);
      used_ = 0;
    }
    char* p = chunks_.back().get() + used_;
    const auto id = static_cast<uint32_t>((chunks_.size() - 1) * kChunk + used_);
    if (text.size() < 0xff) {
      *p++ = static_cast<char>(text.size());
    } else {  // 0xff, then 24 bits of length
      *p++ = static_cast<char>(0xff);
      for (int shift = 0; shift < 24; shift += 8) *p++ = static_cast<char>(text.size() >> shift);
    }
    text.copy(p, text.size());
    used_ += need;
    return id;
  }
  std::string_view operator[](uint32_t id) const {
    const char* p = chunks_[id / kChunk].get() + id % kChunk;
    size_t size = static_cast<unsigned char>(*p++);
    if (size == 0xff) {
      size = 0;
      for (int shift = 0; shift < 24; shift += 8)
        size |= static_cast<size_t>(static_cast<unsigned char>(*p++)) << shift;
    }
    return {p, size};
  }

 private:
  static constexpr size_t kChunk = 2 * kMaxText;
  static constexpr size_t kMaxChunks = (size_t{1} << 32) / kChunk;

  std::vector<std::unique_ptr<char[]>> chunks_;
  size_t used_ = kChunk;
};

}  // namespace quarrox::fileindex
