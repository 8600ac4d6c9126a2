// Which formats are read, and by whom.
#pragma once

#include <span>
#include <string>

#include "extract/findings.h"
#include "extract/source.h"

namespace platform::extract {

// Adds to the findings what a file offers. Throws any std::exception where the file is not what its type says, or is
// damaged; what was found until then is kept by whoever calls.
using Extractor = void (*)(const Source& source, Findings& findings);

struct Format {
  const char* type;  // MIME
  Extractor extract;
};

// Text, documents, mail, archives; sound, pictures and video.
std::span<const Format> DocumentFormats();
std::span<const Format> MediaFormats();

// Null where nothing is read from such files.
Extractor FindExtractor(const std::string& type);

}  // namespace platform::extract
