// Opening files in directories that others may write to.
#pragma once

#include <string>

#include "common/export.h"

namespace quarrox {

// As open(2), close-on-exec, with O_NOFOLLOW; a symbolic link on the way to the last component is refused with ELOOP as
// well, so that nobody who may write there leads the caller to another place. Where the kernel cannot do that (before
// Linux 5.6), only the last one is looked at.
QUARROX_API int OpenWithoutLinks(const std::string& path, int flags);

}  // namespace quarrox
