#include "common/sdk/user.h"

#include "common/log.h"
#include "common/sdk/share.h"
#include "vexo/share.h"
#include "vexo/user.h"

namespace quarrox::sdk {

User::User(const std::string& name) : name_(name), valid_(!name.empty()) {}

std::string User::GetHomePath() const {
  if (!valid_ || !home_.empty()) return home_;
  char path[VEXO_PATH_SIZE] = {};
  const LockMutex lock(SDKMutex());
  if (0 > VEXOServiceHomePathGet(name_.c_str(), path, sizeof(path))) {
    QUARROX_THROW("0 > VEXOServiceHomePathGet(name_.c_str(), path, sizeof(path))", kErrSystem,
                  "VEXOServiceHomePathGet failed, user=" + name_);
  }
  home_ = path;
  return home_;
}

}  // namespace quarrox::sdk
