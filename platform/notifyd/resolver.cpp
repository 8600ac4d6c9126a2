#include "resolver.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <utility>

namespace quarrox::notifyd {
namespace {

bool IsAbsent(int error) {
  return error == ENOENT || error == ENOTDIR || error == ESTALE;
}

}  // namespace

// Each directory is located once a batch, after the batch was read: a move that this misses comes in the next batch.
TouchedDir& Resolver::Locate(uint32_t index) {
  TouchedDir& dir = batch_->dirs[index];
  if (dir.place != Place::kUnknown) return dir;
  switch (handles_.Locate(dir.handle, dir.path)) {
    case DirHandles::State::kFound:
      dir.place = scope_.MayHold(dir.path) ? Place::kRelevant : Place::kElsewhere;
      break;
    case DirHandles::State::kFailed:
      lost_ = true;
      [[fallthrough]];
    case DirHandles::State::kGone:
      dir.place = Place::kGone;
  }
  if (dir.place != Place::kRelevant) std::string().swap(dir.path);
  return dir;
}

// False where the name is outside the tree or its directory is gone.
bool Resolver::PathOf(uint32_t touch, std::string& path) {
  if (touch == kNone) return false;
  const TouchedName& name = batch_->names[touch];
  const TouchedDir& dir = Locate(name.dir);
  if (dir.place != Place::kRelevant || !scope_.IsInside(dir.path, batch_->Name(name))) return false;
  path = Join(dir.path, batch_->Name(name));
  return true;
}

void Resolver::LogMoves() {
  std::string from;
  std::string to;
  for (const Rename& rename : batch_->renames) {
    if (rename.is_dir && PathOf(rename.from, from) && PathOf(rename.to, to)) moves_.AddEnds(from, to);
  }
}

bool Resolver::IsShifted(uint32_t touch) {
  return touch != kNone && moves_.Covers(Locate(batch_->names[touch].dir).path);
}

// What happened to a name before it was renamed is said of its new name. A name that was deleted or created may have
// stood for more than one thing, so the reader must look at what was moved.
void Resolver::CarryBits(const Rename& rename) {
  if (rename.from == kNone || rename.to == kNone) return;
  const TouchedName& from = batch_->names[rename.from];
  uint32_t bits = rename.is_dir ? from.dir_bits : from.file_bits;
  if (previous_ != nullptr) {
    const uint32_t earlier = previous_->Find(batch_->dirs[from.dir].handle, batch_->Name(from));
    if (earlier != kNone)
      bits |= rename.is_dir ? previous_->names[earlier].dir_bits : previous_->names[earlier].file_bits;
  }
  if ((bits & kDeleted) != 0) bits ^= kDeleted | (~bits & kCreated);
  batch_->AddBits(rename.to, static_cast<uint8_t>(bits), rename.is_dir);
}

// Whether the reader may have something else at the rename's source than what was moved: because it was told that the
// source moved away, or because the source saw so many renames that some may have been merged.
bool Resolver::IsDoubtful(const Rename& rename) const {
  if (rename.from == kNone) return false;
  const TouchedName& from = batch_->names[rename.from];
  return from.told > 1 || (from.told == 1 && !from.told_arrived);
}

void Resolver::MarkTold(uint32_t touch, bool arrived) {
  if (touch == kNone) return;
  TouchedName& name = batch_->names[touch];
  if (name.told < 2) ++name.told;
  name.told_arrived = arrived;
}

// Has both ends written as they are found, and what is at the new one as created.
void Resolver::MarkInexact(const Rename& rename) {
  if (rename.from != kNone) batch_->names[rename.from].ends = 2;
  if (rename.to == kNone) return;
  batch_->names[rename.to].ends = 2;
  batch_->AddBits(rename.to, kCreated, rename.is_dir);
}

void Resolver::WriteExact(const Rename& rename) {
  std::string from;
  std::string to;
  const bool from_inside = PathOf(rename.from, from);
  const bool to_inside = PathOf(rename.to, to);
  if (from_inside && to_inside) {
    sink_.Add({kRenamed, rename.is_dir, to, from});
    if (rename.is_dir) moves_.AddTold(from, to);
  } else if (from_inside) {
    Write(kDeleted, rename.is_dir, from);
  } else if (to_inside) {
    Write(kCreated, rename.is_dir, to);
  }
}

void Resolver::WriteRename(const Rename& rename) {
  CarryBits(rename);
  const bool shifted = IsShifted(rename.from) || IsShifted(rename.to);
  if (shifted || IsDoubtful(rename)) MarkInexact(rename);
  if (!shifted) WriteExact(rename);
  MarkTold(rename.from, false);
  MarkTold(rename.to, true);
}

// Adds a name of the previous batch to this one, to be looked at again.
void Resolver::TakeUp(uint32_t touch) {
  if (touch == kNone) return;
  const TouchedName& old = previous_->names[touch];
  const uint32_t again = batch_->Touch(previous_->dirs[old.dir].handle, previous_->Name(old));
  batch_->AddBits(again, old.file_bits, false);
  batch_->AddBits(again, old.dir_bits, true);
  if (old.ends == 0) return;
  TouchedName& name = batch_->names[again];
  if (name.ends == 0) name.end_is_dir = old.end_is_dir;
  name.ends = 2;
}

// Which directories of the previous batch this batch's renames moved, by where they were then or are now.
std::vector<bool> Resolver::MovedSincePrevious() {
  std::vector<bool> moved;
  for (const TouchedDir& dir : previous_->dirs) {
    moved.push_back(dir.place == Place::kRelevant &&
                    (moves_.Covers(dir.path) || moves_.Covers(Locate(batch_->Dir(dir.handle)).path)));
  }
  return moved;
}

void Resolver::TakeUpPrevious() {
  if (previous_ == nullptr) return;
  const std::vector<bool> moved = MovedSincePrevious();
  const auto is_moved = [&](uint32_t touch) { return touch != kNone && moved[previous_->names[touch].dir]; };
  for (uint32_t touch = 0; touch < previous_->names.size(); ++touch) {
    if (is_moved(touch)) TakeUp(touch);
    LookAfter(touch);
  }
  for (const Rename& rename : previous_->renames) {
    if (!is_moved(rename.from) && !is_moved(rename.to)) continue;
    TakeUp(rename.from);
    TakeUp(rename.to);
  }
  for (const Look& look : previous_looks_) LookWhereReaderHas(look);
}

void Resolver::LookAfter(uint32_t touch) {
  const TouchedName& name = previous_->names[touch];
  const TouchedDir& dir = previous_->dirs[name.dir];
  if (dir.place != Place::kRelevant || !scope_.IsInside(dir.path, previous_->Name(name))) return;
  const bool is_dir = name.dir_bits != 0 || (name.ends != 0 && name.end_is_dir);
  const bool attributes_only = name.ends == 0 && name.file_bits == 0 && name.dir_bits == kAttributes;
  LookWhereReaderHas({Join(dir.path, previous_->Name(name)), is_dir, attributes_only});
}

// Looks again at what was told about a path, if that was moved or replaced for the reader.
void Resolver::LookWhereReaderHas(const Look& look) {
  if (!moves_.Covers(look.path)) return;
  looks_.push_back({moves_.Follow(look.path), look.is_dir, look.attributes_only});
  WriteLook(looks_.back());
}

void Resolver::WriteLook(const Look& look) {
  struct stat st = {};
  if (lstat(look.path.c_str(), &st) != 0) {
    lost_ = lost_ || !IsAbsent(errno);
    return Write(kDeleted, look.is_dir, look.path);
  }
  const bool is_dir = S_ISDIR(st.st_mode);
  Write(is_dir && look.attributes_only ? kAttributes : kCreated, is_dir, look.path);
}

void Resolver::WriteGone(const TouchedName& touch, const std::string& path) {
  const bool dir_gone = (touch.dir_bits & kDeleted) != 0 || (touch.ends > 1 && touch.end_is_dir);
  if (!dir_gone && (touch.file_bits & kDeleted) == 0 && touch.ends < 2) return;  // a later event will speak
  Write(kDeleted, dir_gone, path);
}

void Resolver::WriteFound(const TouchedName& touch, bool is_dir, const std::string& path) {
  const uint8_t bits = is_dir ? touch.dir_bits : touch.file_bits;
  const uint8_t other_bits = is_dir ? touch.file_bits : touch.dir_bits;
  const bool as_renamed = touch.ends == 1 && touch.arrived && touch.end_is_dir == is_dir;
  const bool replaced = (other_bits & kDeleted) != 0;
  if (replaced) Write(kDeleted, !is_dir, path);
  if (replaced || (bits & (kCreated | kDeleted)) != 0 || (touch.ends != 0 && !as_renamed)) {
    Write(kCreated, is_dir, path);
  } else if ((bits & kWritten) != 0) {
    Write(kWritten, is_dir, path);
  } else if ((bits & kAttributes) != 0) {
    Write(kAttributes, is_dir, path);
  }
}

void Resolver::WriteName(const TouchedName& touch, int dir_fd, const std::string& path) {
  const std::string name(batch_->Name(touch));
  struct stat st = {};
  if (fstatat(dir_fd, name == "." ? "" : name.c_str(), &st, AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT | AT_EMPTY_PATH) ==
      0) {
    WriteFound(touch, S_ISDIR(st.st_mode), path);
  } else if (IsAbsent(errno)) {
    WriteGone(touch, path);
  } else {
    lost_ = true;
  }
}

void Resolver::WriteDir(uint32_t index) {
  if (Locate(index).place != Place::kRelevant) return;
  const TouchedDir& dir = batch_->dirs[index];
  const int fd = handles_.Open(dir.handle);
  if (fd < 0) {
    lost_ = lost_ || !IsAbsent(errno);
    return;
  }
  for (uint32_t touch = dir.first; touch != kNone; touch = batch_->names[touch].next) {
    std::string path;
    if (PathOf(touch, path)) WriteName(batch_->names[touch], fd, path);
  }
}

void Resolver::Resolve(std::unique_ptr<EventBatch> batch) {
  batch_ = std::move(batch);
  moves_.Clear();
  lost_ = batch_->overflowed;
  LogMoves();
  for (const Rename& rename : batch_->renames) WriteRename(rename);
  if (!moves_.empty()) {
    lost_ = lost_ || unverified_;
    TakeUpPrevious();
  }
  for (uint32_t dir = 0; dir < batch_->dirs.size(); ++dir) WriteDir(dir);
  if (lost_) Write(kLost, false, scope_.dir());
  unverified_ = !batch_->complete && previous_ != nullptr;
  previous_ = std::move(batch_);
  previous_looks_ = std::exchange(looks_, {});
}

void Resolver::Settle() {
  previous_.reset();
  previous_looks_.clear();
  unverified_ = false;
}

}  // namespace quarrox::notifyd
