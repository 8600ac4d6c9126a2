#include "watch_tree.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/inotify.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstring>
#include <memory>

#include "common/error.h"
#include "common/watchdog.h"

namespace quarrox::notifyd {
namespace {

// IN_MASK_ADD, because directories are watched again to find out whether they are still in their places: without it the
// kernel sets the mask of the watch to nothing for a moment, and an event of that moment is gone without a trace.
constexpr uint32_t kMask = IN_CREATE | IN_DELETE | IN_ATTRIB | IN_CLOSE_WRITE | IN_MOVED_FROM | IN_MOVED_TO |
                           IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR | IN_DONT_FOLLOW | IN_EXCL_UNLINK | IN_MASK_ADD;

struct CloseDir {
  void operator()(DIR* dir) const { closedir(dir); }
};

bool IsDirectory(const dirent& entry, int parent) {
  if (entry.d_type != DT_UNKNOWN) return entry.d_type == DT_DIR;
  struct stat st = {};
  return fstatat(parent, entry.d_name, &st, AT_SYMLINK_NOFOLLOW) == 0 && S_ISDIR(st.st_mode);
}

std::string DescriptorPath(int fd) {
  return "/proc/self/fd/" + std::to_string(fd) + "/";
}

bool IsDots(std::string_view name) {
  return name == "." || name == "..";
}

// A directory that went away is not an error: its end is reported.
bool IsGone(int error) {
  return error == ENOENT || error == ENOTDIR || error == ELOOP;
}

}  // namespace

WatchTree::WatchTree(const Scope& scope) : scope_(scope), fd_(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) {
  if (fd_) return;
  const std::string why = strerror(errno);
  throw Error(kErrSystem, "inotify cannot be opened (see fs.inotify.max_user_instances), reason=" + why);
}

int WatchTree::AddWatch(const std::string& path) {
  Watchdog::OfProcess().Alive();
  const int wd = inotify_add_watch(fd_.get(), path.c_str(), kMask);
  if (wd < 0 && !IsGone(errno)) error_ = errno;
  return wd;
}

void WatchTree::WatchAll() {
  root_ = AddWatch(scope_.dir());
  if (root_ < 0) {
    const std::string why = strerror(errno);
    throw Error(kErrSystem, "The directory cannot be watched, path=" + scope_.dir() + ", reason=" + why);
  }
  nodes_[root_];
  WatchBelow(root_);
  for (auto& [wd, node] : nodes_) node.found = false;
}

// Opens a known directory. No descriptor where something else is at its path by now.
UniqueFd WatchTree::Open(int wd) {
  UniqueFd fd(open(Path(wd).c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  if (!fd) {
    if (!IsGone(errno)) return error_ = errno, UniqueFd();
  } else {
    const int found = AddWatch(DescriptorPath(fd.get()) + ".");
    if (found == wd) return fd;
    if (found >= 0 && !Knows(found)) inotify_rm_watch(fd_.get(), found);
  }
  if (wd != root_) stale_.push_back(SpotOf(wd));
  return UniqueFd();
}

// The descriptor of a directory below which is still to be looked, else -1.
int WatchTree::WatchEntry(const UniqueFd& parent, const Spot& spot) {
  const int wd = AddWatch(DescriptorPath(parent.get()) + spot.name);
  if (wd < 0) return -1;
  return Adopt(wd, spot) || (Find(spot) == wd && !nodes_.at(wd).scanned) ? wd : -1;
}

bool WatchTree::Watch(const Spot& spot) {
  const UniqueFd parent = Open(spot.parent);
  if (!parent) {
    stale_.push_back(spot);
    return false;
  }
  const int wd = WatchEntry(parent, spot);
  if (wd >= 0) WatchBelow(wd);
  return wd >= 0;
}

void WatchTree::WatchBelow(int top) {
  std::vector<int> open = {top};
  while (!open.empty()) {
    const int wd = open.back();
    open.pop_back();
    if (Knows(wd)) WatchSubdirectories(wd, open);
  }
}

// Enters the directory `wd` at `spot`. False when it was there already.
bool WatchTree::Adopt(int wd, const Spot& spot) {
  if (Find(spot) == wd) return false;
  if (IsAtOrAbove(wd, spot.parent)) return Refuse();
  nodes_.try_emplace(wd);
  Place(wd, spot);
  return true;
}

// Whether `wd` is the directory `below` or above it. A tree in which it came to stand below itself would have no paths.
bool WatchTree::IsAtOrAbove(int wd, int below) const {
  int at = below;
  while (at != wd && at != root_) at = nodes_.at(at).parent;
  return at == wd;
}

bool WatchTree::Refuse() {
  error_ = ELOOP;
  return false;
}

// The directory leaves its old place first: it may stand below the one that it replaces.
void WatchTree::Place(int wd, const Spot& spot) {
  Detach(nodes_.at(wd));
  const int replaced = Find(spot);
  if (replaced >= 0) RemoveAll(replaced);
  Node& node = nodes_.at(wd);
  node.parent = spot.parent;
  node.name = spot.name;
  nodes_.at(spot.parent).children[spot.name] = wd;
}

void WatchTree::WatchSubdirectories(int wd, std::vector<int>& added) {
  UniqueFd fd = Open(wd);
  if (!fd) return;
  const std::string path = Path(wd);
  const std::unique_ptr<DIR, CloseDir> dir(fdopendir(fcntl(fd.get(), F_DUPFD_CLOEXEC, 0)));
  if (dir == nullptr) {
    error_ = errno;
    return;
  }
  while (const dirent* entry = readdir(dir.get())) {
    if (IsDots(entry->d_name) || !IsDirectory(*entry, fd.get()) || !scope_.IsInside(path, entry->d_name)) continue;
    const int child = WatchEntry(fd, {wd, entry->d_name});
    if (child < 0) continue;
    nodes_.at(child).found = true;
    added.push_back(child);
  }
  nodes_.at(wd).scanned = true;
}

int WatchTree::Find(const Spot& spot) const {
  const auto parent = nodes_.find(spot.parent);
  if (parent == nodes_.end()) return -1;
  const auto child = parent->second.children.find(spot.name);
  return child == parent->second.children.end() ? -1 : child->second;
}

std::string WatchTree::Path(int wd) const {
  std::vector<const Node*> chain;
  for (int at = wd; at != root_; at = chain.back()->parent) chain.push_back(&nodes_.at(at));
  std::string path = scope_.dir();
  for (auto node = chain.rbegin(); node != chain.rend(); ++node) {
    if (!path.ends_with('/')) path += '/';
    path += (*node)->name;
  }
  return path;
}

void WatchTree::Detach(Node& node) {
  const auto parent = nodes_.find(node.parent);
  if (parent != nodes_.end()) parent->second.children.erase(node.name);
  node.parent = -1;
}

bool WatchTree::Move(const Spot& from, const Spot& to) {
  const int wd = Find(from);
  if (wd < 0) return false;
  if (IsAtOrAbove(wd, to.parent)) return Refuse();
  Place(wd, to);
  return true;
}

void WatchTree::Remove(const Spot& spot) {
  const int wd = Find(spot);
  if (wd >= 0) RemoveAll(wd);
}

void WatchTree::RemoveAll(int wd) {
  Detach(nodes_.at(wd));
  std::vector<int> doomed = {wd};
  while (!doomed.empty()) {
    const int next = doomed.back();
    doomed.pop_back();
    for (const auto& [name, child] : nodes_.at(next).children) doomed.push_back(child);
    nodes_.erase(next);
    inotify_rm_watch(fd_.get(), next);
  }
}

void WatchTree::Forget(int wd) {
  if (wd != root_ && Knows(wd)) RemoveAll(wd);
}

}  // namespace quarrox::notifyd
