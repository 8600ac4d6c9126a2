// The engine's command line.
#pragma once

#include <stdexcept>
#include <string>

namespace quarrox::elasticd {

struct Options {
  bool help = false;
  bool version = false;
  bool foreground = false;  // log to standard error, too
  std::string data = "/var/lib/vexoelasticd";
  std::string check;  // the database to check instead of being the engine
};

class UsageError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

extern const char* const kUsage;

// Throws UsageError, whose text says what is wrong.
Options ParseOptions(int argc, char** argv);

}  // namespace quarrox::elasticd
