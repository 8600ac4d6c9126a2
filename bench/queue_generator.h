// Queues for the benchmarks: event lines as the notification daemon writes them.
#pragma once

#include <cstddef>
#include <cstdint>
#include <fstream>
#include <random>
#include <string>
#include <vector>

namespace quarrox::bench {

// Writes event lines into a file and counts them.
class QueueWriter {
 public:
  explicit QueueWriter(const std::string& path, bool other_order = false)
      : stream_(path, std::ios::trunc), other_order_(other_order) {}

  void Event(uint32_t event, const std::string& path, bool is_dir = false, const std::string& path_old = "");
  size_t lines() const { return lines_; }

 private:
  std::ofstream stream_;
  bool other_order_;
  size_t lines_ = 0;
};

enum class Queue {
  kUsual,
  kOtherKeyOrder,  // the same events, their members in another order
  kNoLocality,     // every event concerns any file or directory: what no machine does, and what caches like least
};

// A working day on a file server: trees of directories with names of usual length; files that are created, written
// several times, saved by way of a temporary name, renamed, re-attributed, deleted; about 8 % of the lines are renames,
// and a line in 1000 renames a directory. About one distinct path for five lines. Returns the number of distinct paths.
size_t WriteRealisticQueue(const std::string& path, size_t lines, Queue kind = Queue::kUsual);

// The yardstick: jsoncpp parses every line of a queue, and nothing else is done with it.
void ParseLines(const std::string& queue);

}  // namespace quarrox::bench
