// Which paths the daemon speaks about: the watched directory and what is below it, less the metadata directories and
// the daemon's own queue. Whatever is not inside is treated alike, so that a move out of a metadata directory is a
// creation, as is a move from another part of the disk.
#pragma once

#include <string>
#include <string_view>

namespace quarrox::notifyd {

inline constexpr std::string_view kMetadataDir = "@eaDir";

// `dir` and `name` as a path.
std::string Join(std::string_view dir, std::string_view name);

// Immutable, so safe to share between threads.
class Scope {
 public:
  // Takes both paths to their real place. Throws Error 502 where `dir` is no directory or the queue's directory is
  // missing.
  Scope(const std::string& dir, const std::string& queue);

  const std::string& dir() const { return dir_; }
  const std::string& queue() const { return queue_; }

  // Whether entries of the directory `dir` can be inside at all.
  bool MayHold(std::string_view dir) const { return dir == parent_ || IsInside(dir); }

  // Whether the entry `name` of a directory that may hold entries of the tree is inside. "." is the directory itself.
  bool IsInside(std::string_view dir, std::string_view name) const;

 private:
  bool IsInside(std::string_view dir) const;

  std::string dir_;
  std::string parent_;  // of dir_: the one directory outside that holds an entry inside
  std::string queue_;
  std::string queue_dir_;
  std::string queue_name_;
};

}  // namespace quarrox::notifyd
