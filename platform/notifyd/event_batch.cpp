#include "event_batch.h"

namespace quarrox::notifyd {

uint32_t EventBatch::Dir(std::string_view handle) {
  if (last_dir_ != kNone && dirs[last_dir_].handle == handle) return last_dir_;  // events come in runs
  const auto [found, added] = dirs_by_handle_.try_emplace(std::string(handle), static_cast<uint32_t>(dirs.size()));
  if (added) dirs.emplace_back().handle = handle;
  return last_dir_ = found->second;
}

uint32_t EventBatch::Touch(std::string_view handle, std::string_view name) {
  const uint32_t dir = Dir(handle);
  const auto found = names_by_key_.find(Key{dir, name});
  if (found != names_by_key_.end()) return *found;
  const auto touch = static_cast<uint32_t>(names.size());
  names.push_back({dir, kNone, static_cast<uint32_t>(text_.size()), static_cast<uint16_t>(name.size())});
  text_ += name;
  names_by_key_.insert(touch);
  TouchedDir& list = dirs[dir];
  (list.last == kNone ? list.first : names[list.last].next) = touch;
  list.last = touch;
  return touch;
}

uint32_t EventBatch::Find(const std::string& handle, std::string_view name) const {
  const auto dir = dirs_by_handle_.find(handle);
  if (dir == dirs_by_handle_.end()) return kNone;
  const auto touch = names_by_key_.find(Key{dir->second, name});
  return touch == names_by_key_.end() ? kNone : *touch;
}

void EventBatch::AddBits(uint32_t touch, uint8_t bits, bool is_dir) {
  TouchedName& name = names[touch];
  uint8_t& mine = is_dir ? name.dir_bits : name.file_bits;
  mine = static_cast<uint8_t>(mine | bits);
}

void EventBatch::MarkEnd(uint32_t touch, bool arrived, bool is_dir) {
  if (touch == kNone) return;
  TouchedName& name = names[touch];
  if (name.ends < 2) ++name.ends;
  name.arrived = arrived;
  name.end_is_dir = is_dir;
}

void EventBatch::AddRename(uint32_t from, uint32_t to, bool is_dir) {
  MarkEnd(from, false, is_dir);
  MarkEnd(to, true, is_dir);
  renames.push_back({from, to, is_dir});
}

}  // namespace quarrox::notifyd
