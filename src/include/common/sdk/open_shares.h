// The shares that one operation looks at.
#pragma once

#include <map>
#include <memory>
#include <string>

#include "common/export.h"
#include "common/sdk/share.h"

namespace quarrox::sdk {

// Shares by name, each opened when it is first asked for and then kept. One that is not there is asked for again each
// time. Not thread-safe.
class QUARROX_API OpenShares {
 public:
  // Throws as SDKShare's constructor. The reference is valid as long as this object.
  const SDKShare& Get(const std::string& name);

 private:
  std::map<std::string, std::unique_ptr<SDKShare>> shares_;
};

}  // namespace quarrox::sdk
