#include "vexo/service.h"

#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <iterator>

#include "linux/failure.h"
#include "linux/platform_conf.h"
#include "vexo/exec.h"

namespace {

// There while systemd is the service manager.
constexpr char kManagerDirectory[] = "/run/systemd/system/";

constexpr char kTimeout[] = "/usr/bin/timeout";
constexpr char kSystemctl[] = "/usr/bin/systemctl";

// How long a request may take, and a start that is waited for, in seconds.
constexpr char kLongestJob[] = "30";

// What systemctl says of a refusal goes to standard error: a person's terminal, or a daemon's journal.
constexpr int kExecFlags = VLIBC_EXEC_NO_STDIN | VLIBC_EXEC_NO_STDOUT | VLIBC_EXEC_CLOSE_FDS | VLIBC_EXEC_RESET_SIGNALS;

struct Service {
  const char* name;
  const char* unit;   // null where there is nothing to run
  bool (*allowed)();  // null where the unit is our own
};

bool MayManageSamba() {
  return platform::ReadPlatformConf().manage_samba;
}

constexpr Service kServices[] = {
    {"samba", "smbd.service", MayManageSamba},
    {"pkg-Quarrox-fileindexd", "fileindexd.service", nullptr},
    {"vexocontentextractd", nullptr, nullptr},
};

// One of systemctl's commands, and the word for its outcome.
struct Verb {
  const char* command;
  const char* done;
};

constexpr Verb kStart = {"start", "started"};
constexpr Verb kStop = {"stop", "stopped"};
constexpr Verb kRestart = {"restart", "restarted"};

// Not through the manager's library: with what it needs in turn it would be loaded by every command, and hardly any
// asks for a service.
int RunSystemctl(const char* unit, const Verb& verb, bool wait) {
  return VLIBCExecl(kTimeout, kExecFlags, kLongestJob, kSystemctl, "--no-ask-password", verb.command, unit,
                    wait ? nullptr : "--no-block", nullptr);
}

int Request(const char* name, const Verb& verb, bool wait) {
  const auto* service = std::find_if(std::begin(kServices), std::end(kServices),
                                     [name](const Service& known) { return strcmp(known.name, name) == 0; });
  if (service == std::end(kServices)) return VEXO_FAILURE(VEXO_ERR_BAD_PARAMETER);
  if (service->unit == nullptr) return 0;
  if (service->allowed != nullptr && !service->allowed()) return 0;
  if (access(kManagerDirectory, F_OK) != 0) {
    syslog(LOG_WARNING, "no service manager runs on this machine: %s (%s) was not %s", name, service->unit, verb.done);
    return VEXO_FAILURE(VEXO_ERR_SERVICE);
  }
  const int status = RunSystemctl(service->unit, verb, wait);
  if (status == 0) return 0;
  syslog(LOG_WARNING, "%s (%s) was not %s: %s ended with %d", name, service->unit, verb.done, kSystemctl, status);
  return VEXO_FAILURE(VEXO_ERR_SERVICE);
}

int RequestJob(const char* name, const Verb& verb, int kind) {
  return kind == VLIB_SERVICECTL_UPSTART ? Request(name, verb, false) : VEXO_FAILURE(VEXO_ERR_BAD_PARAMETER);
}

}  // namespace

int VLIBServiceRestart(const char* name) {
  return Request(name, kRestart, false);
}

int VLIBServiceStart(const char* name, int wait) {
  return Request(name, kStart, wait != FALSE);
}

int VLIBServicectlStart(const char* name, int kind) {
  return RequestJob(name, kStart, kind);
}

int VLIBServicectlStop(const char* name, int kind) {
  return RequestJob(name, kStop, kind);
}
