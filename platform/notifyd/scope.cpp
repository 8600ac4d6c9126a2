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

}  // namespace

Scope::Scope(const std::string& dir, const std::string& queue) : dir_(RealDirectory(dir, "The directory to watch")) {
  auto routes = std::make_shared<Routes>();
  routes->Add({dir_, dir_, watch_, kAllEvents, {std::string(kMetadataDir)}, nullptr});
  routes->AddQueue(RealQueue(queue));
  routes_ = std::move(routes);
}

std::string RealQueue(const std::string& path) {
  const std::string dir = RealDirectory(DirectoryOf(path), "The queue's directory");
  const std::string name = Basename(path);
  if (name.empty()) throw Error(kErrSystem, "The queue is no file name, path=" + path);
  return Join(dir, name);
}

std::string RealPath(const std::string& path) {
  char real[PATH_MAX];
  for (std::string_view there = path; !there.empty(); there = Parent(there)) {
    if (realpath(std::string(there).c_str(), real) == nullptr) continue;
    const std::string_view rest = std::string_view(path).substr(there.size());
    return rest.empty() ? real : std::string(Climbable(real)) + std::string(rest);
  }
  return path;
}

}  // namespace quarrox::notifyd
