// What a share's pending operations are handed to.
#pragma once

#include <cstddef>
#include <memory>
#include <string>

#include "fileindex/optree.h"

namespace quarrox::fileindexd {

// One object serves one share in one process; not thread-safe. A pass over the queue hands it each operation in order
// of acceptance and then commits. A pass that ends early, for whatever reason, is run again from its beginning, so an
// operation may come more than once.
class OperationHandler {
 public:
  virtual ~OperationHandler() = default;

  // Throws where the operation cannot be carried out now; the pass is then tried again later.
  virtual void Handle(const fileindex::OP& operation) = 0;

  // When this returns, everything handled since the last commit is durable. Throws where it is not.
  virtual void Commit() = 0;
};

// Writes each operation to the system log, and how many they were.
std::unique_ptr<OperationHandler> MakeLoggingHandler(const std::string& share);

}  // namespace quarrox::fileindexd
