// Whether the files that say what is indexed can be understood. Without them most of the other checks cannot be made.
#include <functional>
#include <set>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/file.h"
#include "common/json.h"
#include "common/sdk/share.h"
#include "doctor.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/folder_pauses.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"
#include "output.h"

namespace quarrox::ctl::doctor {
namespace {

std::string SetAside(const std::string& file) {
  return ShellLine({"mv", "--backup=numbered", file, file + ".damaged"});
}

// The folders that were indexed, and the shares of which none is watched: these were paused, or their index is left
// over.
struct Indexed {
  std::set<std::string> folders = {};
  std::set<std::string> watched = {};
  std::set<std::string> unwatched = {};
};

// By what the notification daemon is told to watch, and by the indexes that are there.
Indexed FindIndexed(Machine& machine) {
  Indexed indexed;
  for (const auto& [queue, config] : machine.monitors()) {
    for (const std::string& directory : config.directories) {
      try {
        std::string share;
        std::string share_dir;
        fileindex::GetShareNamePathByFullPath(share, share_dir, directory);
        indexed.folders.insert('/' + share + directory.substr(share_dir.size()));
        indexed.watched.insert(share);
      } catch (const Error&) {
        continue;  // a share that is gone
      }
    }
  }
  try {
    for (const std::string& share : sdk::SDKShare::Enum()) {
      if (!indexed.watched.contains(share) && IsDirExist(sdk::SDKShare(share).GetDBPath(), true)) {
        indexed.unwatched.insert(share);
      }
    }
  } catch (const Error&) {
    indexed.unwatched.clear();  // the shares cannot be told either
  }
  return indexed;
}

// Sets the list aside and adds the folders again; a share that nothing watches is paused, so that its index stays.
std::string MakeListAnew(Machine& machine) {
  const Indexed indexed = FindIndexed(machine);
  std::vector<std::string> add = {"fileindexctl", "folder", "add"};
  const size_t none = add.size();
  add.insert(add.end(), indexed.folders.begin(), indexed.folders.end());
  for (const std::string& share : indexed.unwatched) add.push_back('/' + share);
  std::string line = SetAside(fileindex::kFileIndexFoldersCfgPath);
  if (add.size() > none) line += " && " + ShellLine(add);
  for (const std::string& share : indexed.unwatched) line += " && " + ShareCommand("pause", share, "");
  return line;
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
