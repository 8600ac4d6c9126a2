// Who owns what, and who else may do what with it.
#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <set>
#include <string>
#include <vector>

#include "common/comm.h"
#include "common/sdk/share.h"
#include "common/search_socket.h"
#include "common/strings.h"
#include "doctor.h"
#include "fileindex/communication.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/folder_pauses.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"

namespace quarrox::ctl::doctor {
namespace {

constexpr char kEngineDirectory[] = "/var/lib/vexoelasticd";

constexpr char kService[] = "Quarrox";  // its user and its group

struct Rule {
  std::string path = {};
  mode_t required = 0;    // bits of the mode
  mode_t forbidden = 0;   // likewise
  const char* mode = "";  // what it is set to where either is not so
  bool may_be_service_s = false;
};

std::string Octal(mode_t mode) {
  char text[8];
  snprintf(text, sizeof(text), "%04o", mode & 07777);
  return text;
}

// False where nothing is there; what else keeps it from being looked at is wrong.
bool LookAt(const std::string& path, struct stat& info, Findings& findings) {
  if (lstat(path.c_str(), &info) == 0) return true;
  const int error = errno;
  if (error != ENOENT && error != ENOTDIR) {
    findings.Wrong(path + " cannot be looked at: " + strerror(error), "sudo fileindexctl doctor");
  }
  return false;
}

bool IsServiceUser(uid_t user) {
  const passwd* service = getpwnam(kService);
  return service != nullptr && service->pw_uid == user;
}

// Returns whether there is something at the path.
bool CheckRule(const Rule& rule, Findings& findings) {
  struct stat info;
  if (!LookAt(rule.path, info, findings)) return false;
  if ((info.st_mode & rule.required) != rule.required || (info.st_mode & rule.forbidden) != 0) {
    findings.Wrong(rule.path + " has the mode " + Octal(info.st_mode) + " instead of " + rule.mode,
                   ShellLine({"chmod", rule.mode, rule.path}));
  }
  if (info.st_uid != 0 && !(rule.may_be_service_s && IsServiceUser(info.st_uid))) {
    findings.Wrong(rule.path + " belongs to the user with the number " + std::to_string(info.st_uid),
                   ShellLine({"chown", "root", rule.path}));
  }
  return true;
}

void CheckGroup(const std::string& path, Findings& findings) {
  const group* service = getgrnam(kService);
  struct stat info;
  if (service == nullptr || stat(path.c_str(), &info) != 0 || info.st_gid == service->gr_gid) return;
  findings.Wrong(path + " belongs to another group than " + kService + ", whose members are to reach it",
                 ShellLine({"chgrp", kService, path}));
}

// It is root's, or the service's as the directory is.
void CheckQueue(const std::string& path, Findings& findings) {
  struct stat info;
  if (lstat(path.c_str(), &info) != 0) return;
  if (S_ISREG(info.st_mode)) {
    CheckRule({path, 0600, 0077, "0600", true}, findings);
  } else {
    findings.Wrong("the queue " + path + " is no file, so no change is taken",
                   ShellLine({"mv", path, path + ".set-aside"}));
  }
}

}  // namespace

void CheckSockets(Machine& machine, Findings& findings) {
  for (const char* path : {fileindex::kDaemonSocketPath, kElasticdSocketPath}) {
    if (CheckRule({path, 0660, 0117, "0660"}, findings)) CheckGroup(path, findings);
  }
  const auto engine = machine.daemons.find("vexoelasticd");
  if (!CheckRule({kSearchSocketPath, 0666, 0111, "0666"}, findings) && engine != machine.daemons.end()) {
    findings.Wrong(std::string(kSearchSocketPath) + " is missing, so ordinary users cannot search",
                   RestartCommand(engine->first, engine->second));
  }
  findings.WellIfNothing("everybody may search, and only root and the service reach the daemons otherwise");
}

// Who writes a configuration tells root's daemons what to do; an index and a queue hold everybody's text and names.
void CheckRights(Machine& machine, Findings& findings) {
  std::vector<Rule> rules = {{Dirname(fileindex::kFileIndexFoldersCfgPath), 0755, 0022, "0755"},
                             {fileindex::kFileIndexFoldersCfgPath, 0644, 0022, "0644"},
                             {fileindex::kFileIndexStatusCfgPath, 0644, 0022, "0644"},
                             {fileindex::kFolderPausesPath, 0644, 0022, "0644"},
                             {kEngineDirectory, 0700, 0077, "0700"},
                             {kMonitorDirectory, 0700, 0022, "0755"}};
  for (const Rule& rule : rules) CheckRule(rule, findings);
  for (const std::string& name : machine.served()) {
    const sdk::SDKShare& share = machine.Share(name);
    std::set<std::string> directories = {share.GetDBPath(), Dirname(share.GetDBPath()), Dirname(share.GetQueuePath())};
    for (const std::string& directory : directories) CheckRule({directory, 0700, 0077, "0700", true}, findings);
    for (const char* suffix : {"", ".tmp"}) CheckQueue(share.GetQueuePath() + suffix, findings);
  }
  findings.WellIfNothing("configurations, indexes and queues are in the right hands");
}

// Everybody may make a file in /tmp: whoever owns a lock file can keep the lock for ever, and where
// fs.protected_regular is set the kernel refuses to make it anew even to root.
void CheckLocks(Machine&, Findings& findings) {
  for (const char* path : {fileindex::kFolderLockPath, fileindex::kStatusLockPath}) {
    struct stat info;
    if (!LookAt(path, info, findings)) continue;
    const std::string remedy = ShellLine({"rm", "-r", path});
    if (!S_ISREG(info.st_mode)) {
      findings.Wrong(std::string("the lock ") + path + " is no file", remedy);
    } else if (info.st_uid != 0) {
      findings.Wrong(std::string("the lock file ") + path + " belongs to the user with the number " +
                         std::to_string(info.st_uid) + ", who can keep it locked; root is to own it",
                     remedy);
    }
  }
  findings.WellIfNothing("the lock files are root's, or not made yet");
}

}  // namespace quarrox::ctl::doctor
