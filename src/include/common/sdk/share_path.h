// Paths as users see them.
#pragma once

#include <string>

#include "common/export.h"
#include "common/sdk/user.h"

namespace quarrox::sdk {

class QUARROX_API SharePathMgr {
 public:
  // The path that users see for a path on a volume: "/" and the share's name, then the rest. With `home_as_home` what
  // lies in the user's own home, inside the share of homes, begins with "/home" instead. Empty, and logged, where no
  // share holds the path. Throws Error 502 where the home of a valid user has to be known and cannot be found.
  // Thread-safe.
  static std::string GetSharePath(const std::string& vol_path, const User& user, bool home_as_home);
};

}  // namespace quarrox::sdk
