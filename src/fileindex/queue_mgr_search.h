// Looking for one event in a queue, at a small part of what folding it costs.
#pragma once

#include <string>
#include <string_view>

#include <boost/function.hpp>

#include "common/queue_file.h"
#include "fileindex/optree_event.h"

namespace quarrox::fileindex {

// Whether `path` is `base` or lies below it, by whole components. Doubled and trailing slashes do not count.
bool IsAtOrBelow(std::string_view path, std::string_view base);

// A queue file that is looked through once, from its beginning.
class QueueSearch {
 public:
  // Throws Error 502 where the file is there but cannot be opened.
  explicit QueueSearch(const std::string& queue_path);

  // Whether the file is missing.
  bool missing() const { return missing_; }

  // Whether there is an event that `accepts` accepts. It sees each event of a form that is read quickly, and each other
  // one after a full parse; a line that is no event is logged and skipped. Throws Error 502 where the file cannot be
  // read to its end, and what `accepts` throws.
  bool Find(const boost::function<bool(const EventView&)>& accepts);

 private:
  void CheckError() const;

  QueueLines lines_;
  bool missing_;
};

}  // namespace quarrox::fileindex
