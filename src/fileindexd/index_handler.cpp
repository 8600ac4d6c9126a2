#include "index_handler.h"

#include <fcntl.h>

#include <algorithm>
#include <cerrno>
#include <ctime>

#include "common/comm.h"
#include "common/error.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/sdk/share.h"
#include "common/strings.h"
#include "fileindex/elastic_control.h"
#include "fileindex/index_compare.h"
#include "fileindex/index_mgr.h"
#include "fileindex/index_mgr_move.h"
#include "fileindex/status_mgr.h"
#include "tree_count.h"

namespace quarrox::fileindexd {
namespace {

namespace elastic = fileindex::elastic;
using fileindex::Entry;
using fileindex::HoldsAtOrAbove;
using fileindex::LookAt;
using fileindex::StatusMgr;

constexpr int kReindexFlags = fileindex::kShareNeedReindex | fileindex::kShareNeedRebuild;

// A comparison that has written so many documents is a long one: what is left of it is worth counting.
constexpr uint64_t kDocumentsBeforeCount = 1000;

// Files below which documents are deleted with one request.
constexpr size_t kFilesAtOnce = 1000;

// How long it may take until an event is written, in seconds.
constexpr int64_t kSlowestEvent = 5;

bool IsSameFile(const struct stat& a, const struct stat& b) {
  return a.st_dev == b.st_dev && a.st_ino == b.st_ino && a.st_ctim.tv_sec == b.st_ctim.tv_sec &&
         a.st_ctim.tv_nsec == b.st_ctim.tv_nsec;
}

struct stat LookAtEngine() {
  struct stat info;
  if (stat(kElasticdSocketPath, &info) == 0) return info;
  throw Error(kErrEngineReceive, std::string("The search engine is not there, socket=") + kElasticdSocketPath);
}

// Makes the index say what the disk says: what differs is indexed, where only the attributes changed these are
// refreshed, what is gone is deleted, and what cannot be read stays.
class Mender final : public fileindex::IndexDifferences {
 public:
  Mender(IndexWriter& writer, const OperationHandler::CheckPoint& check_point)
      : writer_(writer), check_point_(check_point) {}

  void CheckPoint() override { check_point_(); }
  void Missing(const std::string& path) override { writer_.Upsert(path); }
  void Changed(const std::string& path) override { writer_.Upsert(path); }
  // A directory has nothing else than what its attributes say.
  void AttributesChanged(const std::string& path, bool is_directory) override {
    if (is_directory || !writer_.RefreshAttributes(path)) writer_.Upsert(path);
  }
  void Gone(const std::vector<std::string>& paths) override { writer_.Delete(paths); }
  void Unreadable(const std::string& path, int error) override { writer_.NoteUnread(path, error); }

