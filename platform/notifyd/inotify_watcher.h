// Watching by inotify. See watcher.h for what a Watcher does.
//
// inotify reports in order and by name, so events become lines as they are read. What needs care is a new directory:
// until it is watched, nothing in it is heard. It is therefore reported after its whole subtree is watched, and the
// reader looks at everything below a directory that is reported as created. The paths that are watched may by then name
// another directory than the event meant; so the places of all directories that came or moved are watched once more at
// the end of each round, which finds out, because the kernel gives each directory one watch descriptor.
#pragma once

#include <map>
#include <memory>
#include <string>
#include <unordered_set>
#include <vector>

#include "watch_tree.h"
#include "watcher.h"

struct inotify_event;

namespace quarrox::notifyd {

class InotifyWatcher final : public Watcher {
 public:
  InotifyWatcher(const Scope& scope, EventSink& sink);

  const char* method() const override { return "inotify"; }
  int fd() const override { return tree_->fd(); }
  void Drain() override;
  int Timeout() const override;

 private:
  // The first half of a move, until the second comes or turns out to be missing.
  struct Departure {
    Spot spot;
    bool is_dir;
  };

  bool ReadAll();
  bool ReadOnce();
  void Handle(const inotify_event& event);
  void HandleDirectory(const inotify_event& event);
  void HandleEntry(const inotify_event& event, const Spot& spot);
  void Depart(uint32_t cookie, Departure departure);
  void Arrive(uint32_t cookie, const Spot& spot, bool is_dir);
  void Rename(const Departure& from, const Spot& to);
  void MovedOut(const Departure& departure);
  void Created(const Spot& spot, bool is_dir);
  void Deleted(const Spot& spot, bool is_dir);
  void Touched(uint32_t bit, const Spot& spot, bool is_dir);
  void CheckPlaces(bool quiet);
  void CheckDepartures();
  void CheckErrors();
  void StartOver();
  bool IsInside(const Spot& spot) const;
  void Write(uint32_t bit, bool is_dir, const std::string& path) { sink_.Add({bit, is_dir, path, {}}); }

  const Scope& scope_;
  EventSink& sink_;
  std::unique_ptr<WatchTree> tree_;
  std::vector<char> buffer_;                  // of one read
  std::vector<char> events_;                  // of the round
  std::map<uint32_t, Departure> departures_;  // by the kernel's cookie
  std::vector<Spot> unsure_;                  // directories to watch again at the end of the round
  std::vector<std::string> left_;             // old paths of this round's renames
  std::unordered_set<std::string> gone_;      // paths that this round's events said are gone
  bool overflowed_ = false;
  bool error_logged_ = false;
};

}  // namespace quarrox::notifyd
