// Turns batches of fanotify's events into lines that a reader can replay.
//
// fanotify names a directory by handle, and by the time that is looked up the directory may have moved; events on one
// name are merged, so that their order is lost. Hence:
//
// * The renames of a batch are written first, in their order. One with a single end inside the tree is a deletion or a
// creation.
//
// * Then each touched name is looked at, and what is true now is written: that needs no order.
//
// * The ends of a rename are looked at too. Where the disk is what the replayed rename says, nothing more is written.
//
// * A rename with an end below a directory that moved in the same batch has no exact paths. It is not written as a
// rename: both of its ends are written as looked at, a directory as created, so that the reader looks below it. The
// same follows a rename whose source the reader may know as something else.
//
// * A directory may move between its events and their lookup. Then its rename is in the next batch, as the kernel's
// queue is emptied before each lookup, and what was written about paths below its ends may be wrong: it was true of
// another directory, and the reader moves it along. So names of the batch before that are below a moved directory are
// looked at again, both where their directory is now and where the reader has what it was told.
//
// Whatever cannot be told becomes a line about lost events. Not thread-safe.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "dir_handles.h"
#include "event.h"
#include "event_batch.h"
#include "move_log.h"
#include "scope.h"

namespace quarrox::notifyd {

class Resolver {
 public:
  Resolver(const Scope& scope, DirHandles& handles, EventSink& sink) : scope_(scope), handles_(handles), sink_(sink) {}

  // To be called with every batch, in order.
  void Resolve(std::unique_ptr<EventBatch> batch);

  // The kernel's queue was found empty after the last batch: nothing that was written is in doubt.
  void Settle();

 private:
  using Place = TouchedDir::Place;

  // A path that was looked at as a path, and not as a name in a directory.
  struct Look {
    std::string path;
    bool is_dir;           // what the reader was told about it was a directory
    bool attributes_only;  // and no more than its attributes
  };

  TouchedDir& Locate(uint32_t dir);
  bool PathOf(uint32_t touch, std::string& path);
  void LogMoves();
  void WriteRename(const Rename& rename);
  void WriteExact(const Rename& rename);
  void CarryBits(const Rename& rename);
  void MarkTold(uint32_t touch, bool arrived);
  bool IsDoubtful(const Rename& rename) const;
  bool IsShifted(uint32_t touch);
  void MarkInexact(const Rename& rename);
  void TakeUpPrevious();
  std::vector<bool> MovedSincePrevious();
  void TakeUp(uint32_t touch);
  void LookAfter(uint32_t previous_touch);
  void LookWhereReaderHas(const Look& look);
  void WriteLook(const Look& look);
  void WriteDir(uint32_t dir);
  void WriteName(const TouchedName& touch, int dir_fd, const std::string& path);
  void WriteGone(const TouchedName& touch, const std::string& path);
  void WriteFound(const TouchedName& touch, bool is_dir, const std::string& path);
  void Write(uint32_t bit, bool is_dir, const std::string& path) { sink_.Add({bit, is_dir, path, {}}); }

  const Scope& scope_;
  DirHandles& handles_;
  EventSink& sink_;
  std::unique_ptr<EventBatch> batch_;
  std::unique_ptr<EventBatch> previous_;
  MoveLog moves_;
  std::vector<Look> looks_;
  std::vector<Look> previous_looks_;
  bool unverified_ = false;  // names of an earlier batch can no longer be looked at again
  bool lost_ = false;
};

}  // namespace quarrox::notifyd