 private:
  IndexWriter& writer_;
  const OperationHandler::CheckPoint& check_point_;
};

}  // namespace

bool IndexHandler::NeedsReindex() const {
  return (StatusMgr().GetShareStatus(scope_.share()) & kReindexFlags) != 0;
}

bool IndexHandler::HasWork() {
  ReadFailures();
  const int64_t now = time(nullptr);
  const bool is_resumed = scope_.next_resume().value_or(INT64_MAX) <= now;
  return is_resumed || NeedsReindex() || !failures_.Due(now).empty() || HasOtherFolders();
}

std::optional<int64_t> IndexHandler::NextWork() const {
  const std::optional<int64_t> next_try = failures_.NextTry();
  const std::optional<int64_t> next_resume = scope_.next_resume();
  if (!next_try || !next_resume) return next_try ? next_try : next_resume;
  return std::min(*next_try, *next_resume);
}

// Whether the index was made with other folders than those of now. The list is read only when it has changed, and no
// pass is made again where they could not be written down.
bool IndexHandler::HasOtherFolders() {
  struct stat list = {};
  if (stat(fileindex::kFileIndexFoldersCfgPath, &list) != 0) list = {};
  errno = 0;
  if (folders_seen_ && IsSameFile(*folders_seen_, list)) return false;
  try {
    scope_.Read();
  } catch (const Error&) {
    errno = 0;
    return false;  // what cannot be looked at now is looked at when something happens
  }
  const std::optional<FolderKinds> before = FolderKinds::Load(scope_.kinds_file());
  if (before) {
    const FolderKinds after = scope_.kinds().After(*before, 0);
    if (after != *before && after != committed_kinds_) return true;
  }
  folders_seen_ = list;
  return false;
}

// What a pass that was not committed has changed is read anew: the engine may have lost it, too.
void IndexHandler::ReadFailures() {
  const std::string file = fileindex::IndexFailures::FileOf(sdk::SDKShare(scope_.share()));
  if (failures_.changed() || failures_.file() != file) failures_ = fileindex::IndexFailures(file);
}

const Tally& IndexHandler::tally() const {
  tally_ = writer_.tally();
  if (to_look_at_) tally_.left = *to_look_at_ - std::min(*to_look_at_, looked_at_);
  return tally_;
}

void IndexHandler::CheckEngine() const {
  if (IsSameFile(LookAtEngine(), engine_)) return;
  throw Error(kErrEngineReceive, "The search engine was started anew meanwhile");
}

// From when on, in seconds since the epoch, what changed may not be what the last committed pass read; everything where
// the clock was set back since then, nothing where there was no such pass.
int64_t IndexHandler::ChangedSince() const {
  struct stat info;
  const bool is_after_another = stat(scope_.kinds_file().c_str(), &info) == 0;
  errno = 0;
  if (!is_after_another) return INT64_MAX;
  return info.st_mtim.tv_sec > began_ ? INT64_MIN : info.st_mtim.tv_sec - kSlowestEvent;
}

void IndexHandler::Begin(const CheckPoint& check_point) {
  compared_.clear();
  refreshed_.clear();
  moved_to_.clear();
  moved_to_below_.clear();
  written_.clear();
  compared_all_ = false;
  rebuilt_ = false;
  to_look_at_.reset();
  writer_.Reset();
  engine_ = LookAtEngine();
  fileindex::EndFolderPauses(scope_.share());
  scope_.Read();
  ReadFailures();
  begun_with_ = scope_.kinds();
  began_ = time(nullptr);
  if (!tried_since_) tried_since_ = began_;
  recent_ = ChangedSince();
  writer_.recent_reads().Begin(recent_, began_ - kSlowestEvent);
  check_point_ = [this, check_point] { return check_point() && LookAgain(); };
  former_places_ = fileindex::FindFormerPlaces(scope_.share());
  if (!former_places_.empty()) WithIndex([this] { FollowMoves(); });
  if (NeedsReindex()) {
    WithIndex([this] {
      Reindex(scope_.directory());
      compared_all_ = true;
    });
  }
  FollowFolders();
  TryAgain();
}

// The settings may have changed. What was found right under the old ones is looked at again.
bool IndexHandler::LookAgain() {
  const bool had_paused = !scope_.paused().empty();
  scope_.Read();
  if ((had_paused || !scope_.paused().empty()) && scope_.kinds() != begun_with_) throw StartAnew();
  compared_.clear();
  writer_.Forget();
  return true;
}

// What does not fail once more is no failure any more. In a paused folder it is put off.
void IndexHandler::TryAgain() {
  const int64_t now = time(nullptr);
  for (const std::string& place : failures_.Due(now)) {
    const fileindex::IndexFailure* failure = failures_.Find(place);
    if (failure == nullptr || !failure->IsDue(now)) continue;  // it was met on the way
    if (IsPausedPlace(place)) {
      failures_.Note(place, fileindex::IndexFailure(*failure));
      continue;
    }
    const uint32_t tries = failure->tries;
    check_point_();
    WithIndex([&] { Create(scope_.directory() + place); });
    failure = failures_.Find(place);
    if (failure != nullptr && failure->tries == tries && failure->IsDue(now)) failures_.Forget(place);
  }
}

// A comparison that somebody asked for: what failed is tried again whatever it was.
void IndexHandler::Reindex(const std::string& path, const Kinds& forced) {
  std::vector<std::string> failed;
  if (const std::optional<std::string> place = writer_.PlaceOf(path)) failed = failures_.AtOrBelow(*place);
  std::erase_if(failed, [this](const std::string& place) { return IsPausedPlace(place); });
  for (const std::string& place : failed) {
    failures_.Forget(place);
    writer_.Forget(scope_.directory() + place);
  }
  if (path == scope_.directory() && failures_.empty()) failures_.ForgetBelow("");  // those beyond the limit, too
  if (!failed.empty()) compared_.clear();
  Compare(path, forced);
  for (const std::string& place : failed) {
    const std::string full_path = scope_.directory() + place;
    if (failures_.Find(place) == nullptr && LookAt(full_path).presence != Entry::kGone) Create(full_path);
  }
}

// Failures of what is not there, or not to be indexed, any more. The index never knew some of them.
void IndexHandler::ForgetStrangers(const std::string& path) {
  const std::optional<std::string> place = writer_.PlaceOf(path);
  if (!place) return;
  for (const std::string& failed : failures_.AtOrBelow(*place)) {
    const std::string full_path = scope_.directory() + failed;
    if (scope_.IsPaused(full_path)) continue;
    if (LookAt(full_path).presence == Entry::kGone || !scope_.Covers(full_path)) failures_.Forget(failed);
  }
}

// The share's own directory came from elsewhere, with its folders and their documents. This is seen to first, and not
// with the other operations: in the fold a lost event, which is likely when directories come and go, takes the place of
// all. Comparing everything makes up for what is left in the queues of the former places.
void IndexHandler::FollowMoves() {
  for (const std::string& place : former_places_) {
    fileindex::FollowMovedShare(scope_.share(), place);
    for (const std::string& start : scope_.Starts(scope_.directory(), IndexScope::Paused::kToo)) {
      const std::string old = place + start.substr(scope_.directory().size());
      if (LookAt(start).presence == Entry::kThere && elastic::IsDocumentExists(scope_.share(), old)) {
        writer_.Move(start, old, check_point_);
      }
    }
  }
  CompareAll();
}

void IndexHandler::FollowFolders() {
  kinds_before_ = FolderKinds::Load(scope_.kinds_file());
  // Where no pass was committed, the first one may have read some of what is paused.
  const int64_t since = kinds_before_ ? ChangedSince() : *tried_since_ - kSlowestEvent;
  kinds_ = scope_.kinds().After(kinds_before_.value_or(FolderKinds()), since);
  if (!kinds_before_ || kinds_ == *kinds_before_) return;
  for (const FolderKinds::Difference& difference : kinds_.DifferencesFrom(*kinds_before_)) {
    if (rebuilt_) return;
    const std::string path = scope_.directory() + difference.path;
    if (difference.unseen_since) {
      const int64_t recent = std::exchange(recent_, std::min(recent_, *difference.unseen_since));
      compared_.clear();
      WithIndex([&] { Reindex(path, difference.kinds); });
      recent_ = recent;
    } else {
      WithIndex([&] { Compare(path, difference.kinds); });
    }
    refreshed_.insert(path);
  }
}

// What happens in a paused folder is seen to when it is resumed; in folders below it, that are not paused, now. False
// where the path is in none.
bool IndexHandler::PassOver(const std::string& path) {
  if (!scope_.IsPaused(path)) return false;
  for (const std::string& start : scope_.Starts(path)) Compare(start, {});
  return true;
}

Kinds IndexHandler::DifferenceOf(const std::string& path, const std::string& other) const {
  return scope_.KindsAt(path) ^ scope_.KindsAt(other);
}

// False where there was no index: everything has been indexed then instead.
bool IndexHandler::WithIndex(const std::function<void()>& work) {
  try {
    work();
    return true;
  } catch (const Error& error) {
    if (int{error.code} != kElasticdNoSuchIndex || rebuilt_) throw;
    errno = 0;
    QUARROX_LOG_FAILURE("The search engine has no index of share %s, so it is made anew, reason=%s",
                        scope_.share().c_str(), error.reason.c_str());
  }
  Rebuild();
  return false;
}

// Who deletes the last folder of a share holds the lock from before its index is gone until the list is saved.
void IndexHandler::CreateIndex() const {
  const LockFile lock(fileindex::kFolderLockPath, true);
  if (!fileindex::FolderMgr().IsShareIndexed(scope_.share())) {
    throw Error(kErrNoSuchFolder, "The share " + scope_.share() + " has no folder any more");
  }
  StatusMgr().SetShareStatus(scope_.share(), kReindexFlags);
  elastic::ShareIndexCreate(scope_.share());
}

void IndexHandler::Rebuild() {
  rebuilt_ = true;
  compared_.clear();
  writer_.Forget();
  failures_.ForgetBelow("");
  CreateIndex();
  CompareAll();
}

// Whether a file's document is to be made anew also where it looks right.
bool IndexHandler::IsDoubtful(const std::string& file, const struct stat& info, const Documents& documents) {
  if (documents.of_others && !writer_.IsFresh(file)) return true;
  if (info.st_ctim.tv_sec < recent_) return false;
  RecentReads& reads = writer_.recent_reads();
  if (documents.moved_from.empty()) return !reads.Has(file, info);
  // The rename itself is the last change of what was renamed.
  if (file.size() == documents.moved_to.size()) return false;
  if (!reads.Has(documents.moved_from + file.substr(documents.moved_to.size()), info)) return true;
  reads.Add(file, info);
  return false;
}

// A comparison calls its check point once for each file and directory that it looks at.
void IndexHandler::FindDifferences(const std::string& path, const Kinds& forced, const Documents& documents) {
  looked_at_ = 0;
  const uint64_t done_before = writer_.tally().done;
  const OperationHandler::CheckPoint check_point = [&] {
    ++looked_at_;
    if (!to_look_at_ && writer_.tally().done - done_before >= kDocumentsBeforeCount) CountLooks(path);
    return check_point_();
  };
  Mender mender(writer_, check_point);
  const auto is_forced = [&](const std::string& file, const struct stat& info) {
    return IsDoubtful(file, info, documents) || (forced.Any() && !S_ISDIR(info.st_mode) && forced.Has(file));
  };
  fileindex::IndexComparison(scope_, mender, is_forced).Run(path);
  to_look_at_.reset();
  ForgetStrangers(path);
}

void IndexHandler::Compare(const std::string& path, const Kinds& forced) {
  if (!forced.Any() && HoldsAtOrAbove(compared_, path)) return;
  if (LookAt(path).presence == Entry::kGone) return writer_.DeleteWithAllBelow(path);
  FindDifferences(path, forced, {});
  compared_.insert(path);
}

void IndexHandler::CountLooks(const std::string& path) {
  uint64_t count = 0;
  for (const std::string& start : scope_.Starts(path)) count += CountTree(scope_, start, check_point_);
  to_look_at_ = count;
}

void IndexHandler::CompareAll() {
  Compare(scope_.directory(), {});
  compared_all_ = true;
}

void IndexHandler::Create(const std::string& path) {
  const Entry entry = LookAt(path);
  if (entry.presence == Entry::kGone) return writer_.DeleteWithAllBelow(path);
  if (entry.presence == Entry::kUnknown) return writer_.NoteUnread(path, entry.error);
  if (entry.IsDirectory()) return Compare(path, {});
  if (!scope_.Accepts(path)) return writer_.DeleteWithAllBelow(path);
  if (writer_.IsFresh(path)) return;
  writer_.Upsert(path);
  written_.push_back(path);
  if (written_.size() == kFilesAtOnce) DeleteBelowFiles();
}

// A file may stand where a directory was, about which nothing else was told.
void IndexHandler::DeleteBelowFiles() {
  std::erase_if(written_, [](const std::string& path) { return LookAt(path).IsDirectory(); });
  writer_.DeleteBelow(written_);
  written_.clear();
}

void IndexHandler::RefreshAttributes(const std::string& path) {
  if (LookAt(path).presence != Entry::kThere || !scope_.Accepts(path)) return Create(path);
  if (!writer_.IsFresh(path) && !writer_.RefreshAttributes(path)) Create(path);
}

void IndexHandler::Delete(const std::string& path) {
  if (LookAt(path).presence != Entry::kGone) return Create(path);
  writer_.DeleteWithAllBelow(path);
}

// Whether the documents at a path and below it may be others than when the pass began.
bool IndexHandler::MayHaveChanged(const std::string& path) const {
  if (writer_.IsFresh(path) || HoldsAtOrAbove(compared_, path) || HoldsAtOrAbove(moved_to_, path)) return true;
  const auto below = moved_to_below_.upper_bound(path + '/');
  return below != moved_to_below_.end() && below->starts_with(path + '/');
}

// Moves the documents of what was renamed. False where they may be those of something else, which came to the old place
// since, or where one place lies in the other.
bool IndexHandler::Move(const std::string& path, const std::string& path_old) {
  const bool is_nested = HoldsAtOrAbove({path}, path_old) || HoldsAtOrAbove({path_old}, path);
  if (is_nested || MayHaveChanged(path_old) || !elastic::IsDocumentExists(scope_.share(), path_old)) return false;
  writer_.DeleteWithAllBelow(path);
  const bool moved = writer_.Move(path, path_old, check_point_);
  writer_.Forget();
  if (!moved) return false;
  moved_to_.insert(path);
  moved_to_below_.insert(path);
  return true;
}

// The documents are moved where that saves reading the files again, and both ends are compared: renames may have come
// out of the queue in another order than they were made in. What is not moved is read, also where a document of what
// was there before looks the same.
void IndexHandler::Rename(const std::string& path, const std::string& path_old) {
  if (path == scope_.directory()) return CompareAll();
  const Entry entry = LookAt(path);
  const Kinds forced = DifferenceOf(path, path_old);
  const bool is_same_kind = GetFileExtension(path, true) == GetFileExtension(path_old, true);
  // The documents of what is paused may be out of date.
  const bool has_paused = scope_.HasPaused(path) || scope_.HasPaused(path_old);
  const bool can_move = !has_paused && (entry.IsDirectory() || (is_same_kind && !forced.Any()));
  const bool moved = entry.presence == Entry::kThere && can_move && scope_.Accepts(path) && Move(path, path_old);
  const Documents at_path = moved ? Documents{.moved_from = path_old, .moved_to = path} : Documents{.of_others = true};
  for (const std::string& end : {path, path_old}) {
    for (const std::string& start : scope_.IsPaused(end) ? scope_.Starts(end) : std::vector<std::string>{end}) {
      if (LookAt(start).presence == Entry::kGone) {
        writer_.DeleteWithAllBelow(start);
      } else {
        FindDifferences(start, forced, end == path ? at_path : Documents());
      }
    }
  }
}

void IndexHandler::CarryOut(const fileindex::OP& operation) {
  const std::string path = std::shared_ptr<fileindex::OPNode>(operation.node)->GetPath();
  const bool is_for_one_path = operation.op != fileindex::kOpRename && operation.op != fileindex::kOpQueueCrashed;
  if (is_for_one_path && PassOver(path)) return;
  switch (operation.op) {
    case fileindex::kOpDelete:
      return Delete(path);
    case fileindex::kOpCreate:
      return Create(path);
    case fileindex::kOpAttr:
      return RefreshAttributes(path);
    case fileindex::kOpUpdateDirectory:
      return Compare(path, HoldsAtOrAbove(refreshed_, path) ? Kinds() : Kinds::Of(operation.data));
    case fileindex::kOpRename:
      return Rename(path, operation.path_old);
    case fileindex::kOpReindex:
      return Reindex(path);
    case fileindex::kOpQueueCrashed:
      return CompareAll();
    case fileindex::kOpNone:
      return;
  }
}

void IndexHandler::Handle(const fileindex::OP& operation) {
  CheckEngine();
  check_point_();
  WithIndex([&] { CarryOut(operation); });
}

void IndexHandler::Commit() {
  WithIndex([this] { DeleteBelowFiles(); });
  const auto commit = [this] { elastic::IndexCommit(scope_.share()); };
  if (!WithIndex(commit)) commit();
  CheckEngine();
  failures_.Save();
  if (!kinds_before_ || kinds_ != *kinds_before_) kinds_.Save(scope_.kinds_file());
  committed_kinds_ = kinds_;
  tried_since_.reset();
  scope_.NoteDisk();
  const timespec times[] = {{0, UTIME_OMIT}, {began_, 0}};
  if (utimensat(AT_FDCWD, scope_.kinds_file().c_str(), times, 0) != 0) {
    QUARROX_LOG_FAILURE("The time of %s cannot be set", scope_.kinds_file().c_str());
    errno = 0;
  }
  for (const std::string& place : former_places_) fileindex::CleanFormerPlace(place);
  if (compared_all_ && NeedsReindex()) StatusMgr().UnsetShareStatus(scope_.share(), kReindexFlags);
}

}  // namespace quarrox::fileindexd
