// What the kernel and the disks allow.
#include <fcntl.h>
#include <sys/fanotify.h>
#include <sys/inotify.h>
#include <sys/resource.h>
#include <sys/statvfs.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <map>
#include <string>
#include <system_error>

#include "common/sdk/share.h"
#include "common/strings.h"
#include "common/unique_fd.h"
#include "doctor.h"
#include "output.h"

namespace fs = std::filesystem;

namespace quarrox::ctl::doctor {
namespace {

// The instances that the daemons use beside one for each share, and those of other programs.
constexpr uint64_t kSpareInstances = 32;

// One watch a directory: what serves a large file server where fanotify does not.
constexpr uint64_t kManyWatches = 524288;

// What Linux gives by itself; an index takes ten and each of its clients one.
constexpr rlim_t kEnoughFiles = 1024;

uint64_t ReadLimit(const char* name) {
  uint64_t limit = 0;
  std::ifstream(std::string("/proc/sys/fs/inotify/") + name) >> limit;
  return limit;
}

std::string SetLimit(const std::string& name, uint64_t limit) {
  return ShellLine({"sysctl", "-w", "fs.inotify." + name + '=' + std::to_string(limit)});
}

// Empty where changes below a directory can be heard with fanotify, as the notification daemon hears them.
std::string WhyNoFanotify(const std::string& directory) {
  const UniqueFd fd(fanotify_init(FAN_CLASS_NOTIF | FAN_REPORT_DFID_NAME | FAN_CLOEXEC, O_RDONLY));
  if (!fd) return std::string("fanotify_init: ") + strerror(errno);
  const uint64_t mask = FAN_CREATE | FAN_RENAME | FAN_ONDIR;
  const bool marked =
      fanotify_mark(fd.get(), FAN_MARK_ADD | FAN_MARK_FILESYSTEM, mask, AT_FDCWD, directory.c_str()) == 0;
  return marked ? "" : std::string("fanotify_mark: ") + strerror(errno);
}

uint64_t SizeOf(const std::string& directory) {
  uint64_t size = 0;
  std::error_code error;
  for (fs::recursive_directory_iterator file(directory, error), end; !error && file != end; file.increment(error)) {
    std::error_code gone;
    const uint64_t bytes = file->is_regular_file(gone) ? file->file_size(gone) : 0;
    if (!gone) size += bytes;
  }
  return size;
}

using Volume = std::map<std::string, uint64_t>;  // the bytes of the shares' indexes

void ReportNoRoom(const std::string& share, const std::string& volume, Findings& findings) {
  findings.Wrong("the index of the share " + share + " has less than 100 MiB left on " + volume,
                 "make room there, or raise the quota that leaves none", Remedy::kByHand);
}

std::string Describe(const std::string& path, const Volume& volume) {
  struct statvfs info;
  const bool known = statvfs((path + '/').c_str(), &info) == 0;
  std::string text =
      path + ": " + (known ? SizeText(uint64_t{info.f_bavail} * info.f_frsize) : "an unknown size") + " free; indexes:";
  for (const auto& [share, bytes] : volume) {
    text += (share == volume.begin()->first ? " " : ", ") + share + " " + SizeText(bytes);
  }
  return text;
}

void ReportWithoutFanotify(const std::string& share, const std::string& why, Findings& findings) {
  const uint64_t watches = ReadLimit("max_user_watches");
  const std::string text = "the share " + share + " takes an inotify watch for each directory, of which " +
                           std::to_string(watches) + " are allowed (" + why + ")";
  if (watches >= kManyWatches) return findings.Well(text);
  findings.Wrong(text, SetLimit("max_user_watches", 2 * kManyWatches));
}

}  // namespace

std::string RaiseWatchesCommand() {
  return SetLimit("max_user_watches", std::max(2 * ReadLimit("max_user_watches"), kManyWatches));
}

void CheckInotify(Machine& machine, Findings& findings) {
  const uint64_t limit = ReadLimit("max_user_instances");
  const uint64_t needed = machine.served().size() + kSpareInstances;
  const UniqueFd fd(inotify_init1(IN_CLOEXEC));
  const char* reason = !fd || inotify_add_watch(fd.get(), "/", IN_DELETE_SELF) < 0 ? strerror(errno) : nullptr;
  if (limit < needed || !fd) {
    findings.Wrong(std::to_string(limit) + " inotify instances are allowed, and " + std::to_string(needed) +
                       " may be needed" + (fd ? "" : std::string("; none is left now: ") + reason),
                   SetLimit("max_user_instances", std::max(2 * limit, 2 * needed)));
  } else if (reason != nullptr) {
    findings.Wrong(std::string("no inotify watch is left: ") + reason, RaiseWatchesCommand());
  }
  findings.WellIfNothing(std::to_string(limit) + " instances and " + std::to_string(ReadLimit("max_user_watches")) +
                         " watches are allowed");
}

void CheckLimits(Machine& machine, Findings& findings) {
  for (const auto& [name, pid] : machine.daemons) {
    rlimit limit = {};
    if (prlimit(pid, RLIMIT_NOFILE, nullptr, &limit) != 0 || limit.rlim_cur >= kEnoughFiles) continue;
    const std::string raise =
        ShellLine({"prlimit", "--pid", std::to_string(pid), "--nofile=" + std::to_string(kEnoughFiles) + ':'});
    findings.Wrong(name + " may have no more than " + std::to_string(limit.rlim_cur) + " files open, which is little",
                   limit.rlim_max < kEnoughFiles ? RestartCommand(name, pid) : raise);
  }
  findings.WellIfNothing("the daemons may have enough files open");
}

void CheckFanotify(Machine& machine, Findings& findings) {
  for (const std::string& name : machine.served()) {
    const std::string why = WhyNoFanotify(machine.Share(name).GetPath());
    if (!why.empty()) ReportWithoutFanotify(name, why, findings);
  }
  findings.WellIfNothing("hears the changes in all shares with indexed folders");
}

void CheckRoom(Machine& machine, Findings& findings) {
  std::map<std::string, Volume> volumes;
  for (const std::string& name : machine.served()) {
    const sdk::SDKShare& share = machine.Share(name);
    const std::string volume = Dirname(share.GetPath());
    volumes[volume][name] = SizeOf(share.GetDBPath());
    if (!share.IsSpaceEnough()) ReportNoRoom(name, volume, findings);
  }
  for (const auto& [path, volume] : volumes) findings.Well(Describe(path, volume));
  findings.WellIfNothing("there is no index");
}

}  // namespace quarrox::ctl::doctor
