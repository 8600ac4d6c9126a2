// The files through which the notification daemon learns what to watch: one JSON file a monitor configuration, in one
// directory, which the daemon watches.
//
//   "application"  string     "type"    number     "queue"  string, the queue file's path
//   "config"       array of { "path": string, "mask": number, "ignore": array of strings, may be absent }
//
// A file is written whole and renamed into place. Its name is made of the application and of the queue's path, so that
// a queue has one configuration an application. Thread-safe.
#pragma once

#include <string>

#include <json/json.h>

#include "vexo/notifyd.h"

namespace platform {

inline constexpr char kMonitorDirectory[] = "/var/lib/vexonotifyd";

// MonitorQueue's two calls, on the files of any directory; results and errors are theirs.
bool UpsertMonitor(const std::string& directory, const Json::Value& config, const std::string& application,
                   VEXO::VEXONOTIFYD::MONITOR_QUEUE_TYPE type);
bool DeleteMonitor(const std::string& directory, const std::string& queue_path, const std::string& application);

}  // namespace platform
