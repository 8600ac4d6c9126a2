// Questions to the file system and moves of single files. Thread-safe, except that the answers are those of a moment.
#pragma once

#include <dirent.h>

#include <string>

#include "common/export.h"

namespace quarrox {

// Whether the path can be stat-ed, whatever it is.
QUARROX_API bool IsFileExist(const std::string& path);

// Whether the path is a directory. With `follow_link` a symbolic link is followed by its text as it stands: a relative
// one from the process's current directory, not from the link's. This is wanted: callers know it so.
QUARROX_API bool IsDirExist(const std::string& path, bool follow_link);

// Whether an entry read from `dir` is a directory; asks the file system only where the entry does not say. A symbolic
// link is none.
QUARROX_API bool IsDirentDir(const dirent& entry, const std::string& dir);

// Whether a file system is mounted at the path; false also where that cannot be told.
QUARROX_API bool IsMountPoint(const std::string& path);

// Whether the process's effective user has all of `permission` (VEXO_PERM_* bits) on the path.
QUARROX_API bool CheckACLPerm(const std::string& path, unsigned int permission);

// The canonical path; empty where there is none.
QUARROX_API std::string RealPath(const std::string& path);

// Makes the missing directories above a file, with mode 0755 whatever the umask is. One that cannot be made is noticed
// by who writes the file. Leaves errno as it was.
QUARROX_API void MakeDirectoriesOf(const std::string& path);

// Removes a file. False and errno on failure.
QUARROX_API bool Unlink(const std::string& path);

// Moves or copies one file, with its contents, mode, owner and times, over what is there. False and errno on failure.
QUARROX_API bool MVFile(const std::string& from, const std::string& to);
QUARROX_API bool CPFile(const std::string& from, const std::string& to);

// Gives a file to the service user. Throws Error 801 when there is no such user or the file cannot be given.
QUARROX_API void ChownQuarrox(const std::string& path);

}  // namespace quarrox
