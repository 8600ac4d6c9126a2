#include "inotify_watcher.h"

#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <optional>

#include "common/error.h"
#include "common/log.h"

namespace quarrox::notifyd {
namespace {

constexpr size_t kReadSize = size_t{256} << 10;
constexpr size_t kMaxRound = size_t{64} << 20;
constexpr int kOtherHalfMs = 20;

constexpr const char* kLimitHint =
    "the limit fs.inotify.max_user_watches is reached: raise it, for example with "
    "'sysctl fs.inotify.max_user_watches=1048576'";

// Whether something is at `path`, and then whether it is a directory.
std::optional<bool> LookAt(const std::string& path) {
  struct stat st = {};
  if (lstat(path.c_str(), &st) != 0) return std::nullopt;
  return S_ISDIR(st.st_mode);
}

std::string Explain(int error) {
  return error == ENOSPC ? kLimitHint : strerror(error);
}

}  // namespace

InotifyWatcher::InotifyWatcher(const Scope& scope, EventSink& sink)
    : scope_(scope), sink_(sink), tree_(std::make_unique<WatchTree>(scope)), buffer_(kReadSize) {
  tree_->WatchAll();
  const int error = tree_->TakeError();
  if (error == ENOSPC)
    throw Error(kErrSystem, "Not every directory can be watched, path=" + scope.dir() + ", reason=" + kLimitHint);
  if (error == 0) return;
  errno = error;
  QUARROX_LOG_FAILURE("Some directories cannot be watched, path=%s", log::Text(scope.dir()).c_str());
}

int InotifyWatcher::Timeout() const {
  return departures_.empty() && unsure_.empty() ? -1 : kOtherHalfMs;
}

// False when the kernel's queue is empty.
bool InotifyWatcher::ReadOnce() {
  const ssize_t size = read(tree_->fd(), buffer_.data(), buffer_.size());
  if (size > 0) events_.insert(events_.end(), buffer_.begin(), buffer_.begin() + size);
  if (size > 0 || errno == EINTR) return true;
  if (size == 0 || errno == EAGAIN) return false;
  throw Error(kErrSystem, std::string("Reading inotify events failed, reason=") + strerror(errno));
}

bool InotifyWatcher::ReadAll() {
  events_.clear();
  while (events_.size() < kMaxRound && ReadOnce()) {
  }
  return !events_.empty();
}

void InotifyWatcher::Drain() {
  const bool quiet = !ReadAll();
  for (size_t at = 0; at < events_.size();) {
    const auto* event = reinterpret_cast<const inotify_event*>(events_.data() + at);
    Handle(*event);
    at += sizeof(inotify_event) + event->len;
  }
  if (quiet) {
    for (const auto& [cookie, departure] : departures_) MovedOut(departure);
    departures_.clear();
  }
  CheckPlaces(quiet);
  CheckDepartures();
  CheckErrors();
}

bool InotifyWatcher::IsInside(const Spot& spot) const {
  return scope_.IsInside(tree_->Path(spot.parent), spot.name);
}

void InotifyWatcher::Handle(const inotify_event& event) {
  if ((event.mask & IN_Q_OVERFLOW) != 0) overflowed_ = true;
  if (!tree_->Knows(event.wd)) return;
  if (event.len == 0) {
    HandleDirectory(event);
  } else {
    HandleEntry(event, {event.wd, event.name});
  }
}

// What happens to a watched directory itself is also reported by its parent, except for the topmost.
void InotifyWatcher::HandleDirectory(const inotify_event& event) {
  if (event.wd != tree_->root()) {
    if ((event.mask & IN_IGNORED) == 0) return;
    unsure_.push_back(tree_->SpotOf(event.wd));  // what was mounted here may have gone
    tree_->Forget(event.wd);
    return;
  }
  if ((event.mask & IN_ATTRIB) != 0 && LookAt(scope_.dir())) Write(kAttributes, true, scope_.dir());
  if ((event.mask & (IN_DELETE_SELF | IN_MOVE_SELF | IN_UNMOUNT)) == 0) return;
  if ((event.mask & IN_UNMOUNT) == 0) Write(kDeleted, true, scope_.dir());
  throw Error(kErrSystem, "The watched directory was deleted, moved or unmounted, path=" + scope_.dir());
}

void InotifyWatcher::HandleEntry(const inotify_event& event, const Spot& spot) {
  const bool is_dir = (event.mask & IN_ISDIR) != 0;
  if ((event.mask & IN_MOVED_FROM) != 0) Depart(event.cookie, {spot, is_dir});
  if ((event.mask & IN_MOVED_TO) != 0) Arrive(event.cookie, spot, is_dir);
  if (!IsInside(spot)) return;
  if ((event.mask & IN_CREATE) != 0) Created(spot, is_dir);
  if ((event.mask & IN_DELETE) != 0) Deleted(spot, is_dir);
  if ((event.mask & IN_CLOSE_WRITE) != 0) Touched(kWritten, spot, is_dir);
  if ((event.mask & IN_ATTRIB) != 0) Touched(kAttributes, spot, is_dir);
}

void InotifyWatcher::Created(const Spot& spot, bool is_dir) {
  if (is_dir) {
    tree_->Watch(spot);
    unsure_.push_back(spot);
  }
  const std::string path = tree_->Path(spot);
  gone_.erase(path);
  Write(kCreated, is_dir, path);
}

void InotifyWatcher::Deleted(const Spot& spot, bool is_dir) {
  const std::string path = tree_->Path(spot);
  if (is_dir) tree_->Remove(spot);
  gone_.insert(path);
  Write(kDeleted, is_dir, path);
}

// The end of writing may be reported after the deletion, when two processes do the one and the other.
void InotifyWatcher::Touched(uint32_t bit, const Spot& spot, bool is_dir) {
  const std::string path = tree_->Path(spot);
  if (gone_.contains(path) && !LookAt(path)) return;
  Write(bit, is_dir, path);
}

void InotifyWatcher::Depart(uint32_t cookie, Departure departure) {
  departures_.insert_or_assign(cookie, std::move(departure));
}

void InotifyWatcher::Arrive(uint32_t cookie, const Spot& spot, bool is_dir) {
  const auto found = departures_.find(cookie);
  if (found == departures_.end()) {
    if (IsInside(spot)) Created(spot, is_dir);
    return;
  }
  const Departure from = std::move(found->second);
  departures_.erase(found);
  if (tree_->Knows(from.spot.parent) && IsInside(from.spot)) {
    Rename(from, spot);
  } else if (IsInside(spot)) {
    Created(spot, is_dir);
  }
}

void InotifyWatcher::Rename(const Departure& from, const Spot& to) {
  if (!IsInside(to)) return MovedOut(from);
  const std::string old_path = tree_->Path(from.spot);
  const std::string path = tree_->Path(to);
  const bool known = from.is_dir && tree_->Move(from.spot, to);
  gone_.insert(old_path);
  gone_.erase(path);
  left_.push_back(old_path);
  sink_.Add({kRenamed, from.is_dir, path, old_path});
  if (!from.is_dir) return;
  unsure_.push_back(from.spot);
  unsure_.push_back(to);
  // Where it was not watched at its old place, what is below is not known. Where it was found below a new directory,
  // only that one was reported, and the reader, looking there, will not find it any more.
  if (!known || tree_->WasFound(tree_->Find(to))) Created(to, true);
}

void InotifyWatcher::MovedOut(const Departure& departure) {
  if (!tree_->Knows(departure.spot.parent) || !IsInside(departure.spot)) return;
  left_.push_back(tree_->Path(departure.spot));
  Deleted(departure.spot, departure.is_dir);
}

// When nothing is left to read, the tree is as it was told, and a place that still cannot be found means that it is
// not.
void InotifyWatcher::CheckPlaces(bool quiet) {
  for (const Spot& spot : std::exchange(unsure_, {})) {
    if (!tree_->Knows(spot.parent) || !IsInside(spot) || !tree_->Watch(spot)) continue;
    Write(kCreated, true, tree_->Path(spot));
  }
  unsure_ = tree_->TakeStale();
  std::erase_if(unsure_, [&](const Spot& spot) { return !tree_->Knows(spot.parent); });
  if (quiet && !unsure_.empty()) overflowed_ = true;
}

// Something new may stand where this round's renames began, reported between their two halves.
void InotifyWatcher::CheckDepartures() {
  for (const std::string& path : left_) {
    if (const auto is_dir = LookAt(path)) Write(kCreated, *is_dir, path);
  }
  left_.clear();
  gone_.clear();
}

void InotifyWatcher::CheckErrors() {
  const int error = tree_->TakeError();
  if (overflowed_ || error == ELOOP) return StartOver();
  if (error == 0) return;
  if (!error_logged_) {
    errno = 0;
    QUARROX_LOG_FAILURE("Some directories below %s cannot be watched, reason=%s", log::Text(scope_.dir()).c_str(),
                        Explain(error).c_str());
  }
  error_logged_ = true;
  Write(kLost, false, scope_.dir());
}

// The loss is reported once everything is watched again, so that it covers what happened until then.
void InotifyWatcher::StartOver() {
  overflowed_ = false;
  departures_.clear();
  unsure_.clear();
  tree_ = std::make_unique<WatchTree>(scope_);
  tree_->WatchAll();
  Write(kLost, false, scope_.dir());
  if (tree_->TakeError() == ENOSPC && !std::exchange(error_logged_, true)) {
    errno = 0;
    QUARROX_LOG_FAILURE("Some directories below %s cannot be watched, reason=%s", log::Text(scope_.dir()).c_str(),
                        kLimitHint);
  }
}

std::unique_ptr<Watcher> MakeInotifyWatcher(const Scope& scope, EventSink& sink) {
  return std::make_unique<InotifyWatcher>(scope, sink);
}

}  // namespace quarrox::notifyd
