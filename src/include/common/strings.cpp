#include "common/strings.h"

#include <algorithm>
#include <cctype>

namespace quarrox {
namespace {

// The C library's tests take a byte as unsigned char; a plain char above 0x7f would be undefined.
bool IsSpace(char c) {
  return isspace(static_cast<unsigned char>(c)) != 0;
}
char LowerByte(char c) {
  return static_cast<char>(tolower(static_cast<unsigned char>(c)));
}

}  // namespace

bool StringStartWith(const std::string& text, const std::string& prefix) {
  return text.compare(0, prefix.size(), prefix) == 0;
}

std::string Basename(const std::string& path) {
  const size_t slash = path.rfind('/');
  return slash == std::string::npos ? path : path.substr(slash + 1);
}

std::string Dirname(const std::string& path) {
  const size_t slash = path.rfind('/');
  return slash == std::string::npos ? std::string() : path.substr(0, slash);
}

std::string GetFileExtension(const std::string& path, bool lower) {
  const std::string base = Basename(path);
  const size_t dot = base.rfind('.');
  if (dot == std::string::npos) return std::string();
  const std::string extension = base.substr(dot + 1);
  return lower ? ToLower(extension) : extension;
}

std::string ToLower(const std::string& text) {
  std::string result = text;
  std::transform(result.begin(), result.end(), result.begin(), LowerByte);
  return result;
}

std::string LTrim(const std::string& text) {
  return std::string(std::find_if_not(text.begin(), text.end(), IsSpace), text.end());
}

std::string RTrim(const std::string& text) {
  return std::string(text.begin(), std::find_if_not(text.rbegin(), text.rend(), IsSpace).base());
}

std::string Trim(const std::string& text) {
  return LTrim(RTrim(text));
}

}  // namespace quarrox
