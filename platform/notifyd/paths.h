// Absolute paths as texts, which every part of the daemon takes apart in the same way.
#pragma once

#include <functional>
#include <string>
#include <string_view>
#include <unordered_set>

namespace quarrox::notifyd {

struct PathHash {
  using is_transparent = void;
  size_t operator()(std::string_view path) const { return std::hash<std::string_view>()(path); }
};
using PathSet = std::unordered_set<std::string, PathHash, std::equal_to<>>;

// `dir` and `name` as a path; the name "." is the directory itself.
std::string Join(std::string_view dir, std::string_view name);

// Up one directory; empty above the topmost.
std::string_view Parent(std::string_view path);

// The same as a path that can be opened: the topmost directory is above itself.
std::string DirectoryAbove(std::string_view path);

// A path as the way up by Parent() ends: empty for "/".
inline std::string_view Climbable(std::string_view path) {
  return path == "/" ? std::string_view() : path;
}

// Whether `path` is one of `dirs` or below one.
bool IsCovered(const PathSet& dirs, std::string_view path);

// Without doubled and trailing slashes, for a path that begins with one.
std::string WithoutSpareSlashes(std::string_view path);

}  // namespace quarrox::notifyd
