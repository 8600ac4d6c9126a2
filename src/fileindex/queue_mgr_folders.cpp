#define QUARROX_LOG_UNIT "queue_mgr"

#include "fileindex/queue_mgr_folders.h"

#include <iterator>
#include <memory>
#include <utility>

#include "fileindex/optree.h"
#include "fileindex/optree_fold.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/queue_mgr_search.h"

namespace quarrox::fileindex {
namespace {

bool ConcernsAllBelow(const EventView& event) {
  constexpr uint32_t kAlways = kEventReindex | kEventRename;
  constexpr uint32_t kDirectory = kEventCreate | kEventDelete;  // they become reindexes
  return (event.event & (kAlways | (event.is_dir ? kDirectory : 0))) != 0;
}

// The directory of a plain path, without a slash; empty for what lies at the top.
std::string_view DirectoryOf(std::string_view path) {
  const size_t slash = path.rfind('/');
  return path.substr(0, slash == std::string_view::npos ? 0 : slash);
}

// Calls `visit` with a path as its node bears it and each directory above it, the deepest first, until it says so.
template <typename Visit>
void VisitUpwards(const std::string& path, const Visit& visit) {
  const std::string node = NodePath(path);
  std::string_view place = node;
  while (visit(place) && !place.empty()) place = DirectoryOf(place);
}

// Whether an event concerns one path.
bool Concerns(const EventView& event, const std::string& path) {
  const auto concerns = [&](std::string_view place) {
    return CanHaveNode(place) && IsAtOrBelow(path, place) && (ConcernsAllBelow(event) || IsAtOrBelow(place, path));
  };
  if ((event.event & kEventQueueDamaged) != 0 || concerns(event.path)) return true;
  return (event.event & kEventRename) != 0 && concerns(event.path_old);
}

}  // namespace

bool QueueMgr::IsFullPathPending(const std::string& path) const {
  for (const std::string& queue_path : {queue_path_, queue_path_tmp_}) {
    QueueSearch queue(queue_path);
    if (queue.Find([&](const EventView& event) { return Concerns(event, path); })) return true;
  }
  return false;
}

FolderEvents::FolderEvents(const std::string& full_path, const FolderMgr& folders)
    : full_path_(full_path), folders_(folders), is_folder_(folders.IsFullPathHasOwnCfg(full_path)) {}

bool FolderEvents::Accepts(const EventView& event) {
  if ((event.event & kEventQueueDamaged) != 0) return true;
  if (Touches(event, event.path)) return true;
  return (event.event & kEventRename) != 0 && Touches(event, event.path_old) && CanHaveNode(event.path);
}

// From a path that can have no node comes no operation.
bool FolderEvents::Touches(const EventView& event, std::string_view place) {
  if (ConcernsAllBelow(event) && IsAtOrBelow(full_path_, place)) return CanHaveNode(place);
  return is_folder_ && IsAtOrBelow(place, full_path_) && CanHaveNode(place) && IsGoverned(place);
}

bool FolderEvents::IsGoverned(std::string_view place) {
  const auto next = inner_.upper_bound(place);
  if (next != inner_.begin() && place.starts_with(*std::prev(next))) return false;
  const std::shared_ptr<Folder> folder = folders_.GetMostSuitableCfg(NodePath(place));
  if (folder == nullptr) return false;
  if (folder->GetFullPath() == full_path_) return true;
  AddInner(folder->GetFullPath() + "/");
  return false;
}

void FolderEvents::AddInner(const std::string& prefix) {
  auto covered = inner_.lower_bound(prefix);
  while (covered != inner_.end() && covered->starts_with(prefix)) covered = inner_.erase(covered);
  inner_.insert(prefix);
}

// --- all folders of a list -----------------------------------------------------------------------------------------

bool PendingFolders::IsProcessing(const std::string& queue_path, const std::string& full_path) {
  const Pending& pending = PendingOf(queue_path);
  if (pending.everything || pending.folders.contains(full_path)) return true;
  bool found = false;
  if (!pending.trees.empty()) {
    VisitUpwards(full_path, [&](std::string_view place) { return !(found = pending.trees.contains(place)); });
  }
  if (!found && pending.error) throw Error(*pending.error);
  return found;
}

const PendingFolders::Pending& PendingFolders::PendingOf(const std::string& queue_path) {
  const auto known = queues_.find(queue_path);
  if (known != queues_.end()) return known->second;
  Pending pending;
  for (const std::string& path : {queue_path, queue_path + ".tmp"}) {
    if (!pending.everything && !pending.error) Read(path, pending);
  }
  return queues_.emplace(queue_path, std::move(pending)).first->second;
}

void PendingFolders::Read(const std::string& path, Pending& pending) {
  std::optional<QueueSearch> queue;
  try {
    queue.emplace(path);
  } catch (const Error& error) {
    pending.error.emplace(error);
  }
  if (!queue || queue->missing()) return;
  RequirePlaces();
  known_directory_.clear();  // of another file
  try {
    pending.everything = queue->Find([&](const EventView& event) {
      Add(event, event.path, pending);
      if ((event.event & kEventRename) != 0 && CanHaveNode(event.path)) Add(event, event.path_old, pending);
      return (event.event & kEventQueueDamaged) != 0;
    });
  } catch (const Error& error) {
    pending.error.emplace(error);
  }
}

void PendingFolders::RequirePlaces() {
  if (places_) return;
  folders_.IsFullPathIndexed("");  // every full path is known from here on, or one cannot be told
  places_.emplace();
  for (const auto& folder : folders_.GetFolders()) {
    bool below = false;
    VisitUpwards(folder->GetFullPath(), [&](std::string_view place) {
      bool& known = places_->try_emplace(std::string(place), false).first->second;
      if (known) return false;  // and all above, too
      known = std::exchange(below, true);
      return true;
    });
  }
}

bool PendingFolders::HasFolderBelow(std::string_view directory) const {
  const auto place = places_->find(directory);
  return place != places_->end() && place->second;
}

void PendingFolders::Add(const EventView& event, std::string_view place, Pending& pending) {
  const bool all_below = ConcernsAllBelow(event);
  if (!all_below && !known_directory_.empty() && DirectoryOf(place) == known_directory_) return;
  if (!CanHaveNode(place)) return;
  const std::string path = NodePath(place);
  if (all_below && places_->contains(path)) pending.trees.insert(path);
  const std::shared_ptr<Folder> folder = folders_.GetMostSuitableCfg(path);
  if (folder != nullptr) pending.folders.insert(folder->GetFullPath());
  known_directory_ = HasFolderBelow(DirectoryOf(path)) ? "" : DirectoryOf(path);
}

}  // namespace quarrox::fileindex
