// Serves monitor configurations: keeps the watches and the queues in step with the configurations and with the folders,
// and writes the marks that say that a queue is not complete.
//
// A queue gets that mark when the service begins to serve it, and when one of its folders comes back or could not be
// watched for a while. A folder that joins those of a queue is written as created, and so is one that appears only
// after it was configured; one that goes is written as deleted, but for a disk that is unmounted nothing is written,
// because its files are as they were.
//
// Not thread-safe.
#pragma once

#include <chrono>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "folder_places.h"
#include "monitor_files.h"
#include "options.h"
#include "queue_writer.h"
#include "watch_status.h"
#include "watches.h"

struct pollfd;

namespace quarrox::notifyd {

class MonitorService {
 public:
  // Serves the configurations in `directory`. Throws Error 502 where they cannot be watched. How their folders are
  // watched is told in `status_file`, if one is named.
  MonitorService(const Options& options, const std::string& directory, const std::string& status_file = {});

  // Serves this one configuration, and writes no mark at the start. Throws Error 502 where its folders cannot be
  // watched.
  MonitorService(const Options& options, const Monitor& monitor);

  // Adds what poll() is to wait for, and says for how long at most; -1 for ever.
  void AddPollFds(std::vector<pollfd>& fds) const;
  int Timeout() const;

  // Does what there is to do after poll() has filled these descriptors; `timed_out` when none is ready.
  void Process(const pollfd* fds, bool timed_out);

  // Tries to write what waits. The result names the queues where that fails.
  std::string FlushNow();

  // Reads and writes the rest. Throws Error 502 where a queue cannot be written.
  void Finish();

  const Watches& watches() const { return watches_; }

 private:
  using Clock = std::chrono::steady_clock;
  using Monitors = std::map<std::string, Monitor>;

  const Monitors& monitors() const { return files_ == nullptr ? fixed_ : files_->monitors(); }
  void Follow();
  void OpenQueues();
  void CloseQueues();
  std::vector<WantedFolder> Wanted();
  std::vector<std::string> QueuePaths();
  void Tell(const std::vector<WantedFolder>& wanted, const FolderPlaces::Changes& changes);
  void TellNew(const std::vector<WantedFolder>& wanted);
  void NoteUnheard();
  void TellWatches();
  void MarkHeardAgain(const std::vector<WantedFolder>& wanted);
  void Flush();

  Monitors fixed_;
  std::unique_ptr<MonitorFiles> files_;
  FolderPlaces places_;
  std::map<std::string, std::unique_ptr<QueueWriter>> queues_;  // by path
  std::map<std::string, std::string> real_queues_;              // their real paths, as long as nothing was moved
  std::map<EventSink*, std::string> to_mark_;                   // and the path that the mark bears
  std::map<EventSink*, std::set<std::string>> followed_;        // the folders that each queue has told of
  std::set<std::string> was_unheard_;                           // folders, whose queues are to be marked
  Watches watches_;                                             // after the queues, which they write to
  std::unique_ptr<WatchStatus> status_;
  Clock::time_point retry_ = Clock::time_point::max();
};

}  // namespace quarrox::notifyd
