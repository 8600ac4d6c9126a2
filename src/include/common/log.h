// The lines that the system writes to the system log, all at priority LOG_ERR, also the informative ones.
//
//   failure   unit:line (pid, euid) (function) message[ [err: text of errno]]
//   progress  unit:line message
//
// A failure line carries the errno ending when errno is set at the moment of logging; errno is 0 afterwards. The
// formats reach syslog(3) whole, so that a replaced syslog sees them. Thread-safe, as syslog is.
#pragma once

#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <string>

#include "common/error.h"
#include "common/export.h"

namespace quarrox {

// At 7 the library also writes verbose progress lines. Set it before other threads start.
QUARROX_API extern int log_level;
inline constexpr int kLogVerbose = 7;

namespace log {

// A text as it goes into a log line. The system log takes one datagram a line (about 200 KiB here), and drops a
// longer one without a word; so a text past 8 KiB is cut and its length said instead.
std::string Text(const std::string& text);

// The unit that a source belongs to: its file name without directory, extension.
struct Unit {
  char name[48] = {};
  constexpr explicit Unit(const char* path) {
    const char* base = path;
    for (const char* p = path; *p != '\0'; ++p) {
      if (*p == '/') base = p + 1;
    }
    for (size_t i = 0; i + 1 < sizeof(name) && base[i] != '\0' && base[i] != '.'; ++i) name[i] = base[i];
  }
};

}  // namespace log
}  // namespace quarrox

// A unit of several sources defines this to its own name before its first include.
#ifndef QUARROX_LOG_UNIT
#define QUARROX_LOG_UNIT __FILE__
#endif

// __extension__ because %m is glibc's own.
#define QUARROX_SYSLOG_FAILURE_(function, format, ...)                                                                 \
  do {                                                                                                                 \
    const int quarrox_errno = errno;                                                                                   \
    static constexpr ::quarrox::log::Unit quarrox_unit(QUARROX_LOG_UNIT);                                              \
    if (quarrox_errno != 0) {                                                                                          \
      errno = quarrox_errno;                                                                                           \
      __extension__ ::syslog(LOG_ERR, "%s:%d (%d, %u) (%s) " format " [err: %m]", quarrox_unit.name, __LINE__,         \
                             ::getpid(), ::geteuid(), function, __VA_ARGS__);                                          \
    } else {                                                                                                           \
      ::syslog(LOG_ERR, "%s:%d (%d, %u) (%s) " format, quarrox_unit.name, __LINE__, ::getpid(), ::geteuid(), function, \
               __VA_ARGS__);                                                                                           \
    }                                                                                                                  \
    errno = 0;                                                                                                         \
  } while (false)

// A failure line with a message of its own: a literal format with at least one argument.
#define QUARROX_LOG_FAILURE(format, ...) QUARROX_SYSLOG_FAILURE_(__func__, format, __VA_ARGS__)

// "Failed [condition]", for a failure that is not thrown. The condition is output: where the code's own test reads
// otherwise than the text to be logged, the text is what is passed.
#define QUARROX_LOG_FAILED(condition) QUARROX_SYSLOG_FAILURE_(__func__, "Failed [%s]", condition)

// A progress line: a literal format with at least one argument.
#define QUARROX_LOG_PROGRESS(format, ...)                                         \
  do {                                                                            \
    static constexpr ::quarrox::log::Unit quarrox_unit(QUARROX_LOG_UNIT);         \
    ::syslog(LOG_ERR, "%s:%d " format, quarrox_unit.name, __LINE__, __VA_ARGS__); \
  } while (false)

// Logs "Failed [condition], reason: reason" and throws Error(code, reason). errno is captured before anything else, so
// a reason that was built from it must have been built before.
#define QUARROX_THROW(condition, code, why) QUARROX_THROW_IN(__func__, condition, code, why)

// The same in the name of another function.
#define QUARROX_THROW_IN(function, condition, code, why)                                             \
  do {                                                                                               \
    const int quarrox_throw_errno = errno;                                                           \
    const ::quarrox::Error quarrox_error(code, why);                                                 \
    const std::string quarrox_reason = ::quarrox::log::Text(quarrox_error.reason);                   \
    errno = quarrox_throw_errno;                                                                     \
    QUARROX_SYSLOG_FAILURE_(function, "Failed [%s], reason: %s", condition, quarrox_reason.c_str()); \
    throw quarrox_error;                                                                             \
  } while (false)
