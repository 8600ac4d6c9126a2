// The words of texts: runs of letters and digits, folded; runs of ideographs apart.
//
// Nearly all texts are ASCII, so 64 bytes at a time become a mask of what is part of words, and the words are found by
// the mask's edges. Only runs with other bytes are looked at as code points.
#pragma once

#include <algorithm>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "analysis.h"
#include "analysis_terms.h"
#include "analysis_unicode.h"

namespace quarrox::elasticd {

// Reuses its memory. One object, one thread.
class WordSplitter {
 public:
  // Calls sink.Word(word) and sink.Ideographs(signs) in the order of the text. TermTable::kReadable bytes of either may
  // be read, and they are gone after the call. Words longer than kLongestWord are left out.
  template <typename Sink>
  void Split(std::string_view text, Sink& sink);

 private:
  static constexpr size_t kBlock = 64;
  static constexpr uint64_t kOnes = 0x0101010101010101;  // times a byte: eight of it
  static constexpr uint64_t kTops = 0x80 * kOnes;

  // One bit for each of 64 bytes.
  struct Block {
    uint64_t words = 0;    // letters, digits, and whatever is not ASCII
    uint64_t foreign = 0;  // not ASCII
  };

  static Block Classify(const char* bytes) {
    Block block;
    for (unsigned int i = 0; i < kBlock; i += 8) {
      const uint64_t eight = LoadLittle(bytes + i);
      block.words |= TopBits(WordBytes(eight)) << i;
      block.foreign |= TopBits(eight & kTops) << i;
    }
    return block;
  }

  static Block ClassifyEnd(std::string_view bytes) {
    char padded[kBlock] = {};
    std::copy(bytes.begin(), bytes.end(), padded);
    return Classify(padded);
  }

  // The top bit of each byte that is a letter, a digit or no ASCII. Sums of bytes below 0x80 never reach the next byte:
  // adding 0x80 - c sets the top bit from c on.
  static uint64_t WordBytes(uint64_t bytes) {
    const uint64_t ascii = bytes & ~kTops;
    const uint64_t lower = ascii | (0x20 * kOnes);
    const uint64_t letters = (lower + (0x80 - 'a') * kOnes) & ~(lower + (0x7f - 'z') * kOnes);
    const uint64_t digits = (ascii + (0x80 - '0') * kOnes) & ~(ascii + (0x7f - '9') * kOnes);
    return (letters | digits | bytes) & kTops;
  }

  // The top bits of eight bytes, gathered in the lowest byte.
  static uint64_t TopBits(uint64_t tops) { return ((tops >> 7) * 0x0102040810204080) >> 56; }

  // Of letters and digits only letters have the bit 0x40, and a lower-case letter has 0x20 as well.
  static uint64_t ToLower(uint64_t bytes) { return bytes | ((bytes & (0x40 * kOnes)) >> 1); }

  // Writes whole eights, of which only the first `length` bytes mean anything; no more than `readable` bytes are read.
  void CopyLower(const char* from, size_t length, size_t readable) {
    char end[sizeof(word_)] = {};
    if (readable < sizeof(word_)) {
      std::copy_n(from, length, end);
      from = end;
    }
    StoreLittle(word_, ToLower(LoadLittle(from)));
    StoreLittle(word_ + 8, ToLower(LoadLittle(from + 8)));
    for (size_t i = 16; i < length; i += 8) StoreLittle(word_ + i, ToLower(LoadLittle(from + i)));
  }

  template <typename Sink>
  void SplitAscii(std::string_view text, size_t begin, size_t end, Sink& sink) {
    const size_t length = end - begin;
    if (length > kLongestWord) return;
    CopyLower(text.data() + begin, length, text.size() - begin);
    sink.Word(std::string_view(word_, length));
  }

  // `foreign` is false where the run is known to be ASCII.
  template <typename Sink>
  void SplitRun(std::string_view text, size_t begin, size_t end, bool foreign, Sink& sink) {
    if (!foreign) return SplitAscii(text, begin, end, sink);
    const std::string_view run = text.substr(begin, end - begin);
    if (std::none_of(run.begin(), run.end(), [](char c) { return (c & 0x80) != 0; })) {
      return SplitAscii(text, begin, end, sink);
    }
    for (const UnicodeSplitter::Piece& piece : unicode_.Split(run)) {
      if (piece.ideographs) {
        sink.Ideographs(piece.text);
      } else {
        sink.Word(piece.text);
      }
    }
  }

  char word_[kLongestWord + 8] = {};
  UnicodeSplitter unicode_;
};

template <typename Sink>
void WordSplitter::Split(std::string_view text, Sink& sink) {
  size_t begin = 0;      // of the run that goes on in the next block
  bool inside = false;   // whether there is one
  bool foreign = false;  // whether a run in this block may have other bytes than ASCII
  for (size_t base = 0; base < text.size(); base += kBlock) {
    const Block block = text.size() - base >= kBlock ? Classify(text.data() + base) : ClassifyEnd(text.substr(base));
    const uint64_t before = block.words << 1 | static_cast<uint64_t>(inside);
    uint64_t begins = block.words & ~before;
    uint64_t ends = before & ~block.words;
    foreign = block.foreign != 0 || (inside && foreign);
    const auto take = [base](uint64_t& bits) {
      const size_t position = base + static_cast<size_t>(std::countr_zero(bits));
      bits &= bits - 1;
      return position;
    };
    if (inside && ends != 0) SplitRun(text, begin, take(ends), foreign, sink);
    while (ends != 0) {
      const size_t from = take(begins);
      SplitRun(text, from, take(ends), foreign, sink);
    }
    if (begins != 0) begin = take(begins);
    inside = block.words >> 63 != 0;
  }
  if (inside) SplitRun(text, begin, text.size(), foreign, sink);
}

}  // namespace quarrox::elasticd
