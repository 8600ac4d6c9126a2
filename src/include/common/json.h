// JSON: whole values as text and as files, typed reading of members, partial changes.
//
// Strings are bytes: what is no UTF-8 passes through unchanged in both directions, so that any file name survives.
// Thread-safe as far as the values are not shared.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include <json/json.h>

#include "common/error.h"
#include "common/export.h"

namespace quarrox {

// Parses exactly one JSON value of any type: no comments, no trailing text or commas; of doubled keys the last wins.
// False, with `value` unspecified, when the text is anything else or nests deeper than 1000 levels.
QUARROX_API bool fromString(Json::Value& value, const std::string& text);

// Compact JSON on one line; never \u escapes for what is not a control character.
QUARROX_API std::string toString(const Json::Value& value);

// Reads a file that holds one value. False when it cannot be read or parsed.
QUARROX_API bool fromFile(Json::Value& value, const std::string& path);

// Writes a temporary file beside `path`, syncs it, renames it over `path` and syncs the directory: a reader sees the
// old text or the new one, whatever dies. An existing file's mode is kept, a new one is 0644. False and errno set on
// failure; the old text is then still there, save where only the last sync of the directory failed.
QUARROX_API bool toFile(const Json::Value& value, const std::string& path);

// The same with any text, as it stands.
bool ReplaceFile(const std::string& path, const std::string& text);

// ", data=" and the compact text of the value; ends the reasons of errors.
QUARROX_API std::string AppendData(const Json::Value& value);

// Logs and throws Error 120 for GetJsonValue.
[[noreturn]] QUARROX_API void FailGetJsonValue(const char* condition, const std::string& reason,
                                               const Json::Value& object);

// Whether a value can be read as T, by jsoncpp's own test, and the conversion.
// T is std::string, bool, int, unsigned int, int64_t, double or Json::Value (which is always true).
template <typename T>
bool isJsonType(const Json::Value& value);
template <typename T>
T asJsonType(const Json::Value& value);

// clang-format off
template <> inline bool isJsonType<std::string>(const Json::Value& value) { return value.isString(); }
template <> inline bool isJsonType<bool>(const Json::Value& value) { return value.isBool(); }
template <> inline bool isJsonType<int>(const Json::Value& value) { return value.isInt(); }
template <> inline bool isJsonType<unsigned int>(const Json::Value& value) { return value.isUInt(); }
template <> inline bool isJsonType<int64_t>(const Json::Value& value) { return value.isInt64(); }
template <> inline bool isJsonType<double>(const Json::Value& value) { return value.isDouble(); }
template <> inline bool isJsonType<Json::Value>(const Json::Value&) { return true; }
template <> inline std::string asJsonType<std::string>(const Json::Value& value) { return value.asString(); }
template <> inline bool asJsonType<bool>(const Json::Value& value) { return value.asBool(); }
template <> inline int asJsonType<int>(const Json::Value& value) { return value.asInt(); }
template <> inline unsigned int asJsonType<unsigned int>(const Json::Value& value) { return value.asUInt(); }
template <> inline int64_t asJsonType<int64_t>(const Json::Value& value) { return value.asInt64(); }
template <> inline double asJsonType<double>(const Json::Value& value) { return value.asDouble(); }
template <> inline Json::Value asJsonType<Json::Value>(const Json::Value& value) { return value; }
// clang-format on

// Reads the member `key` of `object` into `out`. Throws Error 120: "Not an object" where it is none, and for a required
// member "Missing property: KEY" or "Not a string", each followed by AppendData(object), and logs it. The text says
// "Not a string" whichever type was wanted: callers know it so. A member that is not required and missing or of another
// type leaves `out` as it was.
template <typename T>
void GetJsonValue(T& out, const Json::Value& object, const std::string& key, bool required) {
  if (!object.isObject()) FailGetJsonValue("!object.isObject()", "Not an object", object);
  const Json::Value* member = object.find(key.data(), key.data() + key.size());
  if (member == nullptr) {
    if (!required) return;
    FailGetJsonValue("!object.isMember(key)", "Missing property: " + key, object);
  }
  if (!isJsonType<T>(*member)) {
    if (!required) return;
    FailGetJsonValue("!isJsonType<T>(object[key])", "Not a string", object);
  }
  out = asJsonType<T>(*member);
}

// Applies each member of the object `changes` to `target`, which becomes an object where it is none: null removes the
// key, an object is applied to the member of that key, anything else replaces. Nesting is bounded by what fromString
// accepts.
QUARROX_API void JsonApplyChanges(Json::Value& target, const Json::Value& changes);

template <typename T>
Json::Value Vec2JsonArr(const std::vector<T>& values) {
  Json::Value array(Json::arrayValue);
  for (const T& value : values) array.append(value);
  return array;
}

template <typename T>
std::vector<T> JsonArr2Vec(const Json::Value& array) {
  std::vector<T> values;
  values.reserve(array.size());
  for (const Json::Value& value : array) values.push_back(asJsonType<T>(value));
  return values;
}

}  // namespace quarrox
