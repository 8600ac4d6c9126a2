// Where the list of shares comes from: its text, and how to see that the text has changed.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <string>
#include <vector>

namespace platform {

// What a path led to; two that are equal stand for the same content, but for changes within one tick of the kernel's
// clock.
struct FileStamp {
  std::string path;
  bool exists = false;
  dev_t device = 0;
  ino_t inode = 0;
  off_t size = 0;
  int64_t modified = 0;  // nanoseconds since the epoch
  int64_t changed = 0;   // the same, of the inode: nobody can set it, so it tells how fresh a file is

  bool operator==(const FileStamp&) const = default;
};

struct ShareSource {
  std::string file;     // what a person would edit
  std::string text;     // empty where there is no configuration
  std::string failure;  // why the text could not be read and what to do; empty where it could
  int error = 0;        // the same as errno
  bool samba = false;   // the text is what testparm prints
  bool settled = true;  // the files did not change while they were read

  std::vector<FileStamp> stamps;
  int64_t valid_until = 0;  // nanoseconds of the monotonic clock, even if no stamp changes; 0 where it is too fresh
};

// Reads the configuration as it is now. A file that is being written is waited for, up to 0.5 s. Blocks for as long as
// testparm runs, at most 10 s. Thread-safe.
ShareSource ReadShareSource();

// Whether reading it again would give the same.
bool IsCurrent(const ShareSource& source);

}  // namespace platform
