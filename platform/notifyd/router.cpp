#include "router.h"

#include <functional>

namespace quarrox::notifyd {
namespace {

// The path by which the hearer knows it; `buffer` is where it stands if that is another one.
std::string_view Shown(const Hearer& hearer, std::string_view path, std::string& buffer) {
  if (hearer.place == Climbable(hearer.name)) return path;
  const std::string_view rest = Climbable(path).substr(hearer.place.size());
  buffer = rest.empty() ? std::string(hearer.name) : std::string(Climbable(hearer.name)) + std::string(rest);
  return buffer;
}

}  // namespace

// What one queue is told. It hears of the end `from`, of the end `to`, or of both; the other one is null.
void Router::Send(const Hearer* from, const Hearer* to, Event event) {
  std::string new_name;
  std::string old_name;
  const Hearer& hearer = to != nullptr ? *to : *from;
  const uint32_t mask = (to != nullptr ? to->mask : 0) | (from != nullptr ? from->mask : 0);
  if (event.bit == kRenamed && from == nullptr) event.bit = kCreated;
  if (event.bit == kRenamed && to == nullptr) event = {kDeleted, event.is_dir, event.path_old, {}};
  if ((mask & event.bit) == 0) return;
  event.path = Shown(hearer, event.path, new_name);
  event.path_old = event.bit == kRenamed ? Shown(*from, event.path_old, old_name) : std::string_view();
  hearer.queue->Add(event);
}

// Both lists are in the order of their queues.
void Router::AddRename(const Event& event) {
  scope_.routes().Hear(event.path_old, from_);
  auto from = from_.begin();
  auto to = to_.begin();
  while (from != from_.end() || to != to_.end()) {
    const bool to_is_first = from == from_.end() || (to != to_.end() && std::less<>()(to->queue, from->queue));
    const bool same = !to_is_first && to != to_.end() && to->queue == from->queue;
    if (to_is_first) {
      Send(nullptr, &*to++, event);
    } else {
      Send(&*from++, same ? &*to++ : nullptr, event);
    }
  }
}

void Router::Add(const Event& event) {
  if (event.bit == kLost) {
    for (const Hearer& hearer : scope_.routes().HearersOf(scope_.watch())) {
      hearer.queue->Add({kLost, false, hearer.name, {}});
    }
    return;
  }
  scope_.routes().Hear(event.path, to_);
  if (event.bit == kRenamed) return AddRename(event);
  for (const Hearer& hearer : to_) Send(nullptr, &hearer, event);
}

}  // namespace quarrox::notifyd
