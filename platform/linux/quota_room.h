// What one quota leaves.
#pragma once

#include <sys/quota.h>

#include <ctime>

namespace platform {

// Whether a quota's record lets `bytes` more bytes be written at `now`. A soft limit counts only when the time of grace
// that it gives has run out; a limit of 0 is none.
bool QuotaHasRoom(const dqblk& quota, unsigned long long bytes, time_t now);

}  // namespace platform
