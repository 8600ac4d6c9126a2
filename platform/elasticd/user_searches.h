// Searches of users who may do nothing else with the engine.
#pragma once

#include <condition_variable>
#include <mutex>
#include <set>
#include <string>

#include "answer.h"
#include "common/peer.h"
#include "engine.h"

namespace quarrox::elasticd {

// Thread-safe.
class UserSearches {
 public:
  // The engine lives longer.
  explicit UserSearches(Engine& engine) : engine_(engine) {}

  // Answers a request of the user behind a socket, whatever it is. Throws nothing.
  void Handle(int client, const std::string& request, Answer& answer);

 private:
  class Turn;

  Engine& engine_;
  std::mutex mutex_;
  std::condition_variable ended_;
  std::set<uid_t> running_;  // whose searches run
};

}  // namespace quarrox::elasticd
