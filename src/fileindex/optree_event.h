// The event line of an OPTree's queue, as the fold wants it.
#pragma once

#include <cstdint>
#include <string_view>

namespace quarrox::fileindex {

// One event whose texts belong to somebody else.
struct EventView {
  uint32_t event = 0;
  bool is_dir = false;
  std::string_view path;
  std::string_view path_old;
  std::string_view data;  // compact JSON text; empty for null
};

// Reads an event line of the plainest form: one object of known members, whose strings have no escapes and whose data
// is null. That is nearly every line of a queue, and costs a tenth of a full parse. A line that it refuses is not
// necessarily bad: only Event(line) can tell. What it accepts means the same as there; its texts lie in the line.
bool ReadPlainEvent(std::string_view line, EventView& event);

}  // namespace quarrox::fileindex
