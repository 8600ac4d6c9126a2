#include "common/sdk/open_shares.h"

namespace quarrox::sdk {

const SDKShare& OpenShares::Get(const std::string& name) {
  auto found = shares_.find(name);
  if (found == shares_.end()) found = shares_.emplace(name, std::make_unique<SDKShare>(name)).first;
  return *found->second;
}

}  // namespace quarrox::sdk
