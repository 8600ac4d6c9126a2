// The two roads of fromString. For json.cpp and for tests, which compare them; everybody else calls fromString.
#pragma once

#include <string>

#include <json/json.h>

namespace quarrox {

// jsoncpp's reader with the settings that fromString promises: it decides what is accepted and what it means.
bool ReadJsonByRules(Json::Value& value, const std::string& text);

// The same value for what is plain JSON of modest depth, several times faster. False, with `value` unspecified, for
// whatever is refused or might mean something else there: that is for ReadJsonByRules to decide.
bool ReadPlainJson(Json::Value& value, const std::string& text);

}  // namespace quarrox
