#include "routes.h"

#include <algorithm>
#include <cstddef>
#include <functional>

namespace quarrox::notifyd {
namespace {

// One hearer a queue. They come with the innermost folder first, so of equals the last is the outermost.
void MergeByQueue(std::vector<Hearer>& hearers) {
  if (hearers.size() < 2) return;
  std::stable_sort(hearers.begin(), hearers.end(),
                   [](const Hearer& a, const Hearer& b) { return std::less<>()(a.queue, b.queue); });
  size_t kept = 0;
  for (size_t i = 1; i < hearers.size(); ++i) {
    if (hearers[i].queue != hearers[kept].queue) {
      hearers[++kept] = hearers[i];
      continue;
    }
    const uint32_t mask = hearers[kept].mask | hearers[i].mask;
    hearers[kept] = hearers[i];
    hearers[kept].mask = mask;
  }
  hearers.resize(kept + 1);
}

}  // namespace

// The way from a path up to the root, past the folders that stand there.
class Routes::Climb {
 public:
  Climb(const Routes& routes, std::string_view path) : routes_(routes), at_(Climbable(path)) {}

  // The next folder at or above the path, null where there is no more.
  const Folder* Next() {
    while (!done_) {
      place_ = at_;
      const auto found = routes_.folders_.find(at_);
      const bool here = found != routes_.folders_.end();
      if (here) met_now_ = met_.size();
      Up();
      if (here) return &found->second;
    }
    return nullptr;
  }

  std::string_view place() const { return place_; }  // of the folder that Next() gave

  // Whether a name that is ignored stands on the way from that folder down to the path.
  bool Ignores(const Wish& wish) const {
    const auto end = met_.begin() + static_cast<ptrdiff_t>(met_now_);
    return std::any_of(met_.begin(), end,
                       [&](uint32_t name) { return std::binary_search(wish.ignore.begin(), wish.ignore.end(), name); });
  }

  bool Takes(const Folder& folder) const {
    return std::any_of(folder.wishes.begin(), folder.wishes.end(), [&](const Wish& wish) { return !Ignores(wish); });
  }

 private:
  void Up() {
    if (at_.empty()) {
      done_ = true;
      return;
    }
    const size_t slash = at_.rfind('/');
    const std::string_view name = at_.substr(slash + 1);
    at_ = slash == std::string_view::npos ? std::string_view() : at_.substr(0, slash);
    if (name == kIndexDir) done_ = true;
    const auto ignored = routes_.ignored_.find(name);
    if (ignored != routes_.ignored_.end()) met_.push_back(ignored->second);
  }

  const Routes& routes_;
  std::string_view at_;
  std::string_view place_;
  std::vector<uint32_t> met_;  // names that some folder ignores, from the path upwards
  size_t met_now_ = 0;         // how many of them are below the folder that Next() gave
  bool done_ = false;
};

void Routes::Add(const Route& route) {
  const std::string_view place = Climbable(route.place);
  Folder& folder = folders_[std::string(place)];
  folder.watch = route.watch;
  Wish& wish = folder.wishes.emplace_back(Wish{route.name, route.mask, {}, route.queue});
  for (const std::string& name : route.ignore) {
    wish.ignore.push_back(ignored_.try_emplace(name, static_cast<uint32_t>(ignored_.size())).first->second);
  }
  std::sort(wish.ignore.begin(), wish.ignore.end());
  if (!place.empty()) parents_.emplace(Parent(place));
}

void Routes::AddQueue(const std::string& path) {
  queues_.insert(path);
  queues_.insert(path + ".tmp");
}

bool Routes::TakesBelow(uint32_t watch, std::string_view path) const {
  Climb climb(*this, path);
  uint32_t speaker = kNoWatch;
  bool taken = false;
  while (const Folder* folder = climb.Next()) {
    if (speaker == kNoWatch) speaker = folder->watch;
    if (speaker != kNoWatch && speaker != watch) return false;
    taken = taken || climb.Takes(*folder);
    if (taken && speaker == watch) return true;
  }
  return false;
}

bool Routes::MayHold(uint32_t watch, std::string_view dir) const {
  return parents_.contains(Climbable(dir)) || TakesBelow(watch, dir);
}

bool Routes::Takes(uint32_t watch, std::string_view path) const {
  return TakesBelow(watch, path) && !queues_.contains(path);
}

void Routes::Hear(std::string_view path, std::vector<Hearer>& hearers) const {
  hearers.clear();
  if (queues_.contains(path)) return;
  Climb climb(*this, path);
  while (const Folder* folder = climb.Next()) {
    for (const Wish& wish : folder->wishes) {
      if (!climb.Ignores(wish)) hearers.push_back({wish.queue, wish.mask, climb.place(), wish.name});
    }
  }
  MergeByQueue(hearers);
}

std::vector<Hearer> Routes::HearersOf(uint32_t watch) const {
  std::vector<Hearer> hearers;
  for (const auto& [place, folder] : folders_) {
    if (folder.watch != watch) continue;
    for (const Wish& wish : folder.wishes) hearers.push_back({wish.queue, wish.mask, place, wish.name});
  }
  MergeByQueue(hearers);
  return hearers;
}

std::string_view Routes::FolderAbove(std::string_view path) const {
  Climb climb(*this, path);
  while (const Folder* folder = climb.Next()) {
    if (climb.place() == Climbable(path) || !climb.Takes(*folder)) continue;
    return climb.place().empty() ? "/" : climb.place();
  }
  return {};
}

}  // namespace quarrox::notifyd
