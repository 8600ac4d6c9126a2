#include "vexo/service.h"

#include <syslog.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdint>
#include <cstring>
#include <iterator>
#include <memory>
#include <string>

#include <systemd/sd-bus.h>
#include <systemd/sd-daemon.h>

#include "linux/failure.h"
#include "linux/platform_conf.h"

namespace {

using std::chrono::steady_clock;

constexpr char kManager[] = "org.freedesktop.systemd1";
constexpr char kManagerPath[] = "/org/freedesktop/systemd1";
constexpr char kManagerInterface[] = "org.freedesktop.systemd1.Manager";

// How long a start that is waited for may take.
constexpr std::chrono::seconds kLongestJob(30);

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

// One of the manager's methods that make a job of a unit, and the word for its outcome.
struct Verb {
  const char* method;
  const char* done;
};

constexpr Verb kStart = {"StartUnit", "started"};
constexpr Verb kStop = {"StopUnit", "stopped"};
constexpr Verb kRestart = {"RestartUnit", "restarted"};

struct BusCloser {
  void operator()(sd_bus* bus) const { sd_bus_flush_close_unref(bus); }
};
struct MessageReleaser {
  void operator()(sd_bus_message* message) const { sd_bus_message_unref(message); }
};
using Bus = std::unique_ptr<sd_bus, BusCloser>;
using Message = std::unique_ptr<sd_bus_message, MessageReleaser>;

struct Job {
  std::string path;
  std::string result;  // empty while it runs; "done" where it did what was asked
};

int OnJobRemoved(sd_bus_message* message, void* data, sd_bus_error*) {
  auto* job = static_cast<Job*>(data);
  uint32_t id = 0;
  const char* path = nullptr;
  const char* unit = nullptr;
  const char* result = nullptr;
  if (sd_bus_message_read(message, "uoss", &id, &path, &unit, &result) < 0) return 0;
  if (job->path == path) job->result = result;
  return 0;
}

// Returns like sd-bus, a negative errno on failure.
int AwaitJob(sd_bus* bus, const Job& job) {
  const auto deadline = steady_clock::now() + kLongestJob;
  while (job.result.empty()) {
    const int processed = sd_bus_process(bus, nullptr);
    if (processed < 0) return processed;
    if (processed > 0) continue;
    const auto left = std::chrono::duration_cast<std::chrono::microseconds>(deadline - steady_clock::now()).count();
    if (left <= 0) return -ETIMEDOUT;
    const int waited = sd_bus_wait(bus, static_cast<uint64_t>(left));
    if (waited < 0 && waited != -EINTR) return waited;
  }
  return job.result == "done" ? 0 : -ECANCELED;
}

int StartJob(sd_bus* bus, const char* unit, const Verb& verb, Job* job, std::string* why) {
  sd_bus_error error = {};
  sd_bus_message* answer = nullptr;
  int result = sd_bus_call_method(bus, kManager, kManagerPath, kManagerInterface, verb.method, &error, &answer, "ss",
                                  unit, "replace");
  const Message owned(answer);
  if (result < 0 && error.message != nullptr) *why = error.message;
  sd_bus_error_free(&error);
  const char* path = nullptr;
  if (result >= 0) result = sd_bus_message_read(answer, "o", &path);
  if (result >= 0) job->path = path;
  return result;
}

int RunJob(const char* unit, const Verb& verb, bool wait, std::string* why) {
  sd_bus* opened = nullptr;
  int result = sd_bus_open_system(&opened);
  if (result < 0) return result;
  const Bus bus(opened);
  Job job;
  if (wait) {
    // Before the request, so that no job ends unheard. Without subscribers the manager tells nobody.
    result = sd_bus_match_signal(opened, nullptr, kManager, kManagerPath, kManagerInterface, "JobRemoved", OnJobRemoved,
                                 &job);
    if (result < 0) return result;
    sd_bus_call_method(opened, kManager, kManagerPath, kManagerInterface, "Subscribe", nullptr, nullptr, "");
  }
  result = StartJob(opened, unit, verb, &job, why);
  if (result < 0 || !wait) return result;
  result = AwaitJob(opened, job);
  if (!job.result.empty()) *why = "its job ended with \"" + job.result + "\"";
  return result;
}

int Request(const char* name, const Verb& verb, bool wait) {
  const auto* service = std::find_if(std::begin(kServices), std::end(kServices),
                                     [name](const Service& known) { return strcmp(known.name, name) == 0; });
  if (service == std::end(kServices)) return VEXO_FAILURE(VEXO_ERR_BAD_PARAMETER);
  if (service->unit == nullptr) return 0;
  if (service->allowed != nullptr && !service->allowed()) return 0;
  if (sd_booted() <= 0) {
    syslog(LOG_WARNING, "no service manager runs on this machine: %s (%s) was not %s", name, service->unit, verb.done);
    return VEXO_FAILURE(VEXO_ERR_SERVICE);
  }
  std::string why;
  const int result = RunJob(service->unit, verb, wait, &why);
  if (result >= 0) return 0;
  if (why.empty()) why = strerror(-result);
  syslog(LOG_WARNING, "%s (%s) was not %s: %s", name, service->unit, verb.done, why.c_str());
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
