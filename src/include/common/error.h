// The one exception type of the library and its codes.
#pragma once

#include <cstdint>
#include <stdexcept>
#include <string>

#include "common/export.h"

namespace quarrox {

// The numbers are part of the interface: callers of the exported operations see them.
enum ErrorCode : int32_t {
  kErrBadParameter = 120,      // a request parameter is missing or of the wrong JSON type
  kErrShareEnum = 121,         // the platform could not list its shares
  kErrSystem = 502,            // a platform call or system operation failed
  kErrCredentials = 503,       // switching or restoring the effective user failed
  kErrJsonLoad = 504,          // a JSON file exists but cannot be loaded
  kErrJsonSave = 505,          // a JSON file cannot be saved
  kErrLockFile = 506,          // a lock file cannot be opened or locked
  kErrNoSuchShare = 800,       // the named share does not exist
  kErrChown = 801,             // a file could not be given to the service user
  kErrFolderExists = 901,      // a folder with the same path is already configured
  kErrNoSuchFolder = 902,      // the requested folder is not configured
  kErrPathNotIndexable = 903,  // the path may not be indexed
  kErrMalformedEvent = 906,    // a raw event line is not valid JSON
  kErrEngineReceive = 913,     // receiving the search engine's reply failed
  kErrEngineParse = 914,       // the fields of a document could not be extracted from its file
  kErrEngineNoData = 916,      // the search engine's reply lacks its data
  kErrEngineReply = 917,       // the search engine has no document of this path, or its reply is not as expected
  kErrNoSpace = 1003,          // not enough free space for an index
  kErrInternal = 9999,         // internal inconsistency of the operation tree
};

// Immutable once made; copies may be thrown across threads.
class QUARROX_API Error : public std::runtime_error {
 public:
  explicit Error(ErrorCode code);
  Error(ErrorCode code, const std::string& reason);
  Error(const Error&) = default;
  ~Error() override;

  // The reason alone, empty where none was given. The composed text ("Quarrox error, code=N, reason=[...]") is
  // std::runtime_error's own message and is reached only through the base class; this is wanted, because callers
  // print code and reason apart.
  const char* what() const noexcept override;

  const ErrorCode code;
  const std::string reason;
};

}  // namespace quarrox
