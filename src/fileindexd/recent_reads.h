// Which of the files that changed lately were read, and as what they were read.
#pragma once

#include <sys/stat.h>

#include <cstdint>
#include <ctime>
#include <functional>
#include <string>
#include <unordered_map>

namespace quarrox::fileindexd {

// Documents know times by the second and no inodes. So a file that changes again, or is replaced, in the second in
// which it was read may look as if it had not; what was read is kept here instead, for as long as a comparison may ask.
// Not thread-safe.
class RecentReads {
 public:
  // What changed before that, in seconds since the epoch, is not asked for any more, and is no longer noted.
  void Begin(int64_t asked_since, int64_t noted_since) {
    noted_since_ = noted_since;
    std::erase_if(reads_, [&](const auto& read) { return read.second.changed.tv_sec < asked_since; });
  }

  // Takes note of a file that is about to be read.
  void Add(const std::string& path, const struct stat& info) {
    if (info.st_ctim.tv_sec < noted_since_) return;
    if (reads_.size() >= kMost) reads_.clear();
    reads_.insert_or_assign(info.st_ino, Read{info.st_ctim, std::hash<std::string>()(path)});
  }

  // Whether the file was read as it is now, by the path that it had when its document was made.
  bool Has(const std::string& path, const struct stat& info) const {
    const auto found = reads_.find(info.st_ino);
    if (found == reads_.end()) return false;
    const Read& read = found->second;
    return read.changed.tv_sec == info.st_ctim.tv_sec && read.changed.tv_nsec == info.st_ctim.tv_nsec &&
           read.path_hash == std::hash<std::string>()(path);
  }

 private:
  struct Read {
    timespec changed;
    size_t path_hash;
  };

  // Some thirty megabytes. What is forgotten is read once more.
  static constexpr size_t kMost = 400000;

  int64_t noted_since_ = 0;
  std::unordered_map<ino_t, Read> reads_;
};

}  // namespace quarrox::fileindexd
