// Texts and paths as texts. Nothing here touches the file system. Thread-safe.
#pragma once

#include <memory>
#include <string>
#include <utility>

#include "common/export.h"

namespace quarrox {

// Makes a shared object from constructor arguments.
template <typename T, typename... Args>
std::shared_ptr<T> newClass(Args&&... args) {
  return std::make_shared<T>(std::forward<Args>(args)...);
}

QUARROX_API bool StringStartWith(const std::string& text, const std::string& prefix);

// The part after the last "/": "a" for "a", empty for "a/".
QUARROX_API std::string Basename(const std::string& path);

// The part before the last "/": empty for "a" and for "/a".
QUARROX_API std::string Dirname(const std::string& path);

// What follows the last "." of the base name, without the dot; empty where there is none. `lower` lowers ASCII letters.
QUARROX_API std::string GetFileExtension(const std::string& path, bool lower);

// Lowers every byte through the C library: ASCII letters only in the "C" locale, which the daemons run in.
QUARROX_API std::string ToLower(const std::string& text);

// Removes leading, trailing or both runs of what the C library calls white space.
QUARROX_API std::string LTrim(const std::string& text);
QUARROX_API std::string RTrim(const std::string& text);
QUARROX_API std::string Trim(const std::string& text);

}  // namespace quarrox
