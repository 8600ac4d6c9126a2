// The folder list against the shares and the directories of the machine.
#include <string>

#include "common/file.h"
#include "common/sdk/share.h"
#include "common/strings.h"
#include "doctor.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_scope.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"
#include "refusal.h"

namespace quarrox::ctl::doctor {
namespace {

// Removes all that there is of a share: at `place`, its directory, which is empty where it has none, and at the place
// where it was before, which is known by what it left. Empty where there is neither.
std::string RemoveCommand(const std::string& name, const std::string& place, Machine& machine) {
  std::string at_place = place.empty() ? "" : ShareCommand("clear-paused", name, place);
  const auto stray = machine.strays().find(name);
  if (stray == machine.strays().end()) return at_place;
  const std::string command = ShareCommand("clear-paused", name, stray->second.share_path);
  return at_place.empty() ? command : at_place + " && " + command;
}

void ReportGone(const std::string& name, bool is_list_doubtful, Machine& machine, Findings& findings) {
  std::string command = RemoveCommand(name, "", machine);
  const bool is_untold = command.empty();
  if (is_untold) {
    command = ShareCommand("clear-paused", name, "PATH") + ", where PATH is the directory that it had";
  }
  findings.Wrong(
      "there are indexed folders in the share " + name +
          ", which is not configured; configure it again; where it was renamed, say so with 'fileindexctl "
          "share rename'; only where it is gone for good, remove its folders and its index",
      is_list_doubtful ? "mend the mistakes in shares.conf first; if it is gone all the same: " + command : command,
      is_list_doubtful || is_untold ? Remedy::kByHand : Remedy::kCommand);
}

// A share whose directory is not there, or not the disk that it was.
void ReportAway(const std::string& name, Findings& findings) {
  try {
    fileindex::IndexScope(name).Read();
  } catch (const Error& error) {
    const size_t split = error.reason.find("; ");
    findings.Wrong(error.reason.substr(0, split),
                   split == std::string::npos ? "put the share's directory back, or: " + ShareCommand("pause", name)
                                              : error.reason.substr(split + 2),
                   Remedy::kByHand);
  }
}

}  // namespace

// A problem reads "FILE:LINE: what; what to do".
void CheckConfiguration(Machine&, Findings& findings) {
  for (const std::string& problem : sdk::SDKShare::ConfigProblems()) {
    const size_t split = problem.rfind("; ");
    if (split == std::string::npos) {
      findings.Wrong(problem, "mend it there", Remedy::kByHand);
    } else {
      findings.Wrong(problem.substr(0, split), problem.substr(split + 2), Remedy::kByHand);
    }
  }
  findings.WellIfNothing("the shares are configured without mistakes");
}

void CheckShares(Machine& machine, Findings& findings) {
  const bool is_list_doubtful = !sdk::SDKShare::ConfigProblems().empty();  // a mistake may hide a share
  for (const auto& [name, folders] : machine.folders()) {
    if (name.empty()) continue;  // no share's; CheckFolders says so
    if (machine.share_names().count(name) == 0) {
      ReportGone(name, is_list_doubtful, machine, findings);
      continue;
    }
    const sdk::SDKShare& share = machine.Share(name);
    const bool misnamed = Basename(share.GetPath()) != name;
    if (!misnamed && machine.IsPaused(name)) continue;
    const Refusal refusal = RefusalOf(share);
    if (misnamed) {
      findings.Wrong("the share " + name + " has indexed folders and lies in a directory of another name, " +
                         share.GetPath() + "; give both the same name, or remove its folders and its index",
                     RemoveCommand(name, share.GetPath(), machine));
    } else if (refusal) {
      findings.Wrong(refusal.reason, refusal.remedy + ", or: " + ShareCommand("pause", name), Remedy::kByHand);
    } else {
      ReportAway(name, findings);
    }
  }
  findings.WellIfNothing("the shares of all indexed folders are there");
}

// Where a whole share is not there, its disk may be; that is said once, with the shares' configuration.
void CheckFolders(Machine& machine, Findings& findings) {
  if (const auto bad = machine.folders().find(""); bad != machine.folders().end()) {
    findings.Wrong("the path \"" + bad->second.front()->GetPath() + "\" of the folder list names no share",
                   std::string("take its record out of ") + fileindex::kFileIndexFoldersCfgPath, Remedy::kByHand);
  }
  for (const std::string& name : machine.served()) {
    for (const auto& folder : machine.folders().at(name)) {
      const std::string directory = fileindex::GetFullPath(folder->GetPath(), machine.shares());
      if (IsDirExist(directory, false)) continue;
      findings.Wrong("the indexed folder " + folder->GetPath() + " has no directory " + directory +
                         "; put it back, or index the folder no longer",
                     ShellLine({"fileindexctl", "folder", "delete", folder->GetPath()}));
    }
  }
  findings.WellIfNothing("the directories of all indexed folders are there");
}

void CheckFlags(Machine& machine, Findings& findings) {
  const fileindex::StatusMgr status;
  for (const std::string& name : machine.served()) {
    const int flags = status.GetShareStatus(name);
    if (flags == 0) continue;
    const bool rebuild = (flags & fileindex::kShareNeedRebuild) != 0;
    findings.Wrong("the index of the share " + name + " is marked as one to be " +
                       (rebuild ? "made anew" : "compared with the disk"),
                   ShellLine({"fileindexctl", "folder", "reindex", '/' + name}));
  }
  findings.WellIfNothing("no index is marked as incomplete");
}

}  // namespace quarrox::ctl::doctor
