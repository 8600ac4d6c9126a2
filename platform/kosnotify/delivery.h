// The roads on which a notice reaches people.
#pragma once

#include <chrono>
#include <string>
#include <vector>

namespace quarrox::kosnotify {

// A program that gets a notice. Nothing of it passes through a shell.
struct Delivery {
  std::vector<std::string> arguments;    // the first is the program's path
  std::vector<std::string> environment;  // all of it, as NAME=VALUE
  std::string input;                     // what it reads from standard input
};

// Runs all of them at once and waits for them. Those that are not done when the time is over are killed, with every
// process of their session. Returns whether each ended with status 0; what went wrong goes to the system log.
bool Deliver(const std::vector<Delivery>& deliveries, std::chrono::seconds time);

}  // namespace quarrox::kosnotify
