// Writes down how far a worker is, for people: at each change of its state, and once a second while it works. While
// nothing changes nothing is written. That it cannot be written keeps nothing from being done.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "fileindex/index_progress.h"
#include "fileindex/optree.h"
#include "operation_handler.h"
#include "wait.h"

namespace quarrox::fileindexd {

// Not thread-safe.
class ProgressReport {
 public:
  // Goes on in this file; what it holds was told by a worker before.
  void Open(const std::string& file);

  void Work();
  void Count(fileindex::FileIndexOP operation);
  void Committed();
  void Idle(const Tally& tally);
  void Wait(const std::string& reason, const Tally& tally);

  // While working: whether it is time to tell again, and what there is to tell. `operations` wait behind the one that
  // is being handled, where that is known; `held_back_by` is what Pacer says.
  bool IsDue() const { return Clock::now() >= due_; }
  void Update(const Tally& tally, std::optional<uint64_t> operations, const std::string& held_back_by);

 private:
  using Progress = fileindex::IndexProgress;

  void Become(Progress::State state, const std::string& reason, const Tally& tally);
  void Take(const Tally& tally);
  void Save();

  std::string file_;
  Progress progress_;
  bool told_ = false;  // anything
  Clock::time_point due_ = kNever;
};

}  // namespace quarrox::fileindexd
