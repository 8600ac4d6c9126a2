// jsoncpp's own writer with the settings whose output toString gives.
#pragma once

#include <string>

#include <json/json.h>

namespace quarrox::support {

inline std::string WriteByJsonCpp(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  builder["emitUTF8"] = true;
  return Json::writeString(builder, value);
}

}  // namespace quarrox::support
