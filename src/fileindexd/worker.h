// The process that drains the queue of one share.
//
// It runs passes until the queue is empty: the queue is taken aside, its operations are handed out, and what was taken
// aside is deleted once they are committed. A pass is run, too, where the handler has something to do of its own. Then
// it waits in the kernel for the queue to be written, or for the time at which the handler wants to try something
// again. While indexing is paused it hands nothing out; a pass is left where it is, and is run again from its beginning
// afterwards.
//
// The daemon sends it SIGUSR1 when settings or the state of pausing have changed, and SIGTERM to end it.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "backoff.h"
#include "calm.h"
#include "fileindex/queue_mgr.h"
#include "operation_handler.h"
#include "progress_report.h"
#include "queue_watch.h"
#include "wait.h"

namespace quarrox::fileindexd {

// How a worker's process ends where its share does not exist.
inline constexpr int kExitNoShare = 3;

class Worker {
 public:
  // An eager one does not mind what else the machine has to do.
  Worker(std::string share, OperationHandler& handler, bool eager);

  // Works until SIGTERM or SIGINT; returns the process's exit status. Throws only what it can do nothing about.
  int Run();

 private:
  enum class Outcome { kDrained, kPaused, kInterrupted, kFailed, kNoShare };

  bool TakeSignals();
  void LookAtPause();
  void OpenQueue();
  void Arm();
  bool IsToldToLookAgain();
  Outcome Drain();
  Outcome TryDrain();
  bool Pass();
  void HandleQueue(const fileindex::QueueMgr& queue);
  void WaitForQueue();
  void WaitForResume();
  void WaitToTryAgain();

  const std::string share_;
  OperationHandler& handler_;
  Signals signals_;
  bool stopping_ = false;
  bool armed_ = false;
  bool watch_told_ = false;  // that it is not armed
  int64_t resume_time_ = 0;  // while paused, as StatusMgr::GetPauseInfo
  std::optional<QueueWatch> watch_;
  Backoff backoff_;
  bool no_room_told_ = false;           // to the administrators, since the last pass that ended well
  std::string failure_;                 // why the last pass failed
  std::optional<uint64_t> operations_;  // that wait behind the one that is being handled
  ProgressReport progress_;
  Pacer pacer_;
};

}  // namespace quarrox::fileindexd
