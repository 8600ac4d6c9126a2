// The inotify watches of a tree: which directory each watch descriptor stands for.
//
// A directory knows its parent's descriptor and its name, so that a rename inside the tree changes one entry, however
// much is below. Descriptors are the kernel's identities of directories: watching a path twice gives the same one. Not
// thread-safe.
#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

#include "common/unique_fd.h"
#include "scope.h"

namespace quarrox::notifyd {

// A name in a watched directory.
struct Spot {
  int parent;
  std::string name;
};

class WatchTree {
 public:
  // Opens inotify and watches nothing. Throws Error 502.
  explicit WatchTree(const Scope& scope);

  int fd() const { return fd_.get(); }

  // Watches the scope's directory and all below. Throws Error 502 where that one cannot be watched.
  void WatchAll();
  int root() const { return root_; }

  // Watches the directory at `spot` and all below it, as far as it exists; what is watched there already costs one
  // call. True when the tree changed: the directory was not known at this place.
  bool Watch(const Spot& spot);

  // The descriptor of the directory known at `spot`, -1 where there is none.
  int Find(const Spot& spot) const;
  bool Knows(int wd) const { return nodes_.contains(wd); }

  // Where a known directory other than the root stands.
  Spot SpotOf(int wd) const { return {nodes_.at(wd).parent, nodes_.at(wd).name}; }

  // Now, as far as the events read so far tell. `wd` must be known.
  std::string Path(int wd) const;
  std::string Path(const Spot& spot) const { return Join(Path(spot.parent), spot.name); }

  // Whether what is below the known directory `wd` was never reported for itself, but with one above that was looked
  // through. Not so for what stood there when watching began.
  bool WasFound(int wd) const { return nodes_.at(wd).found; }

  // Moves the directory known at `from` with all below; false where there is none.
  bool Move(const Spot& from, const Spot& to);
  // Forgets the directory known at `spot` and all below, and ends their watches.
  void Remove(const Spot& spot);
  // The kernel ended this watch.
  void Forget(int wd);

  // Places that could not be watched because a directory above them has moved and the event that says so was not read
  // yet: to be watched again after it was. Empties the list.
  std::vector<Spot> TakeStale() { return std::exchange(stale_, {}); }

  // The error of a directory that could not be watched since the last call, 0 where there was none. ELOOP says that the
  // directories moved in a way that the tree cannot follow: it must be made anew.
  int TakeError() { return std::exchange(error_, 0); }

 private:
  struct Node {
    int parent = -1;
    std::string name;
    bool scanned = false;  // its subdirectories were looked for
    bool found = false;    // by looking below another, which alone was reported
    std::map<std::string, int> children;
  };

  int AddWatch(const std::string& path);
  UniqueFd Open(int wd);
  int WatchEntry(const UniqueFd& parent, const Spot& spot);
  void WatchBelow(int wd);
  bool Adopt(int wd, const Spot& spot);
  bool IsAtOrAbove(int wd, int below) const;
  bool Refuse();
  void Place(int wd, const Spot& spot);
  void WatchSubdirectories(int wd, std::vector<int>& added);
  void Detach(Node& node);
  void RemoveAll(int wd);

  const Scope& scope_;
  UniqueFd fd_;
  int root_ = -1;
  int error_ = 0;
  std::unordered_map<int, Node> nodes_;
  std::vector<Spot> stale_;
};

}  // namespace quarrox::notifyd
