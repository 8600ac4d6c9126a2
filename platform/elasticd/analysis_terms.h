// The distinct terms of a document while they are counted.
//
// Most of the engine's time goes through here, so a word of up to 16 bytes is two integers: it is hashed and compared
// without a loop, and its bytes are written down only where it is new. The hash is seeded, so that no document can be
// made of words that collide.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace quarrox::elasticd {

// Eight bytes as an integer whose lowest byte is the first one.
inline uint64_t LoadLittle(const char* bytes) {
  uint64_t value;
  memcpy(&value, bytes, sizeof(value));
  if constexpr (std::endian::native == std::endian::big) value = __builtin_bswap64(value);
  return value;
}

inline void StoreLittle(char* bytes, uint64_t value) {
  if constexpr (std::endian::native == std::endian::big) value = __builtin_bswap64(value);
  memcpy(bytes, &value, sizeof(value));
}

// A mask of the lowest `count` bytes, of all for 8 and more.
inline uint64_t LowBytes(size_t count) {
  return count >= 8 ? ~uint64_t{0} : (uint64_t{1} << (8 * count)) - 1;
}

// Reuses its memory from document to document. One object, one thread.
class TermTable {
 public:
  // So many bytes of a word are read at once.
  static constexpr size_t kReadable = 16;

  TermTable();

  void Clear();

  // What stands before the words that follow. `id` tells the prefix from others until Clear().
  void SetPrefix(uint32_t id, std::string_view prefix);

  // What a word may have at most under that prefix, in bytes.
  size_t room() const { return room_; }

  // Counts `occurrences` more of a word. One that would make a term longer than kLongestTerm is left out.
  void Add(std::string_view word, uint32_t occurrences);

  // The same for a word of which kReadable bytes may be read whatever its length.
  void AddReadable(std::string_view word, uint32_t occurrences) {
    const size_t length = word.size();
    if (length > room_) return;
    const size_t behind = length > 8 ? length - 8 : 0;
    Count({LoadLittle(word.data()) & LowBytes(length), LoadLittle(word.data() + 8) & LowBytes(behind), tag_ | length},
          word, occurrences);
  }

  // The terms in order of bytes, with their counts; the views are good until the table changes.
  void Sort(std::vector<std::pair<std::string_view, uint32_t>>& terms);

 private:
  // Words of up to 16 bytes are equal where these are; of longer ones the rest must be compared.
  struct Key {
    uint64_t head;
    uint64_t tail;
    uint64_t tag;  // the prefix's id and the word's length, which has the lowest 8 bits
    bool operator==(const Key&) const = default;
  };

  struct Entry {
    Key key;
    size_t offset;  // of the term in arena_
    uint32_t count;
  };

  // A term as it is sorted: first by its first eight bytes as a big-endian number.
  struct Sorted {
    uint64_t first;
    std::string_view term;
    uint32_t count;
  };

  void Count(const Key& key, std::string_view word, uint32_t occurrences) {
    const uint32_t hash = HashOf(key, word);
    for (size_t at = hash & mask_;; at = (at + 1) & mask_) {
      const uint64_t slot = slots_[at];
      if (slot == 0) return Insert(at, hash, key, word, occurrences);
      if (slot >> 32 != hash) continue;
      Entry& entry = entries_[static_cast<uint32_t>(slot) - 1];
      if (entry.key == key && (word.size() <= kReadable || SameRest(entry, word))) {
        entry.count += occurrences;
        return;
      }
    }
  }

  uint32_t HashOf(const Key& key, std::string_view word) const {
    __extension__ using Product = unsigned __int128;
    uint64_t second = key.tail ^ (key.tag << 48) ^ key.tag ^ seeds_[1];
    if (word.size() > kReadable) second ^= HashOfRest(word);
    const Product product = Product{key.head ^ seeds_[0]} * second;
    return static_cast<uint32_t>((static_cast<uint64_t>(product) ^ static_cast<uint64_t>(product >> 64)) >> 32);
  }

  uint64_t HashOfRest(std::string_view word) const;
  bool SameRest(const Entry& entry, std::string_view word) const;
  void Insert(size_t at, uint32_t hash, const Key& key, std::string_view word, uint32_t occurrences);
  void Grow();
  static Sorted ForSorting(std::string_view term, uint32_t count);

  uint64_t seeds_[2];
  std::string prefix_;
  uint64_t tag_ = 0;  // the prefix's id, above the bits of a length
  size_t room_ = 0;

  // A hash in the upper half, in the lower one the number of an entry counted from 1; 0 where there is none.
  std::vector<uint64_t> slots_;
  size_t mask_ = 0;
  std::vector<Entry> entries_;
  std::vector<char> arena_;  // prefix and word, one term after the other
  size_t used_ = 0;          // of arena_
  std::vector<Sorted> sorted_;
};

}  // namespace quarrox::elasticd
