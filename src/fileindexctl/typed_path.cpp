#include "typed_path.h"

#include "command.h"
#include "common/error.h"
#include "common/file.h"
#include "common/sdk/share.h"
#include "common/strings.h"
#include "fileindex/util.h"

namespace quarrox::ctl {
namespace {

std::string Absolute(const std::string& typed) {
  if (typed.empty()) throw UsageError("PATH is empty");
  std::string path = typed.front() == '/' ? typed : RealPath(typed);
  if (path.empty()) throw UsageError("there is no '" + typed + "' here; a share path begins with \"/\"");
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  return path;
}

}  // namespace

std::string AsSharePath(const std::string& typed, const std::set<std::string>& shares) {
  std::string path = Absolute(typed);
  if (shares.count(fileindex::GetShareNameByPath(path)) != 0) return path;
  try {
    std::string share;
    std::string share_dir;
    fileindex::GetShareNamePathByFullPath(share, share_dir, path);
    return "/" + share + path.substr(share_dir.size());
  } catch (const Error&) {
    return path;
  }
}

std::string FolderPath(const fileindex::FolderMgr& folder_mgr, const std::string& typed) {
  if (folder_mgr.HasFolder(typed)) return typed;  // also in a share that is gone
  std::string path = AsSharePath(typed, sdk::SDKShare::Enum());
  if (folder_mgr.HasFolder(path)) return path;
  std::string above = Dirname(path);
  while (!above.empty() && !folder_mgr.HasFolder(above)) above = Dirname(above);
  throw Error(kErrNoSuchFolder, above.empty() ? path : path + "; it is governed by the folder " + above);
}

}  // namespace quarrox::ctl
