#include "scope.h"

#include <sys/stat.h>

#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>

#include "common/error.h"
#include "common/strings.h"

namespace quarrox::notifyd {
namespace {

std::string RealDirectory(const std::string& path, const std::string& what) {
  char real[PATH_MAX];
  struct stat st = {};
  if (realpath(path.c_str(), real) == nullptr || stat(real, &st) != 0) {
    throw Error(kErrSystem, what + " cannot be opened, path=" + path + ", reason=" + strerror(errno));
  }
  if (!S_ISDIR(st.st_mode)) throw Error(kErrSystem, what + " is not a directory, path=" + path);
  return real;
}

std::string DirectoryOf(const std::string& path) {
  if (path.find('/') == std::string::npos) return ".";
  const std::string dir = Dirname(path);
  return dir.empty() ? "/" : dir;
}

bool HasMetadataComponent(std::string_view relative) {
  while (!relative.empty()) {
    const size_t slash = relative.find('/');
    if (relative.substr(0, slash) == kMetadataDir) return true;
    if (slash == std::string_view::npos) return false;
    relative.remove_prefix(slash + 1);
  }
  return false;
}

}  // namespace

std::string Join(std::string_view dir, std::string_view name) {
  std::string path;
  path.reserve(dir.size() + name.size() + 1);
  path += dir;
  if (name == ".") return path;
  if (!path.ends_with('/')) path += '/';
  path += name;
  return path;
}

Scope::Scope(const std::string& dir, const std::string& queue)
    : dir_(RealDirectory(dir, "The directory to watch")),
      parent_(dir_ == "/" ? std::string() : DirectoryOf(dir_)),
      queue_dir_(RealDirectory(DirectoryOf(queue), "The queue's directory")),
      queue_name_(Basename(queue)) {
  if (queue_name_.empty()) throw Error(kErrSystem, "The queue is no file name, path=" + queue);
  queue_ = Join(queue_dir_, queue_name_);
}

bool Scope::IsInside(std::string_view dir) const {
  if (!dir.starts_with(dir_)) return false;
  std::string_view rest = dir.substr(dir_.size());
  if (rest.empty() || dir_ == "/") return !HasMetadataComponent(rest);
  return rest.front() == '/' && !HasMetadataComponent(rest.substr(1));
}

bool Scope::IsInside(std::string_view dir, std::string_view name) const {
  if (!IsInside(dir)) return dir == parent_ && Join(dir, name) == dir_;
  if (name == kMetadataDir) return false;
  if (dir != queue_dir_ || !name.starts_with(queue_name_)) return true;
  const std::string_view rest = name.substr(queue_name_.size());
  return !rest.empty() && rest != ".tmp";
}

}  // namespace quarrox::notifyd
