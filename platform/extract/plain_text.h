// Text without any structure, in whatever encoding.
#pragma once

#include "extract/findings.h"
#include "extract/source.h"

namespace platform::extract {

// Adds a file's text: UTF-8, what begins with a byte order mark, and where the file's type says that it is text, what
// its bytes look like. Adds nothing where it is none of these. Throws std::system_error where reading fails.
void ReadText(const Source& source, Findings& findings);

}  // namespace platform::extract
