// The directory of an index: the database, the mark that says that it was closed in order, and what was set aside.
#pragma once

#include <string>

namespace quarrox::elasticd {

// Not thread-safe: one object, used by the index's owner alone.
class IndexFiles {
 public:
  explicit IndexFiles(std::string path) : path_(std::move(path)) {}

  const std::string& path() const { return path_; }
  std::string Database() const { return path_ + "/index"; }

  bool Exists() const;

  // Makes the directory and those above it; mode 0700 for each that it makes: an index holds everybody's text. Throws
  // Error 617 or 618.
  void MakeDirectory() const;

  // The mark holds sizes and times of the database's files, so that it speaks of no others. A process that dies leaves
  // no mark behind, because it is removed before the first change.
  bool WasClosedInOrder() const;
  void MarkClosed() const;
  void RemoveMark() const;

  // Puts a damaged database where it can be looked at, in the place of one that was there before.
  void SetAside() const;

  // Moves everything of the index to another path, across file systems by a copy that takes its name when it is whole.
  // Throws Error 611 where something stands there, 617 or 618.
  void MoveTo(const std::string& path) const;

  // Deletes everything of the index, and the directory where nothing else is in it.
  void Delete() const;

 private:
  std::string path_;
};

}  // namespace quarrox::elasticd
