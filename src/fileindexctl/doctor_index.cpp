// The folder list against the search engine and the notification daemon.
#include <set>
#include <string>

#include "common/comm.h"
#include "common/file.h"
#include "common/json.h"
#include "common/sdk/share.h"
#include "common/strings.h"
#include "doctor.h"
#include "fileindex/util.h"

namespace quarrox::ctl::doctor {
namespace {

// What the engine says of a share's index: 0 where it serves it, or one of its error codes.
struct IndexState {
  int code = 0;
  std::string reason = {};
};

IndexState AskIndex(Machine& machine, const sdk::SDKShare& share) {
  Json::Value request;
  request["command"] = "document_get_by_query";
  request["data"]["id"] = share.GetDBName();
  Json::Value& query = request["data"]["query"];
  query["qsl"]["term"]["VEXOMDPath"] = share.GetPath();
  query["from"] = 0;
  query["size"] = 0;
  const DaemonAnswer answer = machine.AskEngine(request);
  IndexState state;
  if (answer.object["success"].asBool()) return state;
  GetJsonValue(state.code, answer.object["error"], "code", true);
  GetJsonValue(state.reason, answer.object["error"], "msg", false);
  return state;
}

// A new index for a share, which is paused again where the list says so.
std::string RebuildCommand(const std::string& share, bool paused) {
  const std::string rebuild = ShareCommand("rebuild", share);
  return paused ? rebuild + " && " + ShareCommand("pause", share) : rebuild;
}

void CheckIndex(const std::string& name, Machine& machine, Findings& findings) {
  const sdk::SDKShare& share = machine.Share(name);
  const bool paused = machine.IsPaused(name);
  const IndexState state = AskIndex(machine, share);
  const std::string begin = "the share " + name + " has indexed folders, but ";
  if (state.code == kElasticdNoSuchIndex) {
    findings.Wrong(begin + "the engine has no index of it", RebuildCommand(name, paused));
  } else if (!IsDirExist(share.GetDBPath(), false)) {
    findings.Wrong(begin + "its index is not at " + share.GetDBPath(), RebuildCommand(name, paused));
  } else if (state.code == kElasticdIndexPaused && !paused) {
    findings.Wrong(begin + "its index is paused and its folders are not", ShareCommand("resume", name));
  } else if (state.code == 0 && paused) {
    findings.Wrong("the folders of the share " + name + " are paused, but its index is not",
                   ShareCommand("pause", name));
  } else if (state.code == kElasticdIndexOpening || state.code == kElasticdIndexRecovering) {
    findings.Well("the index of the share " + name + " is about to be served: " + state.reason);
  } else if (IsElasticdBusy(state.code)) {
    findings.Wrong("vexoelasticd has too much to do: " + state.reason, "wait, then run: fileindexctl doctor",
                   Remedy::kByHand);
  } else if (state.code != 0 && state.code != kElasticdIndexPaused) {
    findings.Wrong(begin + "the engine cannot serve its index: " + state.reason, RebuildCommand(name, paused));
  }
}

const MonitorConfig* FindMonitor(Machine& machine, const std::string& queue) {
  const auto found = machine.monitors().find(queue);
  return found == machine.monitors().end() ? nullptr : &found->second;
}

void CheckMonitor(const std::string& name, Machine& machine, Findings& findings) {
  const MonitorConfig* config = FindMonitor(machine, machine.Share(name).GetQueuePath());
  if (machine.IsPaused(name)) {
    if (config == nullptr) return;
    return findings.Wrong("the share " + name + " is paused, but " + config->file + " has it watched",
                          ShareCommand("pause", name));
  }
  std::set<std::string> wanted;
  for (const auto& folder : machine.folders().at(name)) {
    wanted.insert(fileindex::GetFullPath(folder->GetPath(), machine.shares()));
  }
  if (config == nullptr) {
    findings.Wrong(
        std::string("nothing in ") + kMonitorDirectory + " has the folders of the share " + name + " watched",
        ShareCommand("resume", name));
  } else if (config->directories != wanted) {
    findings.Wrong(config->file + " has other folders of the share " + name + " watched than the list has",
                   ShareCommand("resume", name));
  }
}

// A share in which no folder is indexed is to have nothing of an index. To delete the folder that would be its whole
// directory removes all of that.
void CheckUnused(const std::string& name, Machine& machine, Findings& findings) {
  const sdk::SDKShare& share = machine.Share(name);
  const MonitorConfig* config = FindMonitor(machine, share.GetQueuePath());
  std::string found;
  if (IsDirExist(share.GetDBPath(), false)) found = "a database at " + share.GetDBPath();
  if (config != nullptr) found += (found.empty() ? "" : " and ") + ("a configuration to watch it, " + config->file);
  if (found.empty() && AskIndex(machine, share).code != kElasticdNoSuchIndex) found = "an index in the engine";
  if (found.empty()) return;
  findings.Wrong("no folder of the share " + name + " is indexed, but there is still " + found,
                 ShellLine({"fileindexctl", "folder", "delete", '/' + name}));
}

}  // namespace

void CheckIndexes(Machine& machine, Findings& findings) {
  for (const std::string& name : machine.served()) CheckIndex(name, machine, findings);
  findings.WellIfNothing("the engine has the index of each share with indexed folders");
}

void CheckMonitors(Machine& machine, Findings& findings) {
  for (const std::string& file : machine.damaged_monitors()) {
    findings.Wrong(file + " is damaged, so it has nothing watched", ShellLine({"rm", file}));
  }
  for (const std::string& name : machine.served()) CheckMonitor(name, machine, findings);
  findings.WellIfNothing("what is to be watched is what the folder list says");
}

// What shares left in which folders are indexed is said with these.
void CheckLeftovers(Machine& machine, Findings& findings) {
  for (const std::string& name : machine.share_names()) {
    if (machine.folders().count(name) == 0) CheckUnused(name, machine, findings);
  }
  for (const auto& [name, stray] : machine.strays()) {
    if (machine.folders().count(name) != 0 || !IsDirExist(stray.database, false)) continue;
    findings.Wrong("there is a database of no share, " + stray.database,
                   ShareCommand("clear-paused", name, stray.share_path));
  }
  for (const auto& [queue, config] : machine.monitors()) {
    if (machine.queues().count(queue) != 0 || machine.folders().count(Basename(Dirname(queue))) != 0) continue;
    findings.Wrong(config.file + " has folders watched for the queue of no share, " + queue,
                   ShellLine({"rm", config.file}));
  }
  findings.WellIfNothing("nothing is left of what is indexed no longer");
}

}  // namespace quarrox::ctl::doctor
