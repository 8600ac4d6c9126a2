#include "common/sdk/share_path.h"

#include "common/log.h"
#include "common/sdk/share.h"
#include "common/strings.h"
#include "vexo/share.h"

namespace quarrox::sdk {
namespace {

constexpr char kHomesShare[] = "homes";

// A path from its first "/homes/" on; the whole path where there is none.
std::string FromHomes(const std::string& path) {
  const size_t at = path.find("/homes/");
  return at == std::string::npos ? path : path.substr(at);
}

}  // namespace

std::string SharePathMgr::GetSharePath(const std::string& vol_path, const User& user, bool home_as_home) {
  char share_name[VEXO_PATH_SIZE] = {};
  char share_path[VEXO_PATH_SIZE] = {};
  {
    const LockMutex lock(SDKMutex());
    if (0 > VEXOShareNamePathGet(vol_path.c_str(), share_name, sizeof(share_name), share_path, sizeof(share_path))) {
      QUARROX_LOG_FAILURE("VEXOShareNamePathGet failed, vol_path=%s", log::Text(vol_path).c_str());
      return "";
    }
  }
  const std::string name = share_name;
  if (name == kHomesShare && user.IsValid()) {
    const std::string home = FromHomes(user.GetHomePath());
    const std::string path = FromHomes(vol_path);
    if (home_as_home && StringStartWith(path + "/", home + "/")) return "/home" + path.substr(home.size());
  }
  const size_t share_length = std::string(share_path).size();
  if (vol_path.size() < share_length) {
    QUARROX_LOG_FAILURE("Malformed input: %s, %s", log::Text(vol_path).c_str(), share_path);
    return "";
  }
  return "/" + name + vol_path.substr(share_length);
}

}  // namespace quarrox::sdk
