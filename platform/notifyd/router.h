// Passes the events of one watch on to the queues that want them.
//
// Each queue gets an event once, however many of its folders govern the path, and with the path by which it knows the
// outermost of them. A rename is one only for a queue that hears of both its ends; for another one it is a creation or
// a deletion. Not thread-safe.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "event.h"
#include "scope.h"

namespace quarrox::notifyd {

class Router final : public EventSink {
 public:
  // The scope, with its routes of the time, says where events go.
  explicit Router(const Scope& scope) : scope_(scope) {}

  // Lost events are every queue's concern that has a folder here, whatever it wants to hear of.
  void Add(const Event& event) override;

 private:
  void AddRename(const Event& event);
  static void Send(const Hearer* from, const Hearer* to, Event event);

  const Scope& scope_;
  std::vector<Hearer> to_;
  std::vector<Hearer> from_;
};

}  // namespace quarrox::notifyd
