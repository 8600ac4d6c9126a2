// Where the configured folders are, and when they come and go.
//
// Each directory on the way to a folder is watched by inotify for the next component, as far as it exists, and along
// symbolic links as well as without; so is the table of mounts, as what is mounted over a watched directory is no event
// of that directory. Nothing is polled. Not thread-safe.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>
#include <utility>
#include <vector>

#include "common/unique_fd.h"
#include "identity.h"
#include "paths.h"

struct inotify_event;
struct pollfd;

namespace quarrox::notifyd {

struct Place {
  enum class Change {
    kNone,
    kCame,      // for the first time since the folder is configured
    kCameBack,  // or is another one: what happened to it meanwhile is not known
    kWent,      // was deleted or moved, with or without a directory above it
    kHidden,    // with what was mounted
  };

  std::string path;    // the folder's, as configured
  std::string real;    // its place; of what does not exist where it would be
  std::string exists;  // the nearest directory at or above `real` that exists
  Identity identity;   // that directory's
  bool there = false;
  bool ever_there = false;
  uint64_t generation = 0;  // grows each time that the folder comes

  // What the watches reported since the last look.
  bool gone = false;                               // the folder, or a directory above it, was deleted or moved
  bool unmounted = false;                          // or unmounted
  std::vector<std::pair<int, std::string>> links;  // the entries of watched directories that lead to it
};

class FolderPlaces {
 public:
  // Throws Error 502.
  FolderPlaces();

  // The folders to find from now on. A new one is looked at once before this returns; an old one is kept as it is.
  void Keep(const std::unordered_set<std::string>& paths);

  const std::unordered_map<std::string, Place>& places() const { return places_; }

  // What poll() is to wait for.
  static constexpr size_t kPollFds = 2;
  void FillPollFds(pollfd* fds) const;

  // Takes what was reported, after poll() has filled these. True where that is a reason to Look().
  bool Reported(const pollfd* fds);

  // Looks at the folders that something was reported of, and gives what changed.
  using Changes = std::vector<std::pair<const Place*, Place::Change>>;
  Changes Look();

 private:
  using Names = std::unordered_map<std::string, std::unordered_set<Place*>, PathHash, std::equal_to<>>;

  bool Take(const inotify_event& event);
  bool Disturb(const std::unordered_set<Place*>& places, uint32_t mask);
  bool Watch(const std::string& path, uint32_t mask, const std::string& name, Place& place);
  std::string WatchWay(const std::string& path, Place& place);
  void Unlink(Place& place);
  void Find(Place& place);
  Place::Change LookAt(Place& place);

  UniqueFd inotify_;
  UniqueFd mounts_;
  std::unordered_map<std::string, Place> places_;
  std::unordered_map<int, Names> links_;  // by watch: its entries that lead to folders; the empty one is the folder
  std::unordered_set<Place*> unsure_;
  bool error_logged_ = false;
};

}  // namespace quarrox::notifyd
