#include "move_log.h"

#include <algorithm>

namespace quarrox::notifyd {
void MoveLog::Clear() {
  ends_.clear();
  targets_.clear();
  told_.clear();
}

void MoveLog::AddEnds(const std::string& from, const std::string& to) {
  ends_.insert(from);
  ends_.insert(to);
}

void MoveLog::AddTold(const std::string& from, const std::string& to) {
  told_[from].push_back(static_cast<uint32_t>(targets_.size()));
  targets_.push_back(to);
}

// Applies the first move from number `next` on that takes `path` along.
bool MoveLog::FollowOne(std::string& path, uint32_t& next) const {
  uint32_t first = static_cast<uint32_t>(targets_.size());
  size_t source_size = 0;
  for (std::string_view source = path; !source.empty(); source = Parent(source)) {
    const auto found = told_.find(source);
    if (found == told_.end()) continue;
    const auto move = std::lower_bound(found->second.begin(), found->second.end(), next);
    if (move == found->second.end() || *move >= first) continue;
    first = *move;
    source_size = source.size();
  }
  if (first == targets_.size()) return false;
  path.replace(0, source_size, targets_[first]);
  next = first + 1;
  return true;
}

std::string MoveLog::Follow(std::string path) const {
  for (uint32_t next = 0; FollowOne(path, next);) {
  }
  return path;
}

}  // namespace quarrox::notifyd
