// What of a share could not be indexed, path by path, as its worker writes it down. One file beside the share's
// database.
#pragma once

#include <sys/stat.h>

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "common/export.h"
#include "common/sdk/share.h"

namespace quarrox::fileindex {

struct QUARROX_API IndexFailure {
  int code = 0;  // what failed, and why, as an Error
  std::string reason;
  bool has_document = false;  // the index holds all but the contents
  bool may_succeed_later = false;

  // The file as it was then: bytes, and the time of its last change in nanoseconds since the epoch. -1: not known.
  int64_t size = -1;
  int64_t changed = -1;

  int64_t tried = 0;  // the last time, in seconds since the epoch
  uint32_t tries = 0;

  void SetFile(const struct stat& info);
  // Whether this is the file that failed, unchanged.
  bool IsAbout(const struct stat& info) const;

  // When it is tried again without any other reason: 1, 2, 4 ... 60 minutes after the last time. Nothing: never.
  std::optional<int64_t> NextTry() const;
  // Also where the clock was set back since.
  bool IsDue(int64_t now) const;
};

// The failures of one share. Paths are taken from the share's directory, whose own is empty, so that they outlive a
// rename of the share. Beyond kMost they are only counted. A change costs what it changes; one process writes the file,
// any may read it. Not thread-safe.
class QUARROX_API IndexFailures {
 public:
  static constexpr size_t kMost = 10000;

  // The file of a share, in the directory of its database.
  static std::string FileOf(const sdk::SDKShare& share);

  // None, and no file.
  IndexFailures() = default;

  // Those of a file. One that is not there holds none; one that cannot be read is logged, and counts as if it were not
  // there.
  explicit IndexFailures(const std::string& file);

  const std::string& file() const { return file_; }
  bool empty() const { return failures_.empty(); }
  size_t size() const { return failures_.size(); }
  size_t omitted() const { return omitted_; }

  // Whether there is something to save.
  bool changed() const { return changed_; }

  // Null where nothing failed. Valid until the next change.
  const IndexFailure* Find(const std::string& path) const;

  // Those at a path and below it; those that are due.
  std::vector<std::string> AtOrBelow(const std::string& path) const;
  std::vector<std::string> Due(int64_t now) const;

  // When the first of all is to be tried again.
  std::optional<int64_t> NextTry() const;

  // Takes a failure of now. The tries of the same file, unchanged, are counted on.
  void Note(const std::string& path, IndexFailure failure);

  void Forget(const std::string& path);

  // What is at a path and below it.
  void ForgetBelow(const std::string& path);
  void MoveBelow(const std::string& old_path, const std::string& new_path);

  // Writes the file where something has changed. A failure is logged, and what failed is then found once more.
  void Save();

 private:
  using Map = std::map<std::string, IndexFailure>;

  std::string file_;
  Map failures_;
  size_t omitted_ = 0;
  bool changed_ = false;
};

}  // namespace quarrox::fileindex
