#include "paths.h"

namespace quarrox::notifyd {

std::string Join(std::string_view dir, std::string_view name) {
  std::string path;
  path.reserve(dir.size() + name.size() + 1);
  path += dir;
  if (name == ".") return path;
  if (!path.ends_with('/')) path += '/';
  path += name;
  return path;
}

std::string_view Parent(std::string_view path) {
  const size_t slash = path.rfind('/');
  return slash == std::string_view::npos ? std::string_view() : path.substr(0, slash);
}

std::string DirectoryAbove(std::string_view path) {
  const std::string_view above = Parent(path);
  return std::string(above.empty() ? "/" : above);
}

bool IsCovered(const PathSet& dirs, std::string_view path) {
  if (dirs.empty()) return false;
  for (; !path.empty(); path = Parent(path)) {
    if (dirs.contains(path)) return true;
  }
  return false;
}

std::string WithoutSpareSlashes(std::string_view path) {
  std::string plain = "/";
  for (const char c : path) {
    if (c != '/' || !plain.ends_with('/')) plain += c;
  }
  if (plain.size() > 1 && plain.ends_with('/')) plain.pop_back();
  return plain;
}

}  // namespace quarrox::notifyd
