// The daemon's command line.
#pragma once

#include <stdexcept>
#include <string>

namespace quarrox::fileindexd {

struct Options {
  bool help = false;
  bool version = false;
  bool foreground = false;  // log to standard error, too
  bool eager = false;       // work as fast as the machine can
  bool worker = false;      // serve one share instead of being the daemon
  std::string share;        // which one
};

class UsageError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

extern const char* const kUsage;

// Throws UsageError, whose text says what is wrong.
Options ParseOptions(int argc, char** argv);

}  // namespace quarrox::fileindexd
