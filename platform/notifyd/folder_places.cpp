#include "folder_places.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>

#include "common/error.h"
#include "common/log.h"

namespace quarrox::notifyd {
namespace {

constexpr uint32_t kEntries = IN_CREATE | IN_MOVED_TO | IN_MOVED_FROM | IN_DELETE;
constexpr uint32_t kGoes = IN_MOVED_FROM | IN_DELETE | IN_DELETE_SELF;

bool IsMissing(int error) {
  return error == ENOENT || error == ENOTDIR || error == ELOOP || error == ENAMETOOLONG;
}

}  // namespace

FolderPlaces::FolderPlaces()
    : inotify_(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)), mounts_(open("/proc/self/mountinfo", O_RDONLY | O_CLOEXEC)) {
  if (inotify_) return;
  const std::string why = strerror(errno);
  throw Error(kErrSystem, "inotify cannot be opened (see fs.inotify.max_user_instances), reason=" + why);
}

// Links a place to the entry `name` of the directory `path`. False where that directory does not exist.
bool FolderPlaces::Watch(const std::string& path, uint32_t mask, const std::string& name, Place& place) {
  const int watch = inotify_add_watch(inotify_.get(), path.c_str(), mask | IN_ONLYDIR | IN_MASK_ADD);
  if (watch >= 0) {
    if (links_[watch][name].insert(&place).second) place.links.emplace_back(watch, name);
    return true;
  }
  if (IsMissing(errno)) return false;
  if (!error_logged_)
    QUARROX_LOG_FAILURE("A directory's comings and goings cannot be watched, path=%s", log::Text(path).c_str());
  error_logged_ = true;
  return access(path.c_str(), F_OK) == 0;
}

// Watches the way to an absolute path from the top, so that what appears below is reported. The result is the part of
// it that exists.
std::string FolderPlaces::WatchWay(const std::string& path, Place& place) {
  size_t end = 0;  // of the directory
  while (end != std::string::npos && path.size() > 1) {
    const std::string directory = end == 0 ? "/" : path.substr(0, end);
    const size_t next = path.find('/', end + 1);
    if (!Watch(directory, kEntries, path.substr(end + 1, next - end - 1), place)) return DirectoryAbove(directory);
    end = next;
  }
  return Watch(path, IN_DELETE_SELF, "", place) ? path : DirectoryAbove(path);
}

void FolderPlaces::Unlink(Place& place) {
  for (const auto& [watch, name] : std::exchange(place.links, {})) {
    const auto names = links_.find(watch);
    if (names == links_.end()) continue;
    const auto users = names->second.find(name);
    if (users == names->second.end()) continue;
    users->second.erase(&place);
    if (users->second.empty()) names->second.erase(users);
    if (!names->second.empty()) continue;
    links_.erase(names);
    inotify_rm_watch(inotify_.get(), watch);
  }
}

// The ways are watched before they are followed: what changes after that is reported.
void FolderPlaces::Find(Place& place) {
  Unlink(place);
  const std::string there = WatchWay(place.path, place);
  char real[PATH_MAX];
  place.exists = realpath(there.c_str(), real) != nullptr ? real : there;
  place.real = place.exists;
  if (there.size() < place.path.size())
    place.real = Join(place.exists, place.path.substr(there.size() + (there != "/")));
  if (place.exists != there) WatchWay(place.exists, place);
  const bool exists = Identify(place.exists, place.identity);
  if (!exists) place.identity = {};
  place.there = exists && there == place.path;
}

Place::Change FolderPlaces::LookAt(Place& place) {
  const bool was_there = place.there;
  const Identity before = place.identity;
  Find(place);
  const bool gone = std::exchange(place.gone, false);
  const bool unmounted = std::exchange(place.unmounted, false);
  const bool ever_there = std::exchange(place.ever_there, place.ever_there || place.there);
  if (!place.there) {
    if (!was_there) return Place::Change::kNone;
    return gone && !unmounted ? Place::Change::kWent : Place::Change::kHidden;
  }
  if (was_there && !gone && !unmounted && before == place.identity) return Place::Change::kNone;
  ++place.generation;
  return ever_there ? Place::Change::kCameBack : Place::Change::kCame;
}

void FolderPlaces::Keep(const std::unordered_set<std::string>& paths) {
  for (auto entry = places_.begin(); entry != places_.end();) {
    if (paths.contains(entry->first)) {
      ++entry;
      continue;
    }
    Unlink(entry->second);
    unsure_.erase(&entry->second);
    entry = places_.erase(entry);
  }
  for (const std::string& path : paths) {
    const auto [entry, is_new] = places_.try_emplace(path);
    if (!is_new) continue;
    entry->second.path = path;
    LookAt(entry->second);
  }
}

void FolderPlaces::FillPollFds(pollfd* fds) const {
  fds[0] = {inotify_.get(), POLLIN, 0};
  fds[1] = {mounts_.get(), POLLPRI, 0};
}

bool FolderPlaces::Disturb(const std::unordered_set<Place*>& places, uint32_t mask) {
  for (Place* place : places) {
    place->gone = place->gone || (mask & kGoes) != 0;
    place->unmounted = place->unmounted || (mask & IN_UNMOUNT) != 0;
    unsure_.insert(place);
  }
  return !places.empty();
}

bool FolderPlaces::Take(const inotify_event& event) {
  // A burst in a directory on the way to a folder: whether it is still the same folder is then seen by its identity.
  if ((event.mask & IN_Q_OVERFLOW) != 0) {
    for (auto& [path, place] : places_) unsure_.insert(&place);
    return true;
  }
  const auto names = links_.find(event.wd);
  if (names == links_.end()) return false;
  bool concerns = false;
  if ((event.mask & (IN_DELETE_SELF | IN_UNMOUNT | IN_IGNORED)) != 0) {
    for (const auto& [name, places] : names->second) concerns = Disturb(places, event.mask) || concerns;
  } else if (event.len != 0) {
    const auto places = names->second.find(std::string_view(event.name));
    concerns = places != names->second.end() && Disturb(places->second, event.mask);
  }
  if ((event.mask & IN_IGNORED) != 0) links_.erase(names);
  return concerns;
}

bool FolderPlaces::Reported(const pollfd* fds) {
  alignas(inotify_event) char buffer[16384];
  bool concerns = false;
  for (ssize_t size; (size = read(inotify_.get(), buffer, sizeof(buffer))) > 0;) {
    for (ssize_t at = 0; at < size;) {
      const auto& event = *reinterpret_cast<const inotify_event*>(buffer + at);
      at += static_cast<ssize_t>(sizeof(event) + event.len);
      concerns = Take(event) || concerns;
    }
  }
  // The kernel says only once, to poll(), that the table of mounts has changed.
  if (fds[1].revents == 0) return concerns;
  for (auto& [path, place] : places_) unsure_.insert(&place);
  return !places_.empty();
}

FolderPlaces::Changes FolderPlaces::Look() {
  Changes changes;
  for (Place* place : std::exchange(unsure_, {})) {
    const Place::Change change = LookAt(*place);
    if (change != Place::Change::kNone) changes.emplace_back(place, change);
  }
  return changes;
}

}  // namespace quarrox::notifyd
