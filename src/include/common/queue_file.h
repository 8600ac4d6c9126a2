// The producer's half of a share's event queue: appending lines to a file that its consumer may rename away at any
// moment.
//
// A producer locks the queue file, makes sure that what it locked is still the file at that path (else it starts over),
// appends with one write and unlocks. The consumer renames under the same lock. So no line is ever written into a file
// that was already taken away.
#pragma once

#include <string>

#include "common/export.h"

namespace quarrox {

// Appends `lines`, whole newline-terminated lines, to the queue at `path`, which is made with mode 0600 where it is
// absent. Waits in the kernel for the lock. All of `lines` is appended or nothing: a write cut short (a full disk) is
// undone. Throws Error 502 with the reason "Failed to append to queue, path=PATH, reason=TEXT",
// which is not logged: whoever tries again says so once.
QUARROX_API void AppendToQueue(const std::string& path, const std::string& lines);

}  // namespace quarrox
