// Directories that the platform makes for itself.
#pragma once

#include <sys/types.h>

#include <string>

namespace platform {

// Whom a new directory is given to; -1 leaves it with the process.
struct Owner {
  uid_t user = static_cast<uid_t>(-1);
  gid_t group = static_cast<gid_t>(-1);
};

// Makes a directory and those above it that are missing, each synced, of this mode whatever the umask is, and given to
// `owner` where the process may give files away. A directory that is there stays as it is. False with errno on failure.
bool MakeDirectory(const std::string& path, mode_t mode, const Owner& owner = {});

}  // namespace platform
