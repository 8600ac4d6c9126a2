#include "progress_report.h"

#include <unistd.h>

#include <cerrno>
#include <ctime>

namespace quarrox::fileindexd {
namespace {

constexpr std::chrono::seconds kBetweenReports(1);

}  // namespace

void ProgressReport::Open(const std::string& file) {
  if (file == file_) return;
  file_ = file;
  told_ = false;
  const std::optional<Progress> before = Progress::Load(file);
  if (!before) return;
  if (before->committed > progress_.committed) progress_.committed = before->committed;
  progress_.operations = before->operations;
}

void ProgressReport::Save() {
  if (file_.empty()) return;  // a worker that is paused from its start has opened none yet
  progress_.pid = getpid();
  progress_.updated = time(nullptr);
  progress_.Save(file_);
  errno = 0;
  told_ = true;
  due_ = progress_.state == Progress::State::kWorking ? Clock::now() + kBetweenReports : kNever;
}

void ProgressReport::Take(const Tally& tally) {
  progress_.done = tally.done;
  progress_.failed = tally.failed;
  progress_.left = tally.left;
  progress_.path = tally.path;
}

void ProgressReport::Become(Progress::State state, const std::string& reason, const Tally& tally) {
  if (told_ && progress_.state == state && progress_.reason == reason) return;
  if (!told_ || progress_.state != state) progress_.since = time(nullptr);
  progress_.state = state;
  progress_.reason = reason;
  progress_.held_back_by.clear();
  Take(tally);
  Save();
}

void ProgressReport::Work() {
  Become(Progress::State::kWorking, "", {});
}

void ProgressReport::Count(fileindex::FileIndexOP operation) {
  if (const auto kind = static_cast<size_t>(operation); kind < progress_.operations.size())
    ++progress_.operations[kind];
}

void ProgressReport::Committed() {
  progress_.committed = time(nullptr);
}

void ProgressReport::Idle(const Tally& tally) {
  Become(Progress::State::kIdle, "", {tally.done, tally.failed, 0, {}});
}

void ProgressReport::Wait(const std::string& reason, const Tally& tally) {
  Become(Progress::State::kWaiting, reason, tally);
}

void ProgressReport::Update(const Tally& tally, std::optional<uint64_t> operations, const std::string& held_back_by) {
  Take(tally);
  progress_.held_back_by = held_back_by;
  if (operations) progress_.left = *operations + tally.left.value_or(1);
  Save();
}

}  // namespace quarrox::fileindexd
