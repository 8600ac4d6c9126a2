// What one emptying of the kernel's queue brought: the names that were touched, by directory, and the renames in order.
//
// The kernel merges events on one name, so the bits of a name have no order among each other; more events on a name
// that is already here only add bits. The batch therefore grows with the names that were touched and not with the
// events.
#pragma once

#include <cstdint>
#include <deque>
#include <functional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>
#include <vector>

namespace quarrox::notifyd {

inline constexpr uint32_t kNone = UINT32_MAX;

struct TouchedDir {
  enum class Place { kUnknown, kRelevant, kElsewhere, kGone };

  std::string handle;  // as DirHandles wants it
  uint32_t first = kNone;
  uint32_t last = kNone;  // its touches are a list through TouchedName::next
  Place place = Place::kUnknown;
  std::string path;  // where it was when the batch was resolved
};

struct TouchedName {
  uint32_t dir;
  uint32_t next;
  uint32_t name_at;
  uint16_t name_size;
  uint8_t file_bits = 0;  // event bits (kCreated, ...) that concerned something that was no directory
  uint8_t dir_bits = 0;
  uint8_t ends = 0;         // how many renames begin or end here; 2 stands for any more
  bool arrived = false;     // the last of them ends here
  bool end_is_dir = false;  // what it moved is a directory
  uint8_t told = 0;         // of `ends`, those that came up so far while resolving, and the last of them
  bool told_arrived = false;
};

struct Rename {
  uint32_t from;  // a touched name, kNone where the kernel did not say
  uint32_t to;
  bool is_dir;
};

class EventBatch {
 public:
  EventBatch() : names_by_key_(64, Hash{this}, Equal{this}) {}
  EventBatch(const EventBatch&) = delete;
  EventBatch& operator=(const EventBatch&) = delete;

  uint32_t Dir(std::string_view handle);
  uint32_t Touch(std::string_view handle, std::string_view name);
  uint32_t Find(const std::string& handle, std::string_view name) const;  // kNone where it was not touched
  void AddBits(uint32_t touch, uint8_t bits, bool is_dir);
  void AddRename(uint32_t from, uint32_t to, bool is_dir);

  std::string_view Name(const TouchedName& touch) const { return {&text_[touch.name_at], touch.name_size}; }
  bool empty() const { return names.empty() && !overflowed; }
  size_t Memory() const { return text_.size() + names.size() * kNameCost + dirs.size() * kDirCost; }

  std::vector<TouchedDir> dirs;
  std::deque<TouchedName> names;
  std::vector<Rename> renames;
  bool overflowed = false;  // the kernel dropped events
  bool complete = true;     // the kernel's queue was empty at the end

 private:
  static constexpr size_t kNameCost = sizeof(TouchedName) + 32;  // with its share of the table
  static constexpr size_t kDirCost = 256;

  struct Key {
    uint32_t dir;
    std::string_view name;
  };
  struct Hash {
    using is_transparent = void;
    const EventBatch* batch;
    size_t operator()(const Key& key) const {
      return std::hash<std::string_view>()(key.name) ^ (key.dir * 0x9E3779B9U);
    }
    size_t operator()(uint32_t touch) const { return (*this)(batch->KeyOf(touch)); }
  };
  struct Equal {
    using is_transparent = void;
    const EventBatch* batch;
    bool operator()(uint32_t a, uint32_t b) const { return a == b; }
    bool operator()(const Key& a, uint32_t b) const { return (*this)(b, a); }
    bool operator()(uint32_t a, const Key& b) const {
      const Key key = batch->KeyOf(a);
      return key.dir == b.dir && key.name == b.name;
    }
  };

  Key KeyOf(uint32_t touch) const { return {names[touch].dir, Name(names[touch])}; }
  void MarkEnd(uint32_t touch, bool arrived, bool is_dir);

  std::string text_;
  uint32_t last_dir_ = kNone;
  std::unordered_map<std::string, uint32_t> dirs_by_handle_;
  std::unordered_set<uint32_t, Hash, Equal> names_by_key_;
};

}  // namespace quarrox::notifyd
