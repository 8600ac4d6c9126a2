// The processes that read the contents of files for this one.
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include <json/json.h>

#include "linux/content_worker.h"

namespace platform {

// The program that they run, which lies beside the code that asks: DIR/fileindex/vexocontentextract for the library, or
// a program that has its code inside, in DIR.
std::string ContentProgram();

// One process for each file that is read at the same time, as far as there are processors; who comes later waits. They
// are started when they are needed and used again. One that failed is replaced. Thread-safe.
class ContentWorkers {
 public:
  explicit ContentWorkers(std::string program, std::chrono::milliseconds time_for_file = kTimeForFile);

  // Those of this process, which end with it. A process that is forked has its own.
  static ContentWorkers& OfProcess();

  // Adds what is in a file to the fields, as ContentWorker::Receive, and throws as its constructor, too.
  void Read(const ContentFile& file, Json::Value& fields);

 private:
  class Turn;

  const std::string program_;
  const std::chrono::milliseconds time_for_file_;
  const size_t most_;
  std::mutex mutex_;
  std::condition_variable freed_;
  size_t busy_ = 0;
  std::vector<std::unique_ptr<ContentWorker>> idle_;
};

}  // namespace platform
