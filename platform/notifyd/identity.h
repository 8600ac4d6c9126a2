// Which directory stands at a path.
#pragma once

#include <cstdint>
#include <string>

namespace quarrox::notifyd {

// A directory's identity, for as long as it is mounted.
struct Identity {
  uint64_t mount = 0;
  uint64_t device = 0;
  uint64_t inode = 0;
  int64_t born = 0;  // nanoseconds since the epoch: numbers of inodes are used again
  bool operator==(const Identity&) const = default;
};

// False with errno where there is no such directory.
bool Identify(const std::string& path, Identity& identity);

// The topmost directory of the mount that the directory `path`, a real path, is on.
std::string MountPoint(const std::string& path);

}  // namespace quarrox::notifyd
