#include "analysis_terms.h"

#include <algorithm>
#include <random>

#define XXH_INLINE_ALL
#include <xxhash.h>

#include "analysis.h"

namespace quarrox::elasticd {
namespace {

// Few documents have more distinct terms than half of that, and clearing it costs next to nothing.
constexpr size_t kFirstSlots = 1024;

// What is kept for the next document; one that has more terms is rare, and its memory is given back.
constexpr size_t kKeptEntries = size_t{1} << 18;
constexpr size_t kKeptArena = size_t{1} << 23;

uint64_t RandomSeed() {
  std::random_device random;
  return (uint64_t{random()} << 32) | random();
}

uint64_t BigEndian(uint64_t little) {
  return __builtin_bswap64(little);
}

}  // namespace

TermTable::TermTable() : seeds_{RandomSeed(), RandomSeed()} {
  Clear();
}

void TermTable::Clear() {
  slots_.assign(kFirstSlots, 0);
  mask_ = kFirstSlots - 1;
  entries_.clear();
  used_ = 0;
  if (entries_.capacity() > kKeptEntries) {
    entries_ = {};
    slots_.shrink_to_fit();
    sorted_ = {};
  }
  if (arena_.size() > kKeptArena) arena_ = {};
}

void TermTable::SetPrefix(uint32_t id, std::string_view prefix) {
  prefix_ = prefix;
  tag_ = uint64_t{id} << 8;
  room_ = prefix.size() < kLongestTerm ? kLongestTerm - prefix.size() : 0;
}

void TermTable::Add(std::string_view word, uint32_t occurrences) {
  if (word.size() >= kReadable) return AddReadable(word, occurrences);
  char readable[kReadable] = {};
  std::copy(word.begin(), word.end(), readable);
  AddReadable({readable, word.size()}, occurrences);
}

uint64_t TermTable::HashOfRest(std::string_view word) const {
  return XXH3_64bits_withSeed(word.data() + kReadable, word.size() - kReadable, seeds_[0]);
}

bool TermTable::SameRest(const Entry& entry, std::string_view word) const {
  const char* known = arena_.data() + entry.offset + prefix_.size();
  return memcmp(known + kReadable, word.data() + kReadable, word.size() - kReadable) == 0;
}

void TermTable::Insert(size_t at, uint32_t hash, const Key& key, std::string_view word, uint32_t occurrences) {
  // Behind the last term there is always room for what is written and read by eights.
  const size_t needed = used_ + kLongestTerm + 2 * kReadable;
  if (arena_.size() < needed) arena_.resize(std::max(needed, arena_.size() * 2));
  char* term = arena_.data() + used_;
  char* place = std::copy(prefix_.begin(), prefix_.end(), term);
  StoreLittle(place, key.head);
  StoreLittle(place + 8, key.tail);
  if (word.size() > kReadable) std::copy(word.begin() + kReadable, word.end(), place + kReadable);

  entries_.push_back({key, used_, occurrences});
  used_ += prefix_.size() + word.size();
  slots_[at] = (uint64_t{hash} << 32) | entries_.size();
  if (entries_.size() * 2 > slots_.size()) Grow();
}

void TermTable::Grow() {
  std::vector<uint64_t> old(slots_.size() * 2);
  old.swap(slots_);
  mask_ = slots_.size() - 1;
  for (const uint64_t slot : old) {
    if (slot == 0) continue;
    size_t at = (slot >> 32) & mask_;
    while (slots_[at] != 0) at = (at + 1) & mask_;
    slots_[at] = slot;
  }
}

TermTable::Sorted TermTable::ForSorting(std::string_view term, uint32_t count) {
  return {BigEndian(LoadLittle(term.data()) & LowBytes(term.size())), term, count};
}

void TermTable::Sort(std::vector<std::pair<std::string_view, uint32_t>>& terms) {
  sorted_.clear();
  for (size_t i = 0; i < entries_.size(); ++i) {
    const size_t end = i + 1 < entries_.size() ? entries_[i + 1].offset : used_;
    const size_t offset = entries_[i].offset;
    sorted_.push_back(ForSorting({arena_.data() + offset, end - offset}, entries_[i].count));
  }
  std::sort(sorted_.begin(), sorted_.end(),
            [](const Sorted& a, const Sorted& b) { return a.first != b.first ? a.first < b.first : a.term < b.term; });
  terms.clear();
  for (const Sorted& each : sorted_) terms.emplace_back(each.term, each.count);
}

}  // namespace quarrox::elasticd
