// What the indexing daemon does about the places of a share whose directory was renamed or moved, when it comes to the
// event that ShareRename or ShareMigrate queued.
//
// A place is named by the full path of the share's directory. One at which an indexed share stands by now is that
// share's, and left alone. All may be called again, and throw what loading the folder list throws, Error 502 where a
// place cannot be told, looked at or changed, and 800 where the share is gone.
#pragma once

#include <string>
#include <vector>

#include "common/export.h"

namespace quarrox::fileindex {

// The former places of a share that its queues tell of, the latest first; also those where it stayed so shortly that
// their own queues still tell of the place before. An event that others made redundant counts, too.
QUARROX_API std::vector<std::string> FindFormerPlaces(const std::string& share_name);

// Has the notification daemon write what changes in the share into its queue of now, unless the share is paused, and
// brings along with which folders the index was made. Takes the folder lock.
QUARROX_API void FollowMovedShare(const std::string& share_name, const std::string& path_old);

// Takes away what is left at a former place: monitor configuration, queue and files. For when the index agrees with the
// disk, so that nothing in that queue is needed any more. Takes the folder lock.
QUARROX_API void CleanFormerPlace(const std::string& path_old);

}  // namespace quarrox::fileindex
