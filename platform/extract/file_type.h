// What a file is.
#pragma once

#include <magic.h>

#include <string>

#include "extract/source.h"

namespace platform::extract {

// Judges by the first bytes, and by the name's extension where these say little. Not thread-safe.
class FileTypes {
 public:
  // Loads the table of types, once. Throws std::runtime_error where there is none.
  FileTypes();
  ~FileTypes() { magic_close(cookie_); }
  FileTypes(const FileTypes&) = delete;
  FileTypes& operator=(const FileTypes&) = delete;

  // A MIME type, "application/octet-stream" where nothing is known.
  std::string Of(const Source& source) const;

 private:
  magic_t cookie_;
};

}  // namespace platform::extract
