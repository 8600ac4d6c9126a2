#include "support/syslog_capture.h"

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <mutex>

// <syslog.h> is not included: with fortified headers it defines syslog itself, as an inline call of __syslog_chk.

namespace quarrox::support {
namespace {

std::mutex lock;
bool log_recording = false;
std::vector<LogLine> log_lines;

void Log(int priority, const char* format, va_list arguments) {
  const int error = errno;
  {
    const std::lock_guard<std::mutex> guard(lock);
    if (log_recording) {
      va_list again;
      va_copy(again, arguments);
      errno = error;
      const int size = vsnprintf(nullptr, 0, format, again);  // the C library's printf knows %m
      va_end(again);
      std::string text(static_cast<size_t>(size) + 1, '\0');
      errno = error;
      vsnprintf(text.data(), text.size(), format, arguments);
      text.pop_back();
      log_lines.push_back({priority, format, text, error});
    }
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

void vsyslog(int priority, const char* format, va_list arguments) {
  Log(priority, format, arguments);
}

void __vsyslog_chk(int priority, int, const char* format, va_list arguments) {
  Log(priority, format, arguments);
}

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
