// The short road of an event line must mean what the full parse means.
#include <cstdint>
#include <cstdlib>
#include <string>

#include "common/error.h"
#include "fileindex/optree.h"
#include "fileindex/optree_event.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  using quarrox::fileindex::Event;
  const std::string line(reinterpret_cast<const char*>(data), size);
  quarrox::fileindex::EventView plain;
  const bool is_plain = quarrox::fileindex::ReadPlainEvent(line, plain);
  try {
    const Event event(line);
    if (!is_plain) return 0;
    if (event.event != plain.event || event.is_dir != plain.is_dir || event.path != plain.path ||
        event.path_old != plain.path_old || !event.data.isNull()) {
      abort();
    }
  } catch (const quarrox::Error&) {
    if (is_plain) abort();
  }
  return 0;
}
