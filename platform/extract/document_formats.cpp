#include "extract/formats.h"

namespace platform::extract {

std::span<const Format> DocumentFormats() {
  return {};
}

}  // namespace platform::extract
