// Events of our own: what is to be indexed or looked at anew, written into a share's event queue among the events of
// the file system.
#pragma once

#include <map>
#include <memory>
#include <string>

#include <json/json.h>

#include "common/export.h"
#include "common/sdk/open_shares.h"

namespace quarrox::fileindex {

using sdk::OpenShares;

// Queues the custom events of one operation: opens each share once and reads its queue once. What it finds then is what
// is pending for all later events, together with what it queued itself. Lives for one operation. Not thread-safe.
class QUARROX_API CustomEvents {
 public:
  // `shares` must outlive this object.
  explicit CustomEvents(OpenShares& shares);
  ~CustomEvents();
  CustomEvents(const CustomEvents&) = delete;
  CustomEvents& operator=(const CustomEvents&) = delete;

  // As AddCustomEvent.
  void Add(int kind, const std::string& full_path, const std::string& path_old, const Json::Value& data);

 private:
  class Queue;
  Queue& QueueOf(const std::string& share);

  OpenShares& shares_;
  std::map<std::string, std::unique_ptr<Queue>> queues_;  // by share
};

// Appends an event about a full path to the queue of the share that holds it: `kind` is one of EventBit. Does nothing
// where the share cannot be indexed now, or a reindex of the path or of a directory above it is pending already.
//
// Throws Error 502 where no share holds the path or the queue cannot be read or written, 800 where the share is gone,
// 506 where the queue's lock cannot be had within a minute. So that an event that was lost shows in the status of the
// share's folders, the share's status flag kShareNeedReindex is then set, if it is known which share it is.
// Thread-safe.
QUARROX_API void AddCustomEvent(int kind, const std::string& full_path, const std::string& path_old,
                                const Json::Value& data);

}  // namespace quarrox::fileindex
