// Where documents stand: the tree of directories, kept beside the documents in the database.
//
// A document's identity is a path. It is not stored with the document: a document knows the number of its directory and
// its own name, and a directory the number of the one above it and its name. So a path is found by one look-up for each
// component, what is below a directory by reading just that, and a document that moves changes in nothing but its
// place.
//
//   key                               value
//   'E' directory name                what stands there: the document's identifier, the directory's number (either
//                                     may be none), and the whole name where the key has only its hash
//   'D' directory                     the number of the directory above it, and its name
//   'N'                               the last number that a directory was given
//
// A path is any text; its components are parted by slashes, and one that begins with a slash has an empty first
// component.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "database.h"

namespace quarrox::elasticd {

struct Place {
  DirectoryId directory = 0;
  std::string name;
};

// The form in which a document keeps its place.
std::string PackPlace(const Place& place);
Place UnpackPlace(const std::string& packed);

// Looks into a store that belongs to somebody else. Throws what that throws, and DamagedDatabase where the tree does
// not hold together. One object, one thread.
class Places {
 public:
  explicit Places(const Store& store) : store_(store) {}

  virtual ~Places() = default;

  // The directory by its path, without a slash at the end; 0 where nothing is below it.
  virtual DirectoryId FindDirectory(std::string_view path) const;

  // The document by its path; 0 where there is none.
  DocumentId Find(std::string_view path) const;

  std::string PathOf(const Place& place) const;
  std::string DirectoryPath(DirectoryId directory) const;

  // Hands out every document whose path begins with `prefix`, a directory's before those below it, until `take` returns
  // false. `path` is that of the document's directory.
  using Take = std::function<bool(DocumentId id, const std::string& directory, const std::string& name)>;
  void ForEach(std::string_view prefix, const Take& take) const;

  // The directory and all below it.
  std::unordered_set<DirectoryId> Tree(DirectoryId top) const;

  // The directories in `top` whose names begin so, and all below them.
  std::unordered_set<DirectoryId> TreesIn(DirectoryId top, std::string_view begin) const;

  // The directories of which the last `count` components fit, and all below them; `from_root` where nothing may stand
  // above these. Looks at every directory.
  using Fits = std::function<bool(size_t component, const std::string& name)>;
  std::unordered_set<DirectoryId> TreesThatFit(size_t count, bool from_root, const Fits& fits) const;

  // To be called where directories may have changed under the object.
  void Forget() { paths_.clear(); }

 protected:
  struct Entry {
    DocumentId document = 0;
    DirectoryId directory = 0;
    std::string name;
  };
  struct Branch {
    DirectoryId above = 0;
    std::string name;
  };
  static constexpr DirectoryId kRoot = 1;

  std::optional<Entry> Look(DirectoryId directory, std::string_view name) const;
  Branch LookUp(DirectoryId directory) const;
  void ForEachEntry(DirectoryId directory, std::string_view begin, const std::function<bool(const Entry&)>& take) const;
  void Collect(std::vector<DirectoryId> left, std::unordered_set<DirectoryId>& tree) const;

 private:
  const Store& store_;
  mutable std::unordered_map<DirectoryId, std::string> paths_;  // some, as they were last asked for
};

// The same, and changes the tree.
class PlaceWriter final : public Places {
 public:
  explicit PlaceWriter(Writer& writer) : Places(writer), writer_(writer) {}

  DirectoryId FindDirectory(std::string_view path) const override;

  // Puts a document at a path where none is, and tells where that is.
  Place Put(std::string_view path, DocumentId id);

  // Takes the document away from a path where one is.
  void Remove(std::string_view path);

 private:
  DirectoryId MakeDirectory(std::string_view path);
  DirectoryId MakeNumber();
  void Prune(DirectoryId directory);
  void Write(DirectoryId directory, const Entry& entry);

  Writer& writer_;
  mutable std::unordered_map<std::string, DirectoryId> directories_;  // some, by path
};

}  // namespace quarrox::elasticd
