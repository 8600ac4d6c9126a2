// Which paths a watcher speaks about, by the routes of the time. Whatever is not inside is treated alike, so that a
// move out of an ignored directory is a creation, as is a move from another part of the disk.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "routes.h"

namespace quarrox::notifyd {

// Not thread-safe where Follow() is called.
class Scope {
 public:
  // Watch number `watch`, which looks at `dir`, the real path of a directory.
  Scope(std::string dir, uint32_t watch, std::shared_ptr<const Routes> routes)
      : dir_(std::move(dir)), watch_(watch), routes_(std::move(routes)) {}

  // The one folder `dir`, less the metadata directories and `queue`. Takes both paths to their real place. Throws
  // Error 502 where `dir` is no directory or the queue's directory is missing.
  Scope(const std::string& dir, const std::string& queue);

  const std::string& dir() const { return dir_; }
  uint32_t watch() const { return watch_; }
  const Routes& routes() const { return *routes_; }

  // From now on other routes hold.
  void Follow(std::shared_ptr<const Routes> routes) { routes_ = std::move(routes); }

  // Whether entries of the directory `dir` can be inside at all.
  bool MayHold(std::string_view dir) const { return routes_->MayHold(watch_, dir); }

  // Whether the entry `name` of a directory that may hold entries of the tree is inside. "." is the directory itself.
  bool IsInside(std::string_view dir, std::string_view name) const { return routes_->Takes(watch_, Join(dir, name)); }

 private:
  std::string dir_;
  uint32_t watch_ = 1;
  std::shared_ptr<const Routes> routes_;
};

// The real path of a queue. Throws Error 502 where its directory is missing.
std::string RealQueue(const std::string& path);

// Where an absolute path really is, as far as it exists: what does not exist yet is kept as it stands.
std::string RealPath(const std::string& path);

}  // namespace quarrox::notifyd
