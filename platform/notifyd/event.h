// What the daemon says about the watched tree: one event a line, one bit an event.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace quarrox::notifyd {

// The bits of an event, as the queue's reader knows them.
inline constexpr uint32_t kAttributes = 0x04;
inline constexpr uint32_t kWritten = 0x08;
inline constexpr uint32_t kCreated = 0x40;
inline constexpr uint32_t kDeleted = 0x80;
inline constexpr uint32_t kRenamed = 0x100;
inline constexpr uint32_t kLost = 0x200;  // events were lost: nothing below the path is known any more

// A view: the paths live as long as the call that it is given to.
struct Event {
  uint32_t bit;
  bool is_dir;
  std::string_view path;      // bytes, absolute; of a rename the new path
  std::string_view path_old;  // of a rename the former path, else empty
};

// Takes events in the order in which a reader must replay them.
class EventSink {
 public:
  virtual ~EventSink() = default;
  virtual void Add(const Event& event) = 0;
};

// Appends the event's line to `lines`, newline included. Quotes, backslashes and control characters are escaped; every
// other byte of a path is written as it is, also where it is no UTF-8.
void AppendLine(std::string& lines, const Event& event);

}  // namespace quarrox::notifyd
