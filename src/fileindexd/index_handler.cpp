#include "index_handler.h"

#include <cerrno>

#include "common/comm.h"
#include "common/error.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/strings.h"
#include "fileindex/elastic_control.h"
#include "fileindex/index_mgr.h"
#include "fileindex/index_mgr_move.h"
#include "fileindex/status_mgr.h"
#include "index_handler_compare.h"

namespace quarrox::fileindexd {
namespace {

namespace elastic = fileindex::elastic;
using fileindex::StatusMgr;

constexpr int kReindexFlags = fileindex::kShareNeedReindex | fileindex::kShareNeedRebuild;

bool IsSameTime(const timespec& a, const timespec& b) {
  return a.tv_sec == b.tv_sec && a.tv_nsec == b.tv_nsec;
}

struct stat LookAtEngine() {
  struct stat info;
  if (stat(kElasticdSocketPath, &info) == 0) return info;
  throw Error(kErrEngineReceive, std::string("The search engine is not there, socket=") + kElasticdSocketPath);
}

}  // namespace

bool IndexHandler::IsFlagged() const {
  return (StatusMgr().GetShareStatus(scope_.share()) & kReindexFlags) != 0;
}

// Whether the folders are others than those with which the index was made. Not again where they could not be written
// down, nor where nothing can be said of them now.
bool IndexHandler::HaveFoldersChanged() {
  try {
    scope_.Read();
  } catch (const Error&) {
    errno = 0;
    return false;
  }
  const std::optional<FolderKinds> before = FolderKinds::Load(scope_.kinds_file());
  return before && *before != scope_.kinds() && committed_kinds_ != scope_.kinds();
}

bool IndexHandler::HasWork() {
  return IsFlagged() || HaveFoldersChanged();
}

void IndexHandler::CheckEngine() const {
  const struct stat now = LookAtEngine();
  if (now.st_dev == engine_.st_dev && now.st_ino == engine_.st_ino && IsSameTime(now.st_ctim, engine_.st_ctim)) return;
  throw Error(kErrEngineReceive, "The search engine was started anew meanwhile");
}

void IndexHandler::Begin(const CheckPoint& check_point) {
  compared_.clear();
  refreshed_.clear();
  compared_all_ = false;
  rebuilt_ = false;
  writer_.Forget();
  engine_ = LookAtEngine();
  scope_.Read();
  kinds_ = scope_.kinds();
  check_point_ = [this, check_point] {
    const bool may_have_changed = check_point();
    if (!may_have_changed) return false;
    // What was found right under the old settings is looked at again.
    scope_.Read();
    compared_.clear();
    writer_.Forget();
    return true;
  };
  former_places_ = fileindex::FindFormerPlaces(scope_.share());
  if (!former_places_.empty()) WithIndex([this] { FollowMoves(); });
  if (IsFlagged()) WithIndex([this] { CompareAll(); });
  FollowFolders();
}

// The share's own directory came from elsewhere, with its folders and their documents. This is seen to first, and not
// with the other operations: in the fold a lost event, which is likely when directories come and go, takes the place of
// all. Comparing everything makes up for what is left in the queues of the former places.
void IndexHandler::FollowMoves() {
  for (const std::string& place : former_places_) {
    fileindex::FollowMovedShare(scope_.share(), place);
    for (const std::string& start : scope_.Starts(scope_.directory())) {
      const std::string old = place + start.substr(scope_.directory().size());
      if (LookAt(start).presence == Entry::kThere && elastic::IsDocumentExists(scope_.share(), old)) {
        elastic::IndexRename(scope_.share(), start, old);
      }
    }
  }
  CompareAll();
}

void IndexHandler::FollowFolders() {
  kinds_before_ = FolderKinds::Load(scope_.kinds_file());
  if (!kinds_before_ || kinds_ == *kinds_before_) return;
  for (const auto& [place, kinds] : kinds_.DifferencesFrom(*kinds_before_)) {
    if (rebuilt_) return;
    const std::string path = scope_.directory() + place;
    const Kinds& forced = kinds;
    WithIndex([&] { Compare(path, forced); });
    refreshed_.insert(path);
  }
}

Kinds IndexHandler::DifferenceOf(const std::string& path, const std::string& other) const {
  const auto kinds_at = [this](const std::string& at) {
    const bool is_here = IsAtOrBelow(at, scope_.directory());
    return is_here ? scope_.kinds().At(at.substr(scope_.directory().size())).value_or(Kinds()) : Kinds();
  };
  return kinds_at(path) ^ kinds_at(other);
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
  CreateIndex();
  CompareAll();
}

void IndexHandler::Compare(const std::string& path, const Kinds& forced) {
  if (!forced.Any() && HoldsAtOrAbove(compared_, path)) return;
  if (LookAt(path).presence == Entry::kGone) return writer_.DeleteWithAllBelow(path);
  IndexComparison(scope_, writer_, check_point_, forced).Run(path);
  compared_.insert(path);
}

void IndexHandler::CompareAll() {
  Compare(scope_.directory(), {});
  compared_all_ = true;
}

void IndexHandler::Create(const std::string& path) {
  const Entry entry = LookAt(path);
  if (entry.presence == Entry::kGone) return writer_.DeleteWithAllBelow(path);
  if (entry.presence == Entry::kUnknown) return;
  if (entry.IsDirectory()) return Compare(path, {});
  if (!scope_.Accepts(path)) return writer_.Delete(path);
  if (!writer_.IsFresh(path)) writer_.Upsert(path);
}

void IndexHandler::RefreshAttributes(const std::string& path) {
  if (LookAt(path).presence != Entry::kThere || !scope_.Accepts(path)) return Create(path);
  if (!writer_.IsFresh(path) && !writer_.RefreshAttributes(path)) Create(path);
}

void IndexHandler::Delete(const std::string& path) {
  if (LookAt(path).presence != Entry::kGone) return Create(path);
  writer_.DeleteWithAllBelow(path);
}

// The documents are moved where that saves reading the files again, and both ends are compared: renames may have come
// out of the queue in another order than they were made in.
void IndexHandler::Rename(const std::string& path, const std::string& path_old) {
  if (path == scope_.directory()) return CompareAll();
  const Entry entry = LookAt(path);
  const Kinds forced = DifferenceOf(path, path_old);
  const bool is_same_kind = GetFileExtension(path, true) == GetFileExtension(path_old, true);
  const bool can_move = entry.IsDirectory() || (is_same_kind && !forced.Any());
  if (entry.presence == Entry::kThere && can_move && scope_.Accepts(path) &&
      elastic::IsDocumentExists(scope_.share(), path_old)) {
    elastic::IndexRename(scope_.share(), path, path_old);
  }
  if (entry.IsDirectory()) {
    writer_.Forget();
  } else {
    writer_.Forget(path);
    writer_.Forget(path_old);
  }
  for (const std::string& end : {path, path_old}) {
    if (LookAt(end).presence == Entry::kGone) {
      writer_.DeleteWithAllBelow(end);
    } else {
      IndexComparison(scope_, writer_, check_point_, forced).Run(end);
    }
  }
}

void IndexHandler::CarryOut(const fileindex::OP& operation) {
  const std::string path = std::shared_ptr<fileindex::OPNode>(operation.node)->GetPath();
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
      return Compare(path, {});
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
  const auto commit = [this] { elastic::IndexCommit(scope_.share()); };
  if (!WithIndex(commit)) commit();
  CheckEngine();
  if (!kinds_before_ || kinds_ != *kinds_before_) kinds_.Save(scope_.kinds_file());
  committed_kinds_ = kinds_;
  for (const std::string& place : former_places_) fileindex::CleanFormerPlace(place);
  if (compared_all_ && IsFlagged()) StatusMgr().UnsetShareStatus(scope_.share(), kReindexFlags);
}

}  // namespace quarrox::fileindexd
