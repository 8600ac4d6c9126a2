#include "extract/formats.h"

namespace platform::extract {

Extractor FindExtractor(const std::string& type) {
  for (const std::span<const Format> formats : {DocumentFormats(), MediaFormats()}) {
    for (const Format& format : formats) {
      if (type == format.type) return format.extract;
    }
  }
  return nullptr;
}

}  // namespace platform::extract
