#include "support/syslog_capture.h"

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <mutex>

// <syslog.h> is not included: with fortified headers it defines syslog itself, as an inline call of __syslog_chk.

namespace quarrox::support {
namespace {

std::mutex lock;
bool log_recording = false;
std::vector<LogLine> log_lines;

void Log(int priority, const char* format, va_list arguments) {
  const int error = errno;
  const std::lock_guard<std::mutex> guard(lock);
  if (log_recording) {
    char* text = nullptr;
    errno = error;
    const int size = vasprintf(&text, format, arguments);  // the C library's printf knows %m
    log_lines.push_back({priority, format, std::string(text, static_cast<size_t>(size))});
    free(text);
  }
  errno = error;
}

}  // namespace

SyslogCapture::SyslogCapture() {
  const std::lock_guard<std::mutex> guard(lock);
  log_lines.clear();
  log_recording = true;
  errno = 0;
}

SyslogCapture::~SyslogCapture() {
  const std::lock_guard<std::mutex> guard(lock);
  log_recording = false;
}

std::vector<LogLine> SyslogCapture::lines() const {
  const std::lock_guard<std::mutex> guard(lock);
  return log_lines;
}

std::vector<std::string> SyslogCapture::texts() const {
  std::vector<std::string> result;
  for (const LogLine& line : lines()) result.push_back(line.text);
  return result;
}

}  // namespace quarrox::support

using quarrox::support::Log;

extern "C" {

void syslog(int priority, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  Log(priority, format, arguments);
  va_end(arguments);
}

void __syslog_chk(int priority, int, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  Log(priority, format, arguments);
  va_end(arguments);
}

}  // extern "C"
