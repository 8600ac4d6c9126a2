// Which queues hear of which paths.
//
// A folder has a place, where the kernel speaks of it, and a name, the path under which its queue knows it; the two
// differ where symbolic links lead to it. It takes what happens to itself and below it, less what is below the names
// that it ignores. Folders may stand below one another, for one queue or for several. No folder takes anything below a
// directory of indices, or a queue: writing to a queue must not make a line for a queue.
//
// Each folder is heard by one watch, a number here, or by none yet. What is at a path is spoken of by the watch of the
// nearest folder above it that has one, and by no other watch: two watches may both see a file system that is mounted
// twice, and one directory tree that another is mounted in.
//
// Filled once, then only asked: so safe to share between threads.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "event.h"
#include "paths.h"

namespace quarrox::notifyd {

inline constexpr std::string_view kMetadataDir = "@eaDir";
inline constexpr std::string_view kIndexDir = "@fileindex";
inline constexpr uint32_t kAllEvents = UINT32_MAX;
inline constexpr uint32_t kNoWatch = 0;

// A folder as one queue wants it.
struct Route {
  std::string place;
  std::string name;
  uint32_t watch = kNoWatch;
  uint32_t mask = kAllEvents;  // the bits of the events that the queue wants
  std::vector<std::string> ignore;
  EventSink* queue = nullptr;
};

// One queue that wants to hear of a path.
struct Hearer {
  EventSink* queue;
  uint32_t mask;
  std::string_view place;  // of its folder; of several the outermost one
  std::string_view name;
};

class Routes {
 public:
  void Add(const Route& route);

  // Where a queue is, whose lines are nobody's news; nor is its twin with ".tmp".
  void AddQueue(const std::string& path);

  // Whether entries of the directory `dir` can concern this watch at all: also those of a folder's parent.
  bool MayHold(uint32_t watch, std::string_view dir) const;

  // Whether this watch is to speak of `path`.
  bool Takes(uint32_t watch, std::string_view path) const;

  // The queues that want to hear of `path`, one hearer each, in an order that only depends on the queues.
  void Hear(std::string_view path, std::vector<Hearer>& hearers) const;

  // The queues of all folders that this watch hears.
  std::vector<Hearer> HearersOf(uint32_t watch) const;

  // The place of the nearest folder above `path` that takes it; empty where there is none.
  std::string_view FolderAbove(std::string_view path) const;

 private:
  struct Wish {
    std::string name;
    uint32_t mask;
    std::vector<uint32_t> ignore;  // numbers of names
    EventSink* queue;
  };
  struct Folder {
    uint32_t watch = kNoWatch;
    std::vector<Wish> wishes;
  };
  class Climb;

  bool TakesBelow(uint32_t watch, std::string_view path) const;

  std::unordered_map<std::string, Folder, PathHash, std::equal_to<>> folders_;  // by place, "/" as empty
  PathSet parents_;
  PathSet queues_;
  std::unordered_map<std::string, uint32_t, PathHash, std::equal_to<>> ignored_;  // each name's number
};

}  // namespace quarrox::notifyd
