#include "watches.h"

#include <poll.h>

#include <algorithm>
#include <cerrno>
#include <utility>

#include "common/error.h"
#include "common/log.h"

namespace quarrox::notifyd {
namespace {

// One round takes what was reported by then; further ones what that left open, such as the missing half of a move.
constexpr int kLastRounds = 3;

// Of a folder that neither method hears.
constexpr char kNoKey[] = "";

std::string MountKey(const Place& place) {
  return "mount " + std::to_string(place.identity.mount) + " " + std::to_string(place.identity.device);
}

int Earlier(int a, int b) {
  if (a < 0 || b < 0) return a < 0 ? b : a;
  return std::min(a, b);
}

Route RouteOf(const WantedFolder& wanted, uint32_t watch) {
  const MonitoredFolder& folder = *wanted.folder;
  return {wanted.place->real, folder.path, watch, folder.mask, folder.ignore, wanted.queue};
}

}  // namespace

std::unique_ptr<Watches::Watch> Watches::MakeFanotify(const Place& place, const std::string& key) {
  auto watch = std::make_unique<Watch>(MountPoint(place.exists), ++last_number_, std::make_shared<Routes>());
  std::string why;
  try {
    watch->watcher = MakeFanotifyWatcher(watch->scope, watch->router, limited_, why);
  } catch (const Error& error) {
    why = error.reason;
  }
  if (watch->watcher != nullptr) return watch;
  const std::string text = "fanotify cannot watch " + watch->scope.dir() + ": " + why;
  if (method_ == Method::kFanotify) {
    Fail(key, text + "; run as root, or use --method inotify");
  } else {
    QUARROX_LOG_PROGRESS("%s; inotify is used", log::Text(text).c_str());
    failed_[key] = text;
  }
  return nullptr;
}

// Whether fanotify hears the place, then as the watch `key`.
bool Watches::UseFanotify(const Place& place, const std::string& key) {
  const auto known = watches_.find(key);
  if (known != watches_.end()) {
    if (known->second->watcher != nullptr) return true;
    watches_.erase(known);
  }
  if (method_ == Method::kAuto && failed_.contains(key)) return false;
  auto made = MakeFanotify(place, key);
  if (made == nullptr) return false;
  watches_.emplace(key, std::move(made));
  return true;
}

void Watches::PlanFanotify(std::vector<WantedFolder>& wanted) {
  std::map<std::string, bool> usable;
  for (WantedFolder& one : wanted) {
    const std::string key = MountKey(*one.place);
    const auto [known, is_new] = usable.try_emplace(key, false);
    if (is_new) known->second = UseFanotify(*one.place, key);
    if (known->second || method_ == Method::kFanotify) one.key = key;
  }
}

// A folder that another one takes is heard with that one, also before it exists. `wanted` is in the order of places, so
// that the other one comes first. A watch looks below the names that nobody ignores, and into what was mounted when it
// began: it is another one where these differ.
void Watches::PlanInotify(std::vector<WantedFolder>& wanted) {
  Routes routes;
  for (const WantedFolder& one : wanted) {
    if (one.key == kNoKey && one.place->there) routes.Add(RouteOf(one, kNoWatch));
  }
  std::map<std::string, std::string, std::less<>> tops;  // of each place
  std::map<std::string, std::string> keys;               // of each top
  for (const WantedFolder& one : wanted) {
    const std::string& place = one.place->real;
    const std::string_view above = routes.FolderAbove(place);
    if (one.key != kNoKey || (above.empty() && !one.place->there)) continue;
    const std::string& top = tops.emplace(place, above.empty() ? place : tops.find(above)->second).first->second;
    std::string& key = keys[top];
    if (key.empty()) key = "tree " + top + " " + std::to_string(one.place->generation);
    key += '\0' + place + ' ' + std::to_string(one.place->identity.mount);
    for (const std::string& name : one.folder->ignore) key += '\0' + name;
  }
  for (WantedFolder& one : wanted) {
    const auto top = tops.find(one.place->real);
    if (one.key == kNoKey && top != tops.end()) one.key = keys[top->second];
  }
}

void Watches::NumberWatches(const std::vector<WantedFolder>& wanted) {
  for (const WantedFolder& one : wanted) {
    if (one.key == kNoKey || watches_.contains(one.key) || one.key.starts_with("mount ")) continue;
    const std::string top = one.place->real;  // the first of a watch is its topmost
    watches_[one.key] = std::make_unique<Watch>(top, ++last_number_, nullptr);
  }
}

std::shared_ptr<const Routes> Watches::MakeRoutes(const std::vector<WantedFolder>& wanted,
                                                  const std::vector<std::string>& queues) const {
  auto routes = std::make_shared<Routes>();
  for (const WantedFolder& one : wanted) {
    const auto watch = watches_.find(one.key);
    routes->Add(RouteOf(one, watch == watches_.end() ? kNoWatch : watch->second->scope.watch()));
  }
  for (const std::string& queue : queues) routes->AddQueue(queue);
  return routes;
}

void Watches::Fail(const std::string& key, const std::string& why) {
  std::string& said = failed_[key];
  if (said == why) return;
  said = why;
  errno = 0;
  QUARROX_LOG_FAILURE("%s", log::Text(why).c_str());
}

// What is mounted at the same place once more is another file system to the kernel, which then has to be told again.
void Watches::Begin(Watch& watch, const std::string& key) {
  try {
    if (watch.watcher == nullptr) {
      watch.watcher = MakeInotifyWatcher(watch.scope, watch.router);
    } else {
      watch.watcher->Renew();
    }
    failed_.erase(key);
  } catch (const Error& error) {
    watch.watcher.reset();
    Fail(key, error.reason);
  }
}

void Watches::EndUnwanted(const std::vector<WantedFolder>& wanted) {
  std::unordered_set<std::string_view> keys;
  for (const WantedFolder& one : wanted) keys.insert(one.key);
  std::unordered_set<std::string> mounts;
  for (const WantedFolder& one : wanted) mounts.insert(MountKey(*one.place));
  for (auto watch = watches_.begin(); watch != watches_.end();) {
    if (keys.contains(watch->first)) {
      ++watch;
      continue;
    }
    for (int round = 0; round < kLastRounds && Drain(watch->first, *watch->second); ++round) {
    }
    watch = watches_.erase(watch);
  }
  std::erase_if(failed_, [&](const auto& one) { return !keys.contains(one.first) && !mounts.contains(one.first); });
}

void Watches::NoteUnheard(const std::vector<WantedFolder>& wanted) {
  heard_.clear();
  unheard_.clear();
  for (const WantedFolder& one : wanted) {
    if (one.key == kNoKey) continue;
    const auto watch = watches_.find(one.key);
    if (watch != watches_.end() && watch->second->watcher != nullptr) {
      heard_[one.folder->path] = one.key;
    } else if (one.place->there) {
      unheard_[one.folder->path] = failed_[one.key];
    }
  }
}

void Watches::Arrange(std::vector<WantedFolder> wanted, const std::vector<std::string>& queues) {
  std::stable_sort(wanted.begin(), wanted.end(),
                   [](const WantedFolder& a, const WantedFolder& b) { return a.place->real < b.place->real; });
  if (method_ != Method::kInotify) PlanFanotify(wanted);
  PlanInotify(wanted);
  NumberWatches(wanted);
  const std::shared_ptr<const Routes> routes = MakeRoutes(wanted, queues);
  std::unordered_set<std::string_view> begun;
  for (const WantedFolder& one : wanted) {
    const auto watch = watches_.find(one.key);
    if (watch == watches_.end() || !begun.insert(one.key).second) continue;
    watch->second->scope.Follow(routes);
    Begin(*watch->second, one.key);
  }
  EndUnwanted(wanted);
  NoteUnheard(wanted);
}

std::string Watches::MethodOf(const std::string& path) const {
  const auto key = heard_.find(path);
  return key == heard_.end() ? std::string() : watches_.at(key->second)->watcher->method();
}

void Watches::AddPollFds(std::vector<pollfd>& fds) const {
  for (const auto& [key, watch] : watches_) {
    fds.push_back({watch->watcher == nullptr ? -1 : watch->watcher->fd(), POLLIN, 0});
  }
}

int Watches::Timeout() const {
  int timeout = -1;
  for (const auto& [key, watch] : watches_) {
    if (watch->watcher != nullptr) timeout = Earlier(timeout, watch->watcher->Timeout());
  }
  return timeout;
}

// False where the watch ended.
bool Watches::Drain(const std::string& key, Watch& watch) {
  if (watch.watcher == nullptr) return false;
  try {
    watch.watcher->Drain();
    return true;
  } catch (const Error& error) {
    watch.watcher.reset();
    Fail(key, error.reason);
  }
  for (const auto& [path, heard_by] : heard_) {
    if (heard_by == key) unheard_[path] = failed_[key];
  }
  std::erase_if(heard_, [&](const auto& one) { return one.second == key; });
  return false;
}

void Watches::Drain(const pollfd* fds, bool timed_out) {
  for (auto& [key, watch] : watches_) {
    const bool ready = fds++->revents != 0;
    if (watch->watcher == nullptr) continue;
    if (ready || (timed_out && watch->watcher->Timeout() >= 0)) Drain(key, *watch);
  }
}

void Watches::DrainAll() {
  for (auto& [key, watch] : watches_) Drain(key, *watch);
}

}  // namespace quarrox::notifyd
