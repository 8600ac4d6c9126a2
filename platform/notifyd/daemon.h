// The daemon's life: from its options to the last line that it writes.
#pragma once

#include "options.h"

namespace quarrox::notifyd {

// Watches until SIGTERM or SIGINT, which the caller must not have threads for; then reads, resolves and writes what the
// kernel had reported by then. Throws Error.
void RunDaemon(const Options& options);

}  // namespace quarrox::notifyd
