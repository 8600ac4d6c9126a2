// How far the indexing of each share is, at one moment, and how people are told.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "fileindex/index_progress.h"

namespace quarrox::ctl {

struct ShareStatus {
  enum class State {
    kCurrent,   // nothing is pending
    kPending,   // its queue is about to be worked on
    kWorking,   // a pass is under way
    kWaiting,   // for `reason` to pass
    kPaused,    // by a person
    kOutdated,  // its index misses something, and nothing is under way
    kBlocked,   // it cannot be indexed
  };

  std::string name = {};
  State state = State::kCurrent;
  std::string reason = {};                 // where it is none of the first three, for people
  bool rebuilding = false;                 // the pass under way makes the index anew
  fileindex::IndexProgress progress = {};  // what its worker tells; empty where none runs
  std::optional<uint64_t> documents = {};  // that searches can find; not known where the index cannot be asked
  uint64_t queue_bytes = 0;                // that wait
  std::optional<int64_t> queue_age = {};   // of the oldest of them, in seconds; none where there is no queue
  std::string progress_file = {};          // empty for a share that is gone
  size_t paused_folders = 0;               // while the share is not
  uint64_t failures = 0;                   // files that the index lacks, or has without their contents
  int64_t quiet = 0;                       // seconds for which a pass under way has told nothing
  std::vector<std::string> problems = {};  // that concern all shares, as IndexingStatus has them

  struct Folder {
    std::string path;
    std::string status;                  // the library's word
    std::optional<int64_t> resume_time;  // while it is paused by itself, as StatusMgr has it of all
  };
  std::vector<Folder> folders = {};

  // Whether anything is left to be done that is going to be done.
  bool IsBusy() const;

  // Documents a second in the pass under way, and the seconds that it still takes at that rate.
  std::optional<double> Rate() const;
  std::optional<int64_t> SecondsLeft() const;
};

struct IndexingStatus {
  std::vector<ShareStatus> shares = {};    // in which folders are indexed, by name
  bool daemon_runs = false;                // fileindexd
  std::vector<std::string> problems = {};  // that concern all of them, for people
};

// Whether a process is a worker, so that what it told of itself holds; its number may be another one's by now.
bool IsWorker(int64_t pid);

// Looks at the machine, with one exchange with the engine. `with_folders` reads the queues, too.
IndexingStatus LookAtIndexing(bool with_folders);

// A state in one word, for programs.
std::string NameOf(ShareStatus::State state);

// Everything as JSON on one line; what it does in words, without its name; the same with the number of its documents
// or, while it is worked on, with a bar where `bar` is set.
std::string AsJson(const ShareStatus& share);
std::string Describe(const ShareStatus& share);
std::string DescribeLong(const ShareStatus& share, bool bar);

// What could not be indexed, file by file. Returns the exit status.
int PrintFailures(bool json);

// Tables of the shares and their folders.
void Print(const IndexingStatus& status);

// Shows every change until a signal comes or, with `until_idle`, nothing is left to be done. Returns the exit status.
int FollowStatus(bool until_idle, bool json);

}  // namespace quarrox::ctl
