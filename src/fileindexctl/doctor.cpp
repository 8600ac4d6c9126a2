#include "doctor.h"

#include <unistd.h>

#include <algorithm>
#include <iostream>

#include "command.h"
#include "common/error.h"
#include "common/json.h"
#include "output.h"

namespace quarrox::ctl {
namespace doctor {
namespace {

struct Row {
  const char* name;
  Check* check;
};

// In the order in which remedies are to be followed: what a remedy takes for granted stands before it.
constexpr Row kChecks[] = {
    {"caller", CheckCaller},
    {"versions", CheckVersions},
    {"files", CheckFiles},
    {"daemons", CheckDaemons},
    {"limits", CheckLimits},
    {"sockets", CheckSockets},
    {"rights", CheckRights},
    {"locks", CheckLocks},
    {"inotify", CheckInotify},
    {"fanotify", CheckFanotify},
    {"contents", CheckContents},
    {"room", CheckRoom},
    {"shares.conf", CheckConfiguration},
    {"shares", CheckShares},
    {"folders", CheckFolders},
    {"index", CheckIndexes},
    {"monitor", CheckMonitors},
    {"watches", CheckWatches},
    {"flags", CheckFlags},
    {"leftovers", CheckLeftovers},
};

// What keeps a check from its end may keep others from theirs: that is said once, as it is where it was found. `said`
// is all that was found to be wrong before.
Findings Run(const Row& row, Machine& machine, const std::string& said) {
  Findings findings;
  try {
    row.check(machine, findings);
  } catch (const Error& error) {
    if (said.find(error.reason) == std::string::npos) {
      findings.Wrong("not checked to the end, nor is what needs the same: error " + std::to_string(error.code) + ": " +
                         error.reason,
                     "mend that, then run: fileindexctl doctor", Remedy::kByHand);
    }
  }
  return findings;
}

void PrintJson(const char* check, const Finding& finding) {
  Json::Value object;
  object["check"] = check;
  object["ok"] = finding.ok;
  object["finding"] = finding.text;
  object["remedy"] = finding.remedy;
  object["runnable"] = !finding.ok && finding.kind == Remedy::kCommand;
  std::cout << toString(object) << '\n';
}

void PrintText(const char* check, const Finding& finding) {
  constexpr size_t kWidth = 13;
  std::string name = check;
  name.resize(std::max(kWidth, name.size()), ' ');
  std::cout << (finding.ok ? "ok     " : "WRONG  ") << name << Visible(finding.text) << '\n';
  if (!finding.ok) std::cout << std::string(kWidth, ' ') << "remedy " << Visible(finding.remedy) << '\n';
}

}  // namespace

void Findings::WellIfNothing(const std::string& text) {
  if (list_.empty()) Well(text);
}

void CheckCaller(Machine&, Findings& findings) {
  if (geteuid() == 0) return findings.Well("run by root, who may look at everything");
  findings.Wrong("not run by root: what only root may look at or talk to is told wrong below",
                 "sudo fileindexctl doctor");
}

}  // namespace doctor

int Doctor(const Arguments& arguments) {
  doctor::Machine machine;
  std::string said;
  size_t wrong = 0;
  for (const doctor::Row& row : doctor::kChecks) {
    const doctor::Findings findings = doctor::Run(row, machine, said);
    for (const doctor::Finding& finding : findings.list()) {
      arguments.Has("--json") ? doctor::PrintJson(row.name, finding) : doctor::PrintText(row.name, finding);
      if (finding.ok) continue;
      ++wrong;
      said += finding.text + '\n';
    }
    std::cout.flush();
  }
  if (!arguments.Has("--json")) {
    std::cout << (wrong == 0 ? "all is well" : std::to_string(wrong) + " to be mended, from the top") << '\n';
  }
  return wrong == 0 ? kDone : kFailed;
}

}  // namespace quarrox::ctl
