#include "monitor.h"

#include "common/error.h"
#include "paths.h"

namespace quarrox::notifyd {
namespace {

[[noreturn]] void Bad(const std::string& what) {
  throw Error(kErrBadParameter, what);
}

std::string PathMember(const Json::Value& object, const char* key) {
  const Json::Value& value = object[key];
  if (!value.isString()) Bad("\"" + std::string(key) + "\" is missing or no string");
  std::string path = value.asString();
  if (!path.starts_with('/') || path.find('\0') != std::string::npos) {
    Bad("\"" + std::string(key) + "\" is no absolute path");
  }
  return WithoutSpareSlashes(path);
}

std::vector<std::string> ParseNames(const Json::Value& value) {
  std::vector<std::string> names;
  if (value.isNull()) return names;
  if (!value.isArray()) Bad("\"ignore\" is no array");
  for (const Json::Value& name : value) {
    if (!name.isString()) Bad("\"ignore\" holds what is no string");
    names.push_back(name.asString());
  }
  return names;
}

MonitoredFolder ParseFolder(const Json::Value& value) {
  if (!value.isObject()) Bad("\"config\" holds what is no object");
  const Json::Value& mask = value["mask"];
  if (!mask.isUInt()) Bad("\"mask\" is missing or no mask of event bits");
  return {PathMember(value, "path"), mask.asUInt(), ParseNames(value["ignore"])};
}

}  // namespace

Monitor ParseMonitor(const Json::Value& value) {
  if (!value.isObject()) Bad("it is no object");
  Monitor monitor;
  monitor.queue = PathMember(value, "queue");
  const Json::Value& folders = value["config"];
  if (!folders.isArray()) Bad("\"config\" is missing or no array");
  for (const Json::Value& folder : folders) monitor.folders.push_back(ParseFolder(folder));
  return monitor;
}

}  // namespace quarrox::notifyd
