// The client of the notification daemon: which changes it writes into which queue.
#pragma once

#include <string>

#include <json/json.h>

namespace VEXO::VEXONOTIFYD {

// Whose queue it is; part of a configuration's identity.
enum MONITOR_QUEUE_TYPE { MONITOR_QUEUE_TYPE_APPLICATION = 0 };

// One monitor configuration, a plain value. Its object:
//   "queue"   string, the path of the queue file
//   "config"  array of { "path": a directory, "mask": bits of events, "ignore": names whose subtrees are left out }
// Thread-safe as far as the value is not shared; processes may change the same configuration at once: one of them wins,
// whole.
class MonitorQueue {
 public:
  // Takes the object as it stands; Upsert is what refuses a bad one.
  explicit MonitorQueue(const Json::Value& config);

  // Registers a configuration for an application, in the place of an earlier one for the same queue, and makes the
  // queue's directory where it is missing; the daemon then follows. False where the object is malformed
  // or the application's name is no file name (VEXO_ERR_BAD_PARAMETER) or cannot be stored (VEXO_ERR_SYSTEM and errno),
  // the earlier one then untouched.
  static bool Upsert(const MonitorQueue& queue, const std::string& application, MONITOR_QUEUE_TYPE type);

  // Takes a configuration back; what is in the queue stays. True also where there was none. False where that fails
  // (VEXO_ERR_SYSTEM and errno, or VEXO_ERR_BAD_PARAMETER for such a name).
  static bool Delete(const std::string& queue_path, const std::string& application, MONITOR_QUEUE_TYPE type);

 private:
  Json::Value config_;
};

}  // namespace VEXO::VEXONOTIFYD
