#include "calm.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <ctime>
#include <string>

#include "common/unique_fd.h"

namespace quarrox::fileindexd {
namespace {

using std::chrono::milliseconds;

// A tenth of the weight of others (110 beside 1024). At 19, with 15, a worker was seen to index three files a second
// where four others computed on two processors; and it holds the locks of queues and state files for moments: whoever
// waits for one waits for the worker's turn.
constexpr int kNice = 10;

// From linux/ioprio.h, which not every system has: who is this process, and the lowest of the usual classes. The idle
// class may get nothing for as long as somebody else reads.
constexpr int kIoPriorityOfProcess = 1;
constexpr int kIoPriorityLowest = (2 << 13) | 7;

constexpr const char* kOomScore = "500";  // of 1000: as if it held half of the memory besides its own

struct Resource {
  const char* name;
  const char* file;
  double threshold;  // the share of the time for which something waits for it
};
constexpr Resource kResources[] = {{"disk", "/proc/pressure/io", 0.25},
                                   {"memory", "/proc/pressure/memory", 0.10},
                                   {"processor", "/proc/pressure/cpu", 0.25}};
constexpr size_t kProcessors = 2;

// Others who use that much of all processors have no room to spare.
constexpr double kBusyProcessors = 0.75;

constexpr milliseconds kBetweenLooks(1000);
constexpr milliseconds kStale(10000);    // what was before an idle while says nothing about now
constexpr milliseconds kFirstLook(300);  // behind it; a short pass is over by then
constexpr milliseconds kListening(100);
constexpr milliseconds kAfterOwnLoad(5000);  // what waits is our own doing: listening costs a fiftieth of the time
constexpr milliseconds kRest(900);
constexpr milliseconds kTurn(300);
constexpr int64_t kWorkOfTurn = 30000000;  // nanoseconds; the engine's share of the work is several times as much

std::string ReadStart(const char* file) {
  char buffer[512];
  const UniqueFd fd(open(file, O_RDONLY | O_CLOEXEC));
  const ssize_t size = fd ? read(fd.get(), buffer, sizeof(buffer)) : 0;
  return {buffer, static_cast<size_t>(size > 0 ? size : 0)};
}

// Of this process, in nanoseconds.
int64_t ProcessorTime() {
  timespec time = {};
  clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &time);
  return time.tv_sec * int64_t{1000000000} + time.tv_nsec;
}

}  // namespace

void BecomeCalm() {
  setpriority(PRIO_PROCESS, 0, kNice);
  syscall(SYS_ioprio_set, kIoPriorityOfProcess, 0, kIoPriorityLowest);
  if (FILE* file = fopen("/proc/self/oom_score_adj", "we")) {
    fputs(kOomScore, file);
    fclose(file);
  }
  errno = 0;
}

Pacer::Pacer(bool wanted) {
  if (wanted && Look(last_)) look_at_ = last_.at + kBetweenLooks;
}

// False where there is nothing to be read.
bool Pacer::Look(Sample& sample) {
  sample.at = Clock::now();
  for (size_t i = 0; i < std::size(kResources); ++i) {
    const std::string text = ReadStart(kResources[i].file);
    if (sscanf(text.c_str(), "some %*s %*s %*s total=%" SCNd64, &sample.stalled[i]) != 1) return false;
  }
  int64_t user, nice, system, idle, waiting, interrupts, soft_interrupts;
  if (sscanf(ReadStart("/proc/stat").c_str(),
             "cpu %" SCNd64 "%" SCNd64 "%" SCNd64 "%" SCNd64 "%" SCNd64 "%" SCNd64 "%" SCNd64, &user, &nice, &system,
             &idle, &waiting, &interrupts, &soft_interrupts) != 7) {
    return false;
  }
  sample.busy = user + nice + system + interrupts + soft_interrupts;
  sample.ticks = sample.busy + idle + waiting;
  return true;
}

// For what so much waited between two looks, or, where nobody of ours runs, so much was in use; null for nothing.
const char* Pacer::WhatStalls(const Sample& before, const Sample& after, bool resting) {
  const double passed = std::chrono::duration<double, std::micro>(after.at - before.at).count();
  for (size_t i = 0; i < std::size(kResources); ++i) {
    if (i == kProcessors && resting) continue;
    if (static_cast<double>(after.stalled[i] - before.stalled[i]) > kResources[i].threshold * passed) {
      return kResources[i].name;
    }
  }
  const auto busy = static_cast<double>(after.busy - before.busy);
  const bool is_full = resting && busy > kBusyProcessors * static_cast<double>(after.ticks - before.ticks);
  return is_full ? kResources[kProcessors].name : nullptr;
}

void Pacer::Rest(int wake_fd, Clock::time_point end) {
  pollfd fds[] = {{wake_fd, POLLIN, 0}};
  PollUntil(fds, 1, end);
}

void Pacer::Pace(int wake_fd) {
  const Clock::time_point now = Clock::now();
  if (now < look_at_ || (turn_ != 0 && ProcessorTime() < turn_)) return;
  Sample seen = last_;
  Look(seen);
  look_at_ = now + kBetweenLooks;
  turn_ = 0;
  held_back_by_ = "";
  if (now - last_.at > kStale) {
    last_ = seen;
    look_at_ = now + kFirstLook;
    return;
  }
  if (WhatStalls(last_, seen, false) != nullptr) {
    Rest(wake_fd, now + kListening);
    Sample heard = seen;
    Look(heard);
    if (const char* resource = WhatStalls(seen, heard, true)) {
      held_back_by_ = resource;
      Rest(wake_fd, now + kRest);
      Look(heard);
      look_at_ = Clock::now() + kTurn;
      turn_ = ProcessorTime() + kWorkOfTurn;
    } else {
      look_at_ = now + kAfterOwnLoad;
    }
    seen = heard;
  }
  last_ = seen;
}

}  // namespace quarrox::fileindexd
