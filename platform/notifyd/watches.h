// The watches that together hear all configured folders.
//
// fanotify watches a whole mount, so all folders on it share one watch; a folder that does not exist yet is heard by
// the watch of the directory that it is to be made in. Where fanotify is not permitted, each folder that is not below
// another one gets an inotify watch of its own, as soon as it exists. A watch that is still wanted after a change of
// the folders goes on without a gap; one that is to be replaced is read to its end after its successor was made, so
// that events may come twice but are never missed.
//
// Not thread-safe.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "folder_places.h"
#include "monitor.h"
#include "options.h"
#include "router.h"
#include "scope.h"
#include "watcher.h"

struct pollfd;

namespace quarrox::notifyd {

// A folder as one queue wants it, and where it is.
struct WantedFolder {
  const Place* place;
  const MonitoredFolder* folder;
  EventSink* queue;
  std::string key;  // of the watch that hears it; Watches fills it
};

class Watches {
 public:
  Watches(Method method, bool limited) : method_(method), limited_(limited) {}

  // Makes the watches fit what is wanted now. `queues` are the real paths of the queues. What cannot be watched is
  // logged once.
  void Arrange(std::vector<WantedFolder> wanted, const std::vector<std::string>& queues);

  // Folders that exist and that nothing hears, by their configured path, and why not.
  const std::map<std::string, std::string>& unheard() const { return unheard_; }

  // How the folder with this configured path is watched; empty where it is not.
  std::string MethodOf(const std::string& path) const;

  // What poll() is to wait for, and for how long at most; -1 for ever.
  void AddPollFds(std::vector<pollfd>& fds) const;
  int Timeout() const;

  // Drains the watches after poll() has filled the descriptors from AddPollFds; `timed_out` when none of them is ready.
  void Drain(const pollfd* fds, bool timed_out);

  // Drains all. A watch that cannot go on ends, and its folders are unheard.
  void DrainAll();

 private:
  struct Watch {
    Watch(std::string dir, uint32_t number, std::shared_ptr<const Routes> routes)
        : scope(std::move(dir), number, std::move(routes)), router(scope) {}
    Scope scope;
    Router router;
    std::unique_ptr<Watcher> watcher;  // null after it failed
  };

  bool UseFanotify(const Place& place, const std::string& key);
  std::unique_ptr<Watch> MakeFanotify(const Place& place, const std::string& key);
  void PlanFanotify(std::vector<WantedFolder>& wanted);
  void PlanInotify(std::vector<WantedFolder>& wanted);
  void NumberWatches(const std::vector<WantedFolder>& wanted);
  std::shared_ptr<const Routes> MakeRoutes(const std::vector<WantedFolder>& wanted,
                                           const std::vector<std::string>& queues) const;
  void Begin(Watch& watch, const std::string& key);
  void EndUnwanted(const std::vector<WantedFolder>& wanted);
  void NoteUnheard(const std::vector<WantedFolder>& wanted);
  void Fail(const std::string& key, const std::string& why);
  bool Drain(const std::string& key, Watch& watch);

  const Method method_;
  const bool limited_;
  uint32_t last_number_ = 0;
  std::map<std::string, std::unique_ptr<Watch>> watches_;  // by key
  std::map<std::string, std::string> failed_;              // by key: why there is no watch
  std::unordered_map<std::string, std::string> heard_;     // configured paths, and the keys of their watches
  std::map<std::string, std::string> unheard_;
};

}  // namespace quarrox::notifyd
