// Which indexed folders the events of a queue concern; what concerns one says QueueMgr::IsFullPathProcessing.
#pragma once

#include <functional>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>

#include "common/error.h"
#include "common/export.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/optree_event.h"

namespace quarrox::fileindex {

// Which events concern one folder.
class FolderEvents {
 public:
  // Both must outlive this object. Throws what the first question about a full path throws.
  FolderEvents(const std::string& full_path, const FolderMgr& folders);

  bool Accepts(const EventView& event);

 private:
  bool Touches(const EventView& event, std::string_view place);
  bool IsGoverned(std::string_view place);
  void AddInner(const std::string& prefix);

  const std::string& full_path_;
  const FolderMgr& folders_;
  const bool is_folder_;
  // The folders below this one that were found to govern an event, with a slash at the end and none below another: so
  // what sorts before a path is the one that it lies in, if any.
  std::set<std::string, std::less<>> inner_;
};

// QueueMgr::IsFullPathProcessing for every folder of a list: each queue is read once, when it is first asked about, and
// its answers stay those of that moment. Not thread-safe.
class QUARROX_API PendingFolders {
 public:
  // `folders` must outlive this object and stay as it is.
  explicit PendingFolders(const FolderMgr& folders) : folders_(folders) {}

  // For the full path of a folder of the list, and the queue of its share. Throws as the question to QueueMgr does.
  bool IsProcessing(const std::string& queue_path, const std::string& full_path);

 private:
  struct Hash {
    using is_transparent = void;
    size_t operator()(std::string_view text) const { return std::hash<std::string_view>()(text); }
  };
  using Paths = std::unordered_set<std::string, Hash, std::equal_to<>>;

  // What a queue and its ".tmp" hold.
  struct Pending {
    bool everything = false;     // events were lost
    Paths folders;               // the full paths of those that govern an event
    Paths trees;                 // of `places_`, those below which everything is concerned
    std::optional<Error> error;  // what ended the reading
  };

  const Pending& PendingOf(const std::string& queue_path);
  void Read(const std::string& path, Pending& pending);
  void RequirePlaces();
  bool HasFolderBelow(std::string_view directory) const;
  void Add(const EventView& event, std::string_view place, Pending& pending);

  const FolderMgr& folders_;
  std::map<std::string, Pending> queues_;  // by path
  // Every folder's full path and all directories above it, as nodes bear them: whether a folder lies below.
  std::optional<std::unordered_map<std::string, bool, Hash, std::equal_to<>>> places_;
  // The directory of the last event, where no folder lies below it: an event beside that one says nothing new.
  std::string known_directory_;
};

}  // namespace quarrox::fileindex
