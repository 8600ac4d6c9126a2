// Which paths of a share are to be indexed, and how; what is at a path.
#pragma once

#include <sys/stat.h>
#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "common/export.h"
#include "fileindex/folder_kinds.h"
#include "fileindex/folder_mgr.h"

namespace quarrox::fileindex {

// What is at a path, a symbolic link itself. What cannot be looked at is there, or nothing may be concluded from it;
// that is logged.
struct Entry {
  enum Presence { kThere, kGone, kUnknown } presence = kGone;
  struct stat info = {};
  int error = 0;  // why it cannot be looked at

  bool IsDirectory() const { return presence == kThere && S_ISDIR(info.st_mode); }
};
QUARROX_API Entry LookAt(const std::string& path);

// A path is indexed where a folder covers it and nothing speaks against it. A folder counts also while it is paused:
// what the index has of it stays. Files that it governs are not looked at then, but those of folders below it are.
//
// It holds the share and the folder list as they were when they were last read. Not thread-safe.
class QUARROX_API IndexScope {
 public:
  explicit IndexScope(std::string share) : share_(std::move(share)) {}

  // Reads both. Throws Error 800 where the share is gone, 502 where its directory is not there or its disk is away, 903
  // where the share is encrypted and locked: nothing may be concluded from what is not on the disk then. Throws what
  // FolderMgr throws.
  void Read();

  // Writes down beside the index whether the share has a disk of its own, mounted at its directory, so that the empty
  // directory without that disk is not taken for the share. A failure is logged.
  void NoteDisk() const;

  // Throws Error 502 where the share's directory is not the one that Read() found: its disk went away.
  void CheckDirectory() const;

  const std::string& share() const { return share_; }
  const std::string& directory() const { return directory_; }

  // Whether a folder covers the path.
  bool Covers(const std::string& path) const { return folders_->IsFullPathIndexed(path); }

  // Whether the path is to be in the index. Throws Error 502 or 800 where that cannot be told.
  bool Accepts(const std::string& path) const;

  // The same for a directory in one that was just accepted, and for any other entry of such a one.
  bool AcceptsDirectoryIn(const std::string& path) const;
  static bool AcceptsEntry(const std::string& name, mode_t mode);

  // Whether what is in the file is to be in the index, too.
  bool NeedsMeta(const std::string& path) const { return folders_->IsFullPathNeedMeta(path); }

  // The folders of the share.
  const FolderKinds& kinds() const { return kinds_; }

  // Those of a path, which may lie outside of the share.
  Kinds KindsAt(const std::string& path) const;

  // The file beside the index that takes the folders with which it was made.
  const std::string& kinds_file() const { return kinds_file_; }

  // The folder that governs a path; null where none does.
  std::shared_ptr<Folder> FolderOf(const std::string& path) const { return folders_->GetMostSuitableCfg(path); }

  // Whether the path is not to be looked at, because the folder that governs it is paused; whether that holds for it or
  // for something below it.
  bool IsPaused(const std::string& path) const;
  bool HasPaused(const std::string& path) const;

  // The folders of the share that are paused, full paths.
  const std::set<std::string>& paused() const { return paused_; }

  // When the first of their pauses ends, in seconds since the epoch; nothing where none does.
  std::optional<int64_t> next_resume() const { return next_resume_; }

  // Where walks begin that together meet everything covered at a path and below it, each once, if they do not go into
  // what is paused. kToo: if they do.
  enum class Paused { kNot, kToo };
  std::vector<std::string> Starts(const std::string& path, Paused paused = Paused::kNot) const;

 private:
  void TakeFolders();

  const std::string share_;
  std::string directory_;
  dev_t device_ = 0;
  ino_t inode_ = 0;
  bool has_own_disk_ = false;
  std::string disk_note_;  // stands where it has one
  std::unique_ptr<FolderMgr> folders_;
  std::set<std::string> paused_;
  std::optional<int64_t> next_resume_;
  FolderKinds kinds_;
  std::string kinds_file_;
};

}  // namespace quarrox::fileindex
