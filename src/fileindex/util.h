// Which paths belong to which share, which may be indexed, and what kind of file a name says it is.
//
// A full path is where a file lies on its volume (/volume1/docs/a). A share path is what users see: "/", the share's
// name, and the rest (/docs/a). Paths are bytes; nothing here takes them for UTF-8. Thread-safe. What takes OpenShares
// is for an operation with many paths: it opens no share that is open there.
#pragma once

#include <string>

#include "common/export.h"
#include "common/sdk/open_shares.h"

namespace quarrox::fileindex {

using sdk::OpenShares;

// The first component of a share path. Throws Error 120 with the path where it does not begin with "/".
QUARROX_API std::string GetShareNameByPath(const std::string& share_path);
QUARROX_API void GetShareNameByPath(std::string& share, const std::string& share_path);

// The full path of a share path: the volume of the share, then the share path, so that a share's directory is taken to
// bear the share's name. Throws Error 120 as GetShareNameByPath, Error 800 where there is no such share.
QUARROX_API std::string GetFullPath(const std::string& share_path);
QUARROX_API std::string GetFullPath(const std::string& share_path, OpenShares& shares);
QUARROX_API void GetFullPath(std::string& full_path, const std::string& share_path);

// The share that holds a full path, and that share's own directory. Throws Error 502 where no share does.
QUARROX_API void GetShareNamePathByFullPath(std::string& share, std::string& share_dir, const std::string& full_path);

// A path with its first component `old_share` replaced, wherever it stands. Throws Error 120 where it has none.
QUARROX_API std::string ReplacePathShare(const std::string& path, const std::string& new_share,
                                         const std::string& old_share);

// Whether a path lies in a recycle bin, of its share or of a user's home. Throws Error 502 where no share holds it.
QUARROX_API bool IsFullPathInRecycleBin(const std::string& full_path);

// Whether a name (one component) is kept for the system or for clients' own housekeeping. Exact, by bytes.
QUARROX_API bool IsSystemPreservedFileName(const std::string& name);

// What keeps a path from being indexed, in the order in which it is looked for; the first that applies decides.
enum PathRule {
  kPathAccepted = 0,
  kPathInSnapshot,     // a snapshot of a share or volume
  kPathNotFound,       // its file system cannot be told, mostly because it does not exist
  kPathOnFileSystem,   // on a remote, an image or a pseudo file system
  kPathShareLocked,    // its share is encrypted and locked
  kPathShareReadOnly,  // its share is read-only
  kPathInRecycleBin,   // as IsFullPathInRecycleBin
  kPathIsMountPoint,   // something else is mounted there
  kPathReservedName,   // a component is a reserved name
  kPathNotCanonical    // it is not what realpath() makes of it, or that cannot be told
};

struct PathVerdict {
  PathRule rule = kPathAccepted;
  std::string detail = {};  // what of the path the rule found: the reserved name, the canonical path, ...
};

// Judges a full path. Throws what finding its share throws: Error 502 where no share holds it, 800 where that is gone
// meanwhile, 502 where the share cannot be asked.
QUARROX_API PathVerdict JudgeFullPath(const std::string& full_path);
QUARROX_API PathVerdict JudgeFullPath(const std::string& full_path, OpenShares& shares);

// The same for an entry, no symbolic link, of a directory that was just accepted: all of its path but the last
// component is known to be right then, and not resolved once more.
QUARROX_API PathVerdict JudgeEntry(const std::string& full_path, OpenShares& shares);

// For people and programs: the rule's name in one word, why the path is refused, and what to do about it. All are empty
// for an accepted path.
QUARROX_API std::string PathRuleName(PathRule rule);
QUARROX_API std::string DescribeVerdict(const PathVerdict& verdict);
QUARROX_API std::string RemedyOf(const PathVerdict& verdict);

// Whether JudgeFullPath accepts a path; throws as it does.
QUARROX_API bool CanFullPathBeIndexed(const std::string& full_path);
QUARROX_API bool CanPathBeIndexed(const std::string& share_path);
QUARROX_API bool CanPathBeIndexed(const std::string& share_path, OpenShares& shares);

// What a file is by its extension alone.
enum FileType {
  kFileTypeDocument = 0,  // texts, source code, office, books, mail, archives; also a name without an extension
  kFileTypeAudio = 1,
  kFileTypeVideo = 2,
  kFileTypePhoto = 3,
  kFileTypeOther = 4  // an extension that is not known
};

// By the lower-cased extension of the last component.
QUARROX_API FileType GetFileTypeByFullPath(const std::string& full_path);

// The extensions of a type, in order.
QUARROX_API std::vector<std::string> ExtensionsOfFileType(FileType type);

}  // namespace quarrox::fileindex
