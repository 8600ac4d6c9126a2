// The kinds of files whose contents the folders of a share index.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <unordered_set>
#include <utility>
#include <vector>

#include <json/json.h>

#include "common/export.h"

namespace quarrox::fileindex {

struct QUARROX_API Kinds {
  bool document = false;
  bool audio = false;
  bool video = false;
  bool photo = false;

  // Reads an object of flags; what is missing or no flag is false.
  static Kinds Of(const Json::Value& data);
  Json::Value AsJson() const;

  bool Any() const { return document || audio || video || photo; }
  // Whether a path's kind is one of them. A file of no known kind goes with any.
  bool Has(const std::string& path) const;

  bool operator==(const Kinds&) const = default;
  // Those in which two differ.
  friend Kinds operator^(const Kinds& a, const Kinds& b) {
    return {a.document != b.document, a.audio != b.audio, a.video != b.video, a.photo != b.photo};
  }
};

// The folders of one share with their kinds. They are written down beside the index when it was made with them, so that
// a change of the folder list is seen also where the event that tells of it was lost or came to be part of another one.
// Paths are taken from the share's directory, whose own is empty, so that they outlive a rename of the share.
//
// Nothing is looked at in a folder while it is paused. What is written down of its places says how they were indexed
// before, and since when, in seconds since the epoch, what changed there may have been missed.
class QUARROX_API FolderKinds {
 public:
  struct Difference {
    std::string path;
    Kinds kinds;                          // in which something is indexed otherwise
    std::optional<int64_t> unseen_since;  // where it was paused
  };

  void Add(const std::string& path, const Kinds& kinds, bool is_paused = false) {
    folders_.emplace(path, Entry{kinds, is_paused ? std::optional<int64_t>(INT64_MIN) : std::nullopt});
  }

  // Of the nearest folder at or above a path, if there is one.
  std::optional<Kinds> At(const std::string& path) const;

  // Those of an index that was made with `before` and is brought in line with these: at places that are paused now, it
  // stays as it was. What was not paused before is unseen since `since`.
  FolderKinds After(const FolderKinds& before, int64_t since) const;

  // The places from which on, downwards, there is something to be done, because something is indexed otherwise or is
  // not paused any more.
  std::vector<Difference> DifferencesFrom(const FolderKinds& other) const;

  bool operator==(const FolderKinds&) const = default;

  // Nothing where there is no such file; what cannot be read is logged, and counts as if it were not there.
  static std::optional<FolderKinds> Load(const std::string& file);
  // A failure is logged: the differences are then found once more.
  void Save(const std::string& file) const;

 private:
  struct Entry {
    Kinds kinds;
    std::optional<int64_t> unseen_since;  // while it is paused

    bool operator==(const Entry& other) const {
      return kinds == other.kinds && unseen_since.has_value() == other.unseen_since.has_value();
    }
  };
  using Folders = std::map<std::string, Entry>;

  static Folders PlacesOf(const FolderKinds& a, const FolderKinds& b);
  const Entry* Find(const std::string& path) const;

  Folders folders_;
};

// Whether a path is one of some directories or lies below one, by whole components.
using PathSet = std::unordered_set<std::string>;
QUARROX_API bool HoldsAtOrAbove(const PathSet& directories, const std::string& path);

}  // namespace quarrox::fileindex
