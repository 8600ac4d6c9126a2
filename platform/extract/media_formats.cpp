#include "extract/formats.h"

namespace platform::extract {

std::span<const Format> MediaFormats() {
  return {};
}

}  // namespace platform::extract
