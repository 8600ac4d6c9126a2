// Whether the files that say what is indexed can be understood. Without them most of the other checks cannot be made.
#include <functional>
#include <set>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/file.h"
#include "common/json.h"
#include "doctor.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/folder_pauses.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"

namespace quarrox::ctl::doctor {
namespace {

std::string SetAside(const std::string& file) {
  return ShellLine({"mv", file, file + ".damaged"});
}

// The folders that were indexed, by what the notification daemon is told to watch.
std::set<std::string> WatchedFolders(Machine& machine) {
  std::set<std::string> folders;
  for (const auto& [queue, config] : machine.monitors()) {
    for (const std::string& directory : config.directories) {
      std::string share;
      std::string share_dir;
      fileindex::GetShareNamePathByFullPath(share, share_dir, directory);
      folders.insert('/' + share + directory.substr(share_dir.size()));
    }
  }
  return folders;
}

// Sets the list aside and adds the folders again.
std::string MakeListAnew(Machine& machine) {
  std::vector<std::string> add = {"fileindexctl", "folder", "add"};
  try {
    for (const std::string& folder : WatchedFolders(machine)) add.push_back(folder);
  } catch (const Error&) {
    add.resize(3);  // the shares cannot be told either
  }
  const std::string aside = SetAside(fileindex::kFileIndexFoldersCfgPath);
  return add.size() == 3 ? aside : aside + " && " + ShellLine(add);
}

bool Reads(const std::function<void()>& read, std::string& why) {
  try {
    read();
    return true;
  } catch (const Error& error) {
    why = error.reason;
    return false;
  }
}

}  // namespace

void CheckFiles(Machine& machine, Findings& findings) {
  std::string why;
  if (!Reads([] { fileindex::FolderMgr(); }, why)) {
    findings.Wrong("the list of indexed folders cannot be read: " + why +
                       "; it has to be made anew, with the types 'fileindexctl folder set' gives them",
                   MakeListAnew(machine));
  }
  if (!Reads([] { fileindex::StatusMgr().GetPauseInfo(); }, why)) {
    findings.Wrong("the state of indexing cannot be read: " + why + "; without it nothing counts as paused",
                   SetAside(fileindex::kFileIndexStatusCfgPath));
  }
  const std::string pauses = fileindex::kFolderPausesPath;
  Json::Value data;
  if (IsFileExist(pauses) && (!fromFile(data, pauses) || !data.isObject())) {
    findings.Wrong(pauses + " cannot be read, so folders that are paused until a time stay so", SetAside(pauses));
  }
  findings.WellIfNothing("what they say of folders, pauses and indexes is understood");
}

}  // namespace quarrox::ctl::doctor
