// Paths of folders as people type them.
#pragma once

#include <set>
#include <string>

#include "fileindex/folder_mgr.h"

namespace quarrox::ctl {

// The share path that is meant: a path without the slashes that a shell's completion leaves, a relative one from here,
// a full one by the share that holds it. A share path is told from a full one by its first component, which is one of
// `shares`; what no share holds stays as it is. Throws UsageError for an empty path, or a relative one that is not
// there.
std::string AsSharePath(const std::string& typed, const std::set<std::string>& shares);

// The share path of the folder that is meant. Throws Error 902 where there is none, and says which folder governs what
// lies below one.
std::string FolderPath(const fileindex::FolderMgr& folder_mgr, const std::string& typed);

}  // namespace quarrox::ctl
