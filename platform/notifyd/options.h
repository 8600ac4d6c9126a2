// The daemon's command line.
#pragma once

#include <stdexcept>
#include <string>

namespace quarrox::notifyd {

enum class Method { kAuto, kFanotify, kInotify };

struct Options {
  std::string dir;  // empty to serve the monitor configurations
  std::string queue;
  Method method = Method::kAuto;
  bool limited_queue = false;
  bool foreground = false;
  bool help = false;
  bool version = false;
};

class UsageError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

extern const char* const kUsage;

// Throws UsageError, whose text says what is wrong.
Options ParseOptions(int argc, char** argv);

}  // namespace quarrox::notifyd
