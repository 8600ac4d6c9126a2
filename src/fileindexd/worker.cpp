#include "worker.h"

#include <poll.h>
#include <signal.h>
#include <sys/timerfd.h>

#include <algorithm>
#include <cerrno>
#include <iterator>
#include <utility>

#include "common/comm.h"
#include "common/error.h"
#include "common/file.h"
#include "common/log.h"
#include "common/sdk/share.h"
#include "fileindex/notices.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/status_mgr.h"

namespace quarrox::fileindexd {
namespace {

using fileindex::QueueMgr;
using fileindex::StatusMgr;

// How long the first line of a burst waits for the others.
constexpr std::chrono::milliseconds kBurst(200);

// The same where nothing came for a while: people wait for what comes alone. Where it was the first of a burst, a short
// pass is made for it, and the others wait as above.
constexpr std::chrono::milliseconds kLoneLine(20);
constexpr std::chrono::milliseconds kQuiet(400);

// Unwinds a pass. They are no Error: nobody on the way is to handle them.
struct Paused {};
struct Interrupted {};
struct NoShare {};

// Not time(), which may still say the second before where a timer says that it is over.
int64_t Now() {
  return std::chrono::system_clock::to_time_t(std::chrono::system_clock::now());
}

// By the clock that people set, though not further away than what is tried again ever is: it may be set back.
Clock::time_point DeadlineOf(std::optional<int64_t> time) {
  constexpr int64_t kLongest = 3600;
  if (!time) return kNever;
  return Clock::now() + std::chrono::seconds(std::clamp<int64_t>(*time - Now(), 1, kLongest));
}

}  // namespace

Worker::Worker(std::string share, OperationHandler& handler, bool eager)
    : share_(std::move(share)), handler_(handler), signals_({SIGTERM, SIGINT, SIGUSR1}), pacer_(!eager) {
  if (!eager) BecomeCalm();
}

// True where there was one.
bool Worker::TakeSignals() {
  bool any = false;
  for (int signal; (signal = signals_.Take()) != 0; any = true) stopping_ = stopping_ || signal != SIGUSR1;
  return any;
}

// Throws Paused, or Error where that cannot be told.
void Worker::LookAtPause() {
  resume_time_ = StatusMgr().GetPauseInfo();
  if (resume_time_ == fileindex::kPausedWithoutEnd || resume_time_ > Now()) throw Paused();
}

// A share may have moved to another place since the last look, or be gone.
void Worker::OpenQueue() {
  try {
    const sdk::SDKShare share(share_);
    const std::string path = share.GetQueuePath();
    if (!watch_ || watch_->path() != path) watch_.emplace(path);
    progress_.Open(fileindex::IndexProgress::FileOf(share));
  } catch (const Error& error) {
    if (error.code == kErrNoSuchShare) throw NoShare();
    throw;
  }
}

// A queue that cannot be watched is still drained, now and then.
void Worker::Arm() {
  const bool told = watch_told_;
  armed_ = false;
  try {
    watch_->Arm();
    armed_ = true;
    watch_told_ = false;
  } catch (const Error& error) {
    watch_told_ = true;
    errno = 0;
    if (told) return;
    QUARROX_LOG_FAILURE(
        "The queue of share %s is looked at once a minute because it cannot be watched, reason: %s; raise "
        "fs.inotify.max_user_instances and fs.inotify.max_user_watches",
        share_.c_str(), error.reason.c_str());
  }
}

// Where a pass is to be left, this leaves it.
bool Worker::IsToldToLookAgain() {
  pacer_.Pace(signals_.fd());
  if (progress_.IsDue()) progress_.Update(handler_.tally(), operations_, pacer_.held_back_by());
  if (!TakeSignals()) return false;
  if (stopping_) throw Interrupted();
  LookAtPause();
  return true;
}

void Worker::HandleQueue(const QueueMgr& queue) {
  const std::shared_ptr<fileindex::OPTree> operations = queue.GetOPTreeTmp();
  operations_ = operations->Count();
  operations->ProcessOP([this](const std::shared_ptr<fileindex::OP>& operation) {
    --*operations_;
    progress_.Count(operation->op);
    handler_.Handle(*operation);
  });
}

// False where nothing is pending.
bool Worker::Pass() {
  const std::string path = watch_->path();
  QueueMgr queue(path);
  // A pass that did not end leaves its ".tmp", and perhaps no queue beside it.
  const bool is_pending = queue.PrepareTmpQueue() || IsFileExist(path + ".tmp");
  if (!is_pending && !handler_.HasWork()) return false;
  progress_.Work();
  operations_.reset();
  handler_.Begin([this] { return IsToldToLookAgain(); });
  if (is_pending) HandleQueue(queue);
  handler_.Commit();
  if (is_pending && queue.DeleteTmp() != 0 && errno != ENOENT) FailCall("unlink " + path + ".tmp");
  progress_.Committed();
  return true;
}

Worker::Outcome Worker::TryDrain() {
  for (;;) {
    TakeSignals();
    if (stopping_) return Outcome::kInterrupted;
    LookAtPause();
    OpenQueue();
    Arm();
    failure_ = "The queue cannot be watched, so it is looked at now and then";
    try {
      if (!Pass()) return armed_ ? Outcome::kDrained : Outcome::kFailed;
    } catch (const StartAnew&) {
      continue;
    }
    backoff_.Reset();
  }
}

Worker::Outcome Worker::Drain() {
  try {
    return TryDrain();
  } catch (const Paused&) {
    return Outcome::kPaused;
  } catch (const Interrupted&) {
    return Outcome::kInterrupted;
  } catch (const NoShare&) {
    return Outcome::kNoShare;
  } catch (const Error& error) {
    errno = 0;
    failure_ = error.reason;
    QUARROX_LOG_FAILURE("A pass over the queue of share %s failed, code=%d, reason=%.8192s", share_.c_str(), error.code,
                        error.reason.c_str());
    const bool has_no_room = error.code == kErrNoSpace || int{error.code} == kElasticdNoRoom;
    if (has_no_room && !std::exchange(no_room_told_, true)) fileindex::SendKOSNotify();
  } catch (const std::exception& error) {
    errno = 0;
    failure_ = error.what();
    QUARROX_LOG_FAILURE("A pass over the queue of share %s failed, reason=%.8192s", share_.c_str(), error.what());
  }
  return Outcome::kFailed;
}

void Worker::WaitForQueue() {
  const Clock::time_point began = Clock::now();
  const Clock::time_point next_work = DeadlineOf(handler_.NextWork());
  pollfd fds[1 + QueueWatch::kPollFds];
  do {
    fds[0] = {signals_.fd(), POLLIN, 0};
    watch_->FillPollFds(fds + 1);
    PollUntil(fds, std::size(fds), next_work);
    if (fds[0].revents != 0 || Clock::now() >= next_work) return;
  } while (!watch_->Reported(fds + 1));
  const Clock::time_point now = Clock::now();
  PollUntil(fds, 1, now + (now - began < kQuiet ? kBurst : kLoneLine));
}

// Waits for the resume time by the clock that people set, also where that is set meanwhile.
void Worker::WaitForResume() {
  watch_.reset();
  const UniqueFd timer(timerfd_create(CLOCK_REALTIME, TFD_CLOEXEC | TFD_NONBLOCK));
  if (!timer) FailCall("timerfd_create");
  itimerspec when = {};
  when.it_value.tv_sec = resume_time_;  // 0 sets no timer: a pause without end
  if (timerfd_settime(timer.get(), TFD_TIMER_ABSTIME, &when, nullptr) != 0) FailCall("timerfd_settime");
  pollfd fds[] = {{signals_.fd(), POLLIN, 0}, {timer.get(), POLLIN, 0}};
  PollUntil(fds, std::size(fds), kNever);
}

void Worker::WaitToTryAgain() {
  pollfd fds[] = {{signals_.fd(), POLLIN, 0}};
  PollUntil(fds, std::size(fds), Clock::now() + backoff_.Next());
}

int Worker::Run() {
  while (!stopping_) {
    switch (Drain()) {
      case Outcome::kDrained:
        backoff_.Reset();
        no_room_told_ = false;
        progress_.Idle(handler_.tally());
        WaitForQueue();
        break;
      case Outcome::kPaused:
        progress_.Wait("Indexing is paused", handler_.tally());
        WaitForResume();
        break;
      case Outcome::kFailed:
        progress_.Wait(failure_, handler_.tally());
        WaitToTryAgain();
        break;
      case Outcome::kNoShare:
        return kExitNoShare;
      case Outcome::kInterrupted:
        break;
    }
  }
  return 0;
}

}  // namespace quarrox::fileindexd
