#include "monitor_service.h"

#include <poll.h>

#include <algorithm>
#include <string_view>
#include <unordered_map>
#include <unordered_set>
#include <utility>

#include "common/error.h"
#include "scope.h"

namespace quarrox::notifyd {
namespace {

constexpr std::chrono::seconds kRetryUnheard(10);
constexpr std::chrono::seconds kRetryFailed(1);  // a watch that worked until now

// One round takes what was reported by then; further ones what that left open, such as the missing half of a move.
constexpr int kLastRounds = 3;

int Earlier(int a, int b) {
  if (a < 0 || b < 0) return a < 0 ? b : a;
  return std::min(a, b);
}

}  // namespace

MonitorService::MonitorService(const Options& options, const std::string& directory, const std::string& status_file)
    : files_(std::make_unique<MonitorFiles>(directory)), watches_(options.method, options.limited_queue) {
  if (!status_file.empty()) status_ = std::make_unique<WatchStatus>(status_file);
  if (status_ != nullptr) status_->Tell({});  // the first look at large folders takes long
  Follow();
  Flush();
}

MonitorService::MonitorService(const Options& options, const Monitor& monitor)
    : fixed_{{"", monitor}}, watches_(options.method, options.limited_queue) {
  Follow();
  if (!watches_.unheard().empty()) throw Error(kErrSystem, watches_.unheard().begin()->second);
}

void MonitorService::OpenQueues() {
  for (const auto& [name, monitor] : monitors()) {
    const auto [queue, is_new] = queues_.try_emplace(monitor.queue);
    if (is_new) queue->second = std::make_unique<QueueWriter>(monitor.queue);
    if (!monitor.folders.empty()) queue->second->set_root(monitor.folders.front().path);
  }
}

// What was seen while a configuration stood is still written, as far as that works at once.
void MonitorService::CloseQueues() {
  std::unordered_set<std::string_view> kept;
  for (const auto& [name, monitor] : monitors()) kept.insert(monitor.queue);
  for (auto queue = queues_.begin(); queue != queues_.end();) {
    if (kept.contains(queue->first)) {
      ++queue;
      continue;
    }
    queue->second->FlushNow();
    real_queues_.erase(queue->first);
    followed_.erase(queue->second.get());
    queue = queues_.erase(queue);
  }
}

std::vector<WantedFolder> MonitorService::Wanted() {
  std::vector<WantedFolder> wanted;
  for (const auto& [name, monitor] : monitors()) {
    EventSink* queue = queues_.at(monitor.queue).get();
    for (const MonitoredFolder& folder : monitor.folders) {
      wanted.push_back({&places_.places().at(folder.path), &folder, queue, {}});
    }
  }
  return wanted;
}

std::vector<std::string> MonitorService::QueuePaths() {
  std::vector<std::string> paths;
  for (const auto& [path, queue] : queues_) {
    const auto [real, is_new] = real_queues_.try_emplace(path);
    if (is_new) real->second = RealPath(path);
    paths.push_back(real->second);
  }
  return paths;
}

void MonitorService::Tell(const std::vector<WantedFolder>& wanted, const FolderPlaces::Changes& changes) {
  const std::unordered_map<const Place*, Place::Change> by_place(changes.begin(), changes.end());
  for (const WantedFolder& one : wanted) {
    const auto found = by_place.find(one.place);
    if (found == by_place.end()) continue;
    const uint32_t bit = found->second == Place::Change::kCame   ? kCreated
                         : found->second == Place::Change::kWent ? kDeleted
                                                                 : 0;
    if ((bit & one.folder->mask) != 0) one.queue->Add({bit, true, one.folder->path, {}});
    if (found->second == Place::Change::kCameBack) to_mark_.emplace(one.queue, one.folder->path);
  }
}

// Whoever configures a folder looks at it about then, but maybe before it was watched; a queue that was not served may
// have been served before. What happened meanwhile is not known.
void MonitorService::TellNew(const std::vector<WantedFolder>& wanted) {
  std::map<EventSink*, std::set<std::string>> followed;
  for (const WantedFolder& one : wanted) {
    const auto before = followed_.find(one.queue);
    if (before == followed_.end()) {
      to_mark_.emplace(one.queue, one.folder->path);
    } else if (one.place->there && !before->second.contains(one.folder->path) && (one.folder->mask & kCreated) != 0) {
      one.queue->Add({kCreated, true, one.folder->path, {}});
    }
    followed[one.queue].insert(one.folder->path);
  }
  followed_ = std::move(followed);
}

void MonitorService::NoteUnheard() {
  for (const auto& [path, why] : watches_.unheard()) was_unheard_.insert(path);
}

void MonitorService::MarkHeardAgain(const std::vector<WantedFolder>& wanted) {
  std::set<std::string> unheard;
  for (const WantedFolder& one : wanted) {
    const std::string& path = one.folder->path;
    if (!was_unheard_.contains(path)) continue;
    if (one.place->there && !watches_.unheard().contains(path)) {
      to_mark_.emplace(one.queue, path);
    } else {
      unheard.insert(path);
    }
  }
  was_unheard_ = std::move(unheard);
  NoteUnheard();
}

// What was reported until now goes where it went before. Marks come last: they cover what happened until then.
void MonitorService::Follow() {
  watches_.DrainAll();
  NoteUnheard();
  std::unordered_set<std::string> folders;
  for (const auto& [name, monitor] : monitors()) {
    for (const MonitoredFolder& folder : monitor.folders) folders.insert(folder.path);
  }
  places_.Keep(folders);
  const FolderPlaces::Changes changes = places_.Look();
  OpenQueues();
  const std::vector<WantedFolder> wanted = Wanted();
  watches_.Arrange(wanted, QueuePaths());
  Tell(wanted, changes);
  if (files_ != nullptr) TellNew(wanted);
  MarkHeardAgain(wanted);
  for (const auto& [queue, path] : std::exchange(to_mark_, {})) queue->Add({kLost, false, path, {}});
  CloseQueues();
  TellWatches();
  retry_ = watches_.unheard().empty() ? Clock::time_point::max() : Clock::now() + kRetryUnheard;
}

void MonitorService::TellWatches() {
  if (status_ == nullptr) return;
  WatchStatus::Folders folders;
  for (const auto& [name, monitor] : monitors()) {
    for (const MonitoredFolder& folder : monitor.folders) {
      const auto unheard = watches_.unheard().find(folder.path);
      const std::string why = unheard == watches_.unheard().end() ? "" : unheard->second;
      folders[folder.path] = {watches_.MethodOf(folder.path), why, 0};
    }
  }
  status_->Tell(std::move(folders));
}

void MonitorService::AddPollFds(std::vector<pollfd>& fds) const {
  fds.push_back({files_ == nullptr ? -1 : files_->fd(), POLLIN, 0});
  fds.resize(fds.size() + FolderPlaces::kPollFds);
  places_.FillPollFds(&fds[fds.size() - FolderPlaces::kPollFds]);
  watches_.AddPollFds(fds);
}

int MonitorService::Timeout() const {
  int timeout = watches_.Timeout();
  for (const auto& [path, queue] : queues_) timeout = Earlier(timeout, queue->Timeout());
  if (retry_ == Clock::time_point::max()) return timeout;
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(retry_ - Clock::now()).count();
  return Earlier(timeout, static_cast<int>(std::max<int64_t>(left, 0)));
}

void MonitorService::Process(const pollfd* fds, bool timed_out) {
  bool changed = fds[0].revents != 0 && files_->Refresh();
  const pollfd* places = fds + 1;
  if ((places[0].revents != 0 || places[1].revents != 0) && places_.Reported(places)) {
    real_queues_.clear();
    changed = true;
  }
  if (changed || retry_ <= Clock::now()) {
    Follow();
  } else {
    watches_.Drain(places + FolderPlaces::kPollFds, timed_out);
    if (!watches_.unheard().empty() && retry_ == Clock::time_point::max()) {
      retry_ = Clock::now() + kRetryFailed;
      TellWatches();
    }
  }
  Flush();
}

void MonitorService::Flush() {
  for (const auto& [path, queue] : queues_) queue->Flush();
}

std::string MonitorService::FlushNow() {
  std::string unwritten;
  for (const auto& [path, queue] : queues_) {
    if (!queue->FlushNow()) unwritten += (unwritten.empty() ? "" : ", queue=") + path;
  }
  return unwritten;
}

void MonitorService::Finish() {
  for (int round = 0; round < kLastRounds; ++round) watches_.DrainAll();
  const std::string unwritten = FlushNow();
  if (unwritten.empty()) return;
  throw Error(kErrSystem, "Events are lost because the queue cannot be written, queue=" + unwritten);
}

}  // namespace quarrox::notifyd
