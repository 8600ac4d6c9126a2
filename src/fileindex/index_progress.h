// How far the indexing of a share is, as its worker tells people. One small file beside the share's database.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>

#include "common/export.h"
#include "common/sdk/share.h"

namespace quarrox::fileindex {

struct QUARROX_API IndexProgress {
  enum class State {
    kIdle,     // nothing is pending
    kWorking,  // a pass is under way
    kWaiting,  // the last pass failed for `reason`; it is tried again
  };

  State state = State::kIdle;
  int64_t pid = 0;        // of the worker; what is told holds while it runs
  int64_t since = 0;      // when this state began, in seconds since the epoch, as the next two
  int64_t updated = 0;    // when this was told
  int64_t committed = 0;  // when a pass last ended well; 0: never

  // Of the pass under way, else of the last one. Documents that were written, refreshed, moved or taken away; those
  // that could not be; and those that are left, where that is known.
  uint64_t done = 0;
  uint64_t failed = 0;
  std::optional<uint64_t> left;

  // Operations that were carried out since the file was first made, each at the number of its FileIndexOP; those of a
  // pass that is made again count again.
  std::array<uint64_t, 8> operations = {};

  std::string path;          // what is being worked on
  std::string reason;        // why it waits
  std::string held_back_by;  // what others need of the machine, so that it rests now and then: "disk" and so on

  // The file of a share, in the directory of its database.
  static std::string FileOf(const sdk::SDKShare& share);

  // Nothing where there is no such file, or none that can be read.
  static std::optional<IndexProgress> Load(const std::string& file);

  // False with errno where it cannot be written. It is not synced: what is told is worth nothing after a power cut.
  bool Save(const std::string& file) const;
};

}  // namespace quarrox::fileindex
