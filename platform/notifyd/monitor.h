// What is to be watched for one queue.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include <json/json.h>

namespace quarrox::notifyd {

struct MonitoredFolder {
  std::string path;                 // absolute, without spare slashes; events bear it
  uint32_t mask = 0;                // bits of the events that are wanted
  std::vector<std::string> ignore;  // names that are left out with all that is below them
};

struct Monitor {
  std::string queue;
  std::vector<MonitoredFolder> folders;
};

// Reads { "queue": path, "config": [{ "path": path, "mask": number, "ignore": array of names, may be absent }] }, paths
// absolute; members beside these mean nothing here. Throws Error 120, whose reason says what is wrong.
Monitor ParseMonitor(const Json::Value& value);

}  // namespace quarrox::notifyd
