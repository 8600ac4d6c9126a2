// Mutual exclusion between processes that share a file.
#pragma once

#include <string>

#include "common/export.h"

namespace quarrox {

// An advisory whole-file lock for the span of a scope: shared to read, exclusive to change. The file is made with mode
// 0644 where it is absent and stays after use. Not thread-safe: one object, one thread.
class QUARROX_API LockFile {
 public:
  // Waits for the lock by trying 64 times, 0 to 0.9 s apart (chosen anew each time, so that competitors do not keep
  // step): a minute at worst. Throws Error 506 when the file cannot be opened or locked, or the tries are used up.
  LockFile(const std::string& path, bool exclusive);
  ~LockFile();
  LockFile(const LockFile&) = delete;
  LockFile& operator=(const LockFile&) = delete;

 private:
  int fd_;
  std::string path_;
};

}  // namespace quarrox
