// The daemon's own process: it takes commands and keeps one worker for each indexed share.
#pragma once

#include <map>
#include <string>
#include <vector>

#include "backoff.h"
#include "command.h"
#include "command_socket.h"
#include "indexed_shares.h"
#include "queue_watch.h"
#include "wait.h"
#include "worker_pool.h"

namespace quarrox::fileindexd {

// All work is done by the workers. This process opens no share and takes no lock, and so is always there to answer.
// Not thread-safe.
class Daemon {
 public:
  // Throws Error where another daemon is running or the socket cannot be made. `worker_options` are for the workers.
  Daemon(const std::string& socket_path, std::vector<std::string> worker_options);

  // Serves until SIGTERM or SIGINT, and ends all workers. Throws Error where the kernel refuses what this stands on.
  void Run();

 private:
  // From the signal to the end at the latest, also where the kernel does not let go of a process.
  static constexpr std::chrono::milliseconds kTimeToStop{900};

  void TakeSignals();
  void RunOnce();
  void CarryOut(const Command& command);
  void Order(const std::string& share, bool run);
  void WatchFolders();
  void LookAtFolders();
  void FollowFolders();

  Signals signals_;
  CommandSocket socket_;
  WorkerPool pool_;
  IndexedShares indexed_;
  QueueWatch folders_;                    // not every change of the list comes with a command
  std::map<std::string, bool> orders_;    // shares whose worker was created or deleted by a command
  std::map<std::string, size_t> paused_;  // folders of each share
  Clock::time_point look_at_ = {};        // when the folder list is due, kNever while it has been read
  Backoff look_backoff_;
  Clock::time_point stop_at_ = kNever;  // while stopping
};

}  // namespace quarrox::fileindexd
