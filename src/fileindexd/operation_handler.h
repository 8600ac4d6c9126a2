// What a share's pending operations are handed to.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "fileindex/optree.h"

namespace quarrox::fileindexd {

// What a pass has done so far, as fileindex::IndexProgress tells it.
struct Tally {
  uint64_t done = 0;
  uint64_t failed = 0;
  std::optional<uint64_t> left = std::nullopt;  // of the operation that is being handled
  std::string path = {};                        // what is being worked on
};

// Ends a pass that is to be run again at once, because what it goes by has changed. No Error: nobody on the way is to
// handle it.
struct StartAnew {};

// One object serves one share in one process; not thread-safe. A pass begins, hands over each operation of the queue in
// order of acceptance, and commits. A pass that ends early, for whatever reason, is run again from its beginning, so an
// operation may come more than once.
class OperationHandler {
 public:
  // Called between any two files, so that a signal ends a long walk soon: what it throws ends the pass and is to be let
  // through. True where the settings may have changed.
  using CheckPoint = std::function<bool()>;

  virtual ~OperationHandler() = default;

  // Whether a pass is due although no operation is pending. Throws where that cannot be told.
  virtual bool HasWork() = 0;

  // When there will be such a pass, in seconds since the epoch; nothing where none is known of.
  virtual std::optional<int64_t> NextWork() const = 0;

  // Each of these throws where the work cannot be done now; the pass is then tried again later, or at once for
  // StartAnew.
  virtual void Begin(const CheckPoint& check_point) = 0;
  virtual void Handle(const fileindex::OP& operation) = 0;

  // When this returns, everything handled since Begin is durable.
  virtual void Commit() = 0;

  // Of the pass under way, else of the last one.
  virtual const Tally& tally() const = 0;
};

}  // namespace quarrox::fileindexd
