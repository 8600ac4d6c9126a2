// The processes that serve the shares, one each, so that a crash for one share ends the work for that one only.
//
// A process that ends without having been told to is started again, after a pause that grows while it keeps ending
// early. All end with this one, also where it is killed.
#pragma once

#include <sys/types.h>

#include <map>
#include <string>
#include <utility>
#include <vector>

#include "backoff.h"
#include "wait.h"

namespace quarrox::fileindexd {

// Nothing here waits: the owner calls Reap() on SIGCHLD, and KeepUp() at the deadline, which starts and kills what is
// due. The owner has no other children and no threads, and blocks SIGUSR1: the processes take their signals from the
// moment in which they are made. Not thread-safe.
class WorkerPool {
 public:
  // What a worker that was told to end gets before it is killed, which loses nothing.
  static constexpr std::chrono::milliseconds kTimeToEnd{700};

  // A process that lived that long did not end early.
  static constexpr std::chrono::seconds kLongLife{60};

  // Processes made by one call of KeepUp(), so that clients need not wait for hundreds of them.
  static constexpr int kSpawnsAtOnce = 4;

  // Words of the command line of each worker.
  explicit WorkerPool(std::vector<std::string> options) : options_(std::move(options)) {}

  // Starts a share's process unless it runs, also where it waits to be started again or its share was not found.
  void Start(const std::string& share);

  // Ends a share's process and forgets the share.
  void End(const std::string& share);
  void EndAll();

  // Tells one process, or all, that settings or the state of pausing have changed.
  void Tell(const std::string& share) const;
  void TellAll() const;

  // The shares that were started and not ended since.
  std::vector<std::string> Shares() const;
  bool Has(const std::string& share) const;

  // Whether there is neither a process nor a share.
  bool empty() const { return workers_.empty(); }

  void Reap();
  void KeepUp();
  Clock::time_point Deadline() const;

 private:
  struct Worker {
    pid_t pid = 0;       // 0 while there is no process
    bool wanted = true;  // else it is forgotten once its process has ended
    bool missing_told = false;
    Clock::time_point started = {};
    Clock::time_point start_at = kNever;
    Clock::time_point kill_at = kNever;
    Backoff backoff = {};
  };

  void Spawn(const std::string& share, Worker& worker) const;
  void HandleEnd(const std::string& share, Worker& worker, int status) const;
  void WaitForShare(const std::string& share, Worker& worker) const;
  void StartLater(const std::string& share, Worker& worker, const std::string& why) const;

  const std::vector<std::string> options_;
  std::map<std::string, Worker> workers_;
};

}  // namespace quarrox::fileindexd
