// A share's event queue as a file: appending lines to it, taking it away from those who append, and reading it.
//
// A producer locks the queue file, makes sure that what it locked is still the file at that path (else it starts over),
// appends with one write and unlocks. The consumer renames under the same lock. So no line is ever written into a file
// that was already taken away.
//
// Signals that interrupt a call are no failure. Thread-safe, where one object is used by one thread.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "common/export.h"
#include "common/unique_fd.h"

namespace quarrox {

// Appends `lines`, whole newline-terminated lines, to the queue at `path`, which is made with mode 0600 where it is
// absent; what root makes belongs to the owner of the directory. Waits in the kernel for the lock. All of `lines` is
// appended or nothing: a write cut short (a full disk) is undone. Throws Error 502 with the reason "Failed to append to
// queue, path=PATH, reason=TEXT", which is not logged: whoever tries again says so once.
QUARROX_API void AppendToQueue(const std::string& path, const std::string& lines);

// The same with a LockFile as the lock, for who must not wait without end. Throws also what that throws.
QUARROX_API void AppendToQueueWithLockFile(const std::string& path, const std::string& lines);

// Renames the queue at `path` to `to`, waiting in the kernel for the lock. False with errno where that fails, both then
// as they were: ENOENT where there is no queue, EEXIST where something is at `to` already.
QUARROX_API bool TakeQueue(const std::string& path, const std::string& to);

// Waits until nobody holds the lock of a queue that was taken: a producer that renames and locks by rules of its own
// may still be writing into it. False with errno where it cannot be waited for: ENOENT where the file is missing.
QUARROX_API bool WaitForProducers(const std::string& taken_path);

// Reads a file line by line, in large blocks, into one buffer that grows to the longest line.
class QueueLines {
 public:
  // Twenty times what the longest paths and a folder's whole configuration need.
  static constexpr size_t kMaxLine = size_t{16} * 1024 * 1024;

  // A file that cannot be opened has no lines, and an error; errno is left alone.
  explicit QueueLines(const std::string& path);

  // The next line without its newline, which the last may lack; false at the end, or where reading fails. The text is
  // valid until the next call.
  bool Next(std::string_view& line);

  // Whether the line that Next gave is the beginning of one that is longer than kMaxLine.
  bool overlong() const { return overlong_; }

  // An errno; 0 for none.
  int error() const { return error_; }

 private:
  bool NextInBuffer(std::string_view& line);
  bool Fill();

  UniqueFd fd_;
  std::vector<char> buffer_;
  size_t begin_ = 0;
  size_t end_ = 0;
  size_t searched_ = 0;  // how much of what is left has no newline
  bool at_end_ = false;
  bool cut_ = false;
  bool overlong_ = false;
  int error_ = 0;
};

}  // namespace quarrox
