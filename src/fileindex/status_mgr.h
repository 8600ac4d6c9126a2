// The pause state of all indexing and the status flags of each share, in one small JSON file.
#pragma once

#include <cstdint>
#include <string>

#include <json/json.h>

#include "common/export.h"

namespace quarrox::fileindex {

inline constexpr char kFileIndexStatusCfgPath[] = "/var/packages/Quarrox/etc/fileindex.status";

// The lock file under which it is written.
inline constexpr char kStatusLockPath[] = "/tmp/quarrox_cfg_fi_status.lock";

// The status flags of a share, to be combined.
enum ShareStatusFlag : int {
  kShareNeedReindex = 1,  // its index misses something that only a reindex finds
  kShareNeedRebuild = 2,  // and a reindex of one folder is not enough: the whole index is to be made anew
};

// What GetPauseInfo answers where it is no time.
inline constexpr int64_t kNotPaused = -1;
inline constexpr int64_t kPausedWithoutEnd = 0;

// The file as it was when the manager was made. A short-lived value: make one, read or change it, drop it.
//
// A setter changes this copy and writes all of it back, without a second look at the file: what another process wrote
// since is lost. This is wanted; only the writing itself is serialised, by a lock file. Reading takes no lock, and sees
// an old file or a new one, never a part. Not thread-safe.
//
// What the file holds beside the two members that are known here is kept. A file that holds no object (null counts as
// an empty one) is read, but every question and every setter throws Error 120 "Not an object" and its text, so that
// nothing is overwritten that was not understood. "share" of another type than an object, and flags that are no number,
// count as absent until SetShareStatus or UnsetShareStatus replaces them.
//
// A setter throws Error 506 where the lock cannot be had, 503 where the process cannot act as root, 505 where the file
// cannot be written, 502 where its mode cannot be set or the daemon does not take the command. A change that could not
// be saved stays in this copy; when only the daemon fails, it is in the file, too.
class QUARROX_API StatusMgr {
 public:
  // Throws Error 504 where there is a file that cannot be read or is no JSON.
  StatusMgr();

  // kNotPaused, kPausedWithoutEnd, or the time in seconds since the epoch until which indexing is paused; one that has
  // passed counts as running. Throws Error 120 "Not a string" where the file holds something else than an integer.
  int64_t GetPauseInfo() const;

  // The flags of a share; 0 for one that was never set.
  int GetShareStatus(const std::string& share) const;

  // Sets flags, takes them away, or forgets the share.
  void SetShareStatus(const std::string& share, int flags);
  void UnsetShareStatus(const std::string& share, int flags);
  void ClearShareStatus(const std::string& share);

  // Pauses indexing for so many hours, without end for 0, and tells the daemon. The time is computed in 32 bits and
  // wraps. Throws Error 120 for less than 0 hours.
  void Pause(int hours);

  // Ends a pause and tells the daemon.
  void Resume();

  // Writes the file, as root and readable for all. Every setter does so; callers need not.
  void Save();

 private:
  Json::Value data_;
};

}  // namespace quarrox::fileindex
