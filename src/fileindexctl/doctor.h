// What the checks of `doctor` have in common: the machine as they all see it, and what they say of it.
//
// A check probes one thing by doing it, as far as that changes nothing. It says what is well in a sentence, and of each
// thing that is wrong what it is and what mends it: a command for the shell, which makes `doctor` content again, or
// where there is none what to do. A check that is added has its function here and its row in the table of doctor.cpp.
#pragma once

#include <sys/types.h>

#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/sdk/open_shares.h"
#include "daemon_exchange.h"
#include "fileindex/folder.h"
#include "output.h"

namespace quarrox::ctl::doctor {

// What a remedy is: a command for the shell, or what a person has to do.
enum class Remedy { kCommand, kByHand };

struct Finding {
  bool ok = true;
  std::string text = {};
  std::string remedy = {};  // empty where all is well
  Remedy kind = Remedy::kCommand;
};

class Findings {
 public:
  void Well(const std::string& text) { list_.push_back({true, text, ""}); }
  void Wrong(const std::string& text, const std::string& remedy, Remedy kind = Remedy::kCommand) {
    list_.push_back({false, text, remedy, kind});
  }

  // Says a text where nothing was found to be wrong.
  void WellIfNothing(const std::string& text);

  const std::vector<Finding>& list() const { return list_; }

 private:
  std::vector<Finding> list_;
};

// Starts a daemon again, or for the first time where `pid` is 0, by what the machine has for that.
std::string RestartCommand(const std::string& daemon, pid_t pid);

// Allows more inotify watches than now.
std::string RaiseWatchesCommand();

// One configuration of the notification daemon that was made for a share's queue.
struct MonitorConfig {
  std::string file = {};
  std::set<std::string> directories = {};
};

// What a share left that is not configured any more.
struct Stray {
  std::string share_path = {};  // the directory that it had
  std::string database = {};    // of its index; empty where there may be none
};

inline constexpr char kMonitorDirectory[] = "/var/lib/vexonotifyd";

// The machine, read once, each part when it is first asked for. A part that cannot be read throws an Error each time.
// Not thread-safe.
class Machine {
 public:
  using FolderList = std::vector<std::shared_ptr<fileindex::Folder>>;

  const std::set<std::string>& share_names();
  const sdk::SDKShare& Share(const std::string& name) { return shares_.Get(name); }
  sdk::OpenShares& shares() { return shares_; }

  // The folders of the list by the share that their path names, which need not exist. Those whose path names none are
  // under the empty name.
  const std::map<std::string, FolderList>& folders();

  // Whether a share is paused: all of its folders are, and none by itself.
  bool IsPaused(const std::string& share);

  // The shares in which folders are indexed, as far as they are there: configured, and with a directory of their name.
  const std::vector<std::string>& served();

  // One exchange with the search engine, as Exchange. One that did not answer once is not asked again.
  DaemonAnswer AskEngine(const Json::Value& request);

  // The configurations by the queue that they are for.
  const std::map<std::string, MonitorConfig>& monitors();

  // The files among them that are none, though their names say so.
  const std::vector<std::string>& damaged_monitors() { return (monitors(), damaged_monitors_); }

  // The processes of the daemons that run, by their names, as CheckDaemons finds them.
  std::map<std::string, pid_t> daemons = {};

  // The queues of all shares that are configured.
  const std::set<std::string>& queues();

  // What is beside the indexes of the shares that are configured, or watched for none of them, by the share's name.
  const std::map<std::string, Stray>& strays();

 private:
  bool IsServed(const std::string& share);
  void FindStraysBeside(const sdk::SDKShare& share);

  sdk::OpenShares shares_;
  std::optional<Error> engine_failure_;
  std::optional<std::set<std::string>> share_names_;
  std::optional<std::map<std::string, FolderList>> folders_;
  std::optional<std::vector<std::string>> served_;
  std::optional<std::map<std::string, MonitorConfig>> monitors_;
  std::vector<std::string> damaged_monitors_;
  std::optional<std::set<std::string>> queues_;
  std::optional<std::map<std::string, Stray>> strays_;
};

using Check = void(Machine& machine, Findings& findings);

Check CheckCaller;    // runs as root
Check CheckVersions;  // the programs
Check CheckDaemons;   // all three run and answer
Check CheckFiles;     // that are configurations and states: can be understood
Check CheckLimits;    // of files that the daemons may have open
Check CheckWatches;   // how the notification daemon hears folders
Check CheckSockets;   // modes and owners, as the following two
Check CheckRights;
Check CheckLocks;
Check CheckInotify;
Check CheckFanotify;
Check CheckContents;  // of files can be read, and safely
Check CheckRoom;
Check CheckConfiguration;  // of the shares
Check CheckShares;         // that folders lie in
Check CheckFolders;        // have their directories
Check CheckIndexes;        // the engine has what the list says
Check CheckMonitors;       // the notification daemon watches what the list says
Check CheckFlags;          // of shares that are to be indexed again
Check CheckLeftovers;      // what nobody's folders need

}  // namespace quarrox::ctl::doctor
