// The system log, replaced at link time: lines go nowhere, except while a SyslogCapture lives.
#pragma once

#include <string>
#include <vector>

namespace quarrox::support {

struct LogLine {
  int priority;
  std::string format;  // as it was given to syslog
  std::string text;    // as the system log would show it, %m expanded
};

// Records what is written to the system log during its lifetime; at most one lives at a time. It starts
// with errno 0, whatever an earlier test left there. Thread-safe.
class SyslogCapture {
 public:
  SyslogCapture();
  ~SyslogCapture();
  SyslogCapture(const SyslogCapture&) = delete;
  SyslogCapture& operator=(const SyslogCapture&) = delete;

  std::vector<LogLine> lines() const;
  std::vector<std::string> texts() const;
};

}  // namespace quarrox::support
