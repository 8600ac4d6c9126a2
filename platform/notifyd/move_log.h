// The directory renames of one batch of events, and what they do to what a reader knows by path. Not thread-safe.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include "paths.h"

namespace quarrox::notifyd {

class MoveLog {
 public:
  void Clear();
  bool empty() const { return ends_.empty(); }

  // A directory moved: what is said about paths at or below either end is in doubt.
  void AddEnds(const std::string& from, const std::string& to);
  bool Covers(std::string_view path) const { return IsCovered(ends_, path); }

  // The reader was told to move what it knows at and below `from`.
  void AddTold(const std::string& from, const std::string& to);

  // Where the reader, having followed all that it was told, has what it knew at `path` before.
  std::string Follow(std::string path) const;

 private:
  bool FollowOne(std::string& path, uint32_t& next) const;

  PathSet ends_;
  std::vector<std::string> targets_;
  std::unordered_map<std::string, std::vector<uint32_t>, PathHash, std::equal_to<>>
      told_;  // by source: indices of targets_
};

}  // namespace quarrox::notifyd
