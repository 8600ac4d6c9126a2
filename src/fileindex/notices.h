// Desktop notices to the administrators. Each runs the platform's notification tool, waits for it and returns its exit
// status, which callers need not look at; -1 where it could not be started. Thread-safe.
#pragma once

#include "common/export.h"

namespace quarrox::fileindex {

// Indexing stopped because there is no room on the disk.
QUARROX_API int SendKOSNotify();

// Indexing stopped because the search engine has no memory left.
QUARROX_API int NotifyLackOfMemory();

}  // namespace quarrox::fileindex
