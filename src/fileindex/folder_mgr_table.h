// The records of a FolderMgr: the list in its order, and what finds a record without going through the list.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <unordered_map>

#include "fileindex/folder.h"

namespace quarrox::fileindex {

// Where a record stands in the list: positions only grow, so that the order of positions is the order of the list.
using FolderPosition = uint64_t;

// The positions of records by one of their texts.
class FolderIndex {
 public:
  using Positions = std::set<FolderPosition>;

  void Add(const std::string& key, FolderPosition position) { positions_[Key(key)].insert(position); }
  void Remove(const std::string& key, FolderPosition position);

  // All positions of a key; null where there is none, never empty.
  const Positions* Find(const std::string& key) const;

  // Those of the longest key that covers a path; null where none does. Reads the path once, from its beginning, and
  // looks up each of its ancestors on the way; the hash of one is the beginning of the next one's.
  const Positions* FindCovering(const std::string& path) const;

 private:
  // A text with its hash, FNV-1a, in which each byte is mixed into the hash of all before it.
  struct Hash {
    uint64_t value = 0xcbf29ce484222325;
    void Mix(char c) { value = (value ^ static_cast<unsigned char>(c)) * 0x100000001b3; }
  };
  struct View {
    std::string_view text;
    uint64_t hash;
  };
  struct Key {
    explicit Key(const std::string& key);
    std::string text;
    uint64_t hash;
  };
  struct HashOf {
    using is_transparent = void;
    size_t operator()(const Key& key) const { return key.hash; }
    size_t operator()(const View& view) const { return view.hash; }
  };
  struct Equal {
    using is_transparent = void;
    template <typename A, typename B>
    bool operator()(const A& a, const B& b) const {
      return a.hash == b.hash && a.text == b.text;
    }
  };

  std::unordered_map<Key, Positions, HashOf, Equal> positions_;
};

// Not thread-safe, not even for questions: an index is made when it is first needed.
class FolderTable {
 public:
  using Records = std::map<FolderPosition, std::shared_ptr<Folder>>;

  const Records& records() const { return records_; }

  // Puts a record at the end.
  void Append(const std::shared_ptr<Folder>& folder);

  // Removes the first record with this path, where there is one, and all records of a share.
  void RemoveFirst(const std::string& path);
  void RemoveShare(const std::string& share);

  // The first record with a path, the first at a full path, and the first of the deepest that cover one; null where
  // there is none. For full paths it throws what computing that of any record throws.
  std::shared_ptr<Folder> FindByPath(const std::string& path);
  std::shared_ptr<Folder> FindByFullPath(const std::string& full_path);
  std::shared_ptr<Folder> FindCovering(const std::string& full_path);

  bool HasShare(const std::string& share);

  // The full path of a share path. Throws as GetFullPath.
  std::string FullPathOf(const std::string& path) { return volumes_.GetFullPath(path); }
  std::string FullPathOf(const Folder& folder) { return folder.GetFullPath(volumes_); }

 private:
  // An index of all records, made where there is none; `key_of` gives a record's text.
  template <typename KeyOf>
  FolderIndex& Require(std::optional<FolderIndex>& index, const KeyOf& key_of);
  FolderIndex& Paths();
  FolderIndex& Shares();
  FolderIndex& FullPaths();

  void ForgetChangedKeys();
  void Remove(FolderPosition position);
  std::shared_ptr<Folder> First(const FolderIndex::Positions* positions) const;

  Records records_;
  FolderPosition next_ = 0;
  ShareVolumes volumes_;
  std::optional<FolderIndex> paths_;
  std::optional<FolderIndex> shares_;
  std::optional<FolderIndex> full_paths_;
  uint64_t share_changes_ = Folder::ShareChanges();  // as of when paths_ and shares_ were known to hold
};

}  // namespace quarrox::fileindex
