#include "linux/notifyd_client.h"

#include <fcntl.h>
#include <pwd.h>
#include <unistd.h>

#define XXH_INLINE_ALL
#include <xxhash.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <memory>
#include <vector>

#include "common/json.h"
#include "common/strings.h"
#include "common/unique_fd.h"
#include "linux/make_directory.h"
#include "linux/share_list.h"
#include "vexo/error.h"

namespace platform {
namespace {

using VEXO::VEXONOTIFYD::MONITOR_QUEUE_TYPE;

constexpr char kServiceUser[] = "Quarrox";

bool BadParameter() {
  VLIBCErrSet(VEXO_ERR_BAD_PARAMETER);
  return false;
}

bool SystemFailure() {
  VLIBCErrSet(VEXO_ERR_SYSTEM);
  return false;
}

const Json::Value* Member(const Json::Value& object, const std::string& key) {
  return object.find(key.data(), key.data() + key.size());
}

bool IsAbsolutePath(const Json::Value* value) {
  if (value == nullptr || !value->isString()) return false;
  const std::string path = value->asString();
  return quarrox::StringStartWith(path, "/") && path.find('\0') == std::string::npos;
}

bool IsStringList(const Json::Value& value) {
  return value.isArray() &&
         std::all_of(value.begin(), value.end(), [](const Json::Value& one) { return one.isString(); });
}

bool IsWatch(const Json::Value& value) {
  if (!value.isObject() || !IsAbsolutePath(Member(value, "path"))) return false;
  const Json::Value* mask = Member(value, "mask");
  const Json::Value* ignore = Member(value, "ignore");
  return mask != nullptr && mask->isIntegral() && (ignore == nullptr || IsStringList(*ignore));
}

bool IsConfig(const Json::Value& value) {
  if (!value.isObject() || !IsAbsolutePath(Member(value, "queue"))) return false;
  const Json::Value* watches = Member(value, "config");
  return watches != nullptr && watches->isArray() && std::all_of(watches->begin(), watches->end(), IsWatch);
}

// A name that is safe as the beginning of a file's.
bool IsApplication(const std::string& name) {
  constexpr char kAllowed[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789._-";
  return !name.empty() && name.front() != '.' && name.find_first_not_of(kAllowed) == std::string::npos;
}

std::string MonitorFile(const std::string& directory, const std::string& queue, const std::string& application) {
  char hash[17];
  snprintf(hash, sizeof(hash), "%016llx", static_cast<unsigned long long>(XXH3_64bits(queue.data(), queue.size())));
  return directory + "/" + application + "-" + hash + ".json";
}

// Nobody where the name service does not know the service user, or cannot be asked.
Owner ServiceUser() {
  std::vector<char> buffer(4096);
  passwd entry;
  passwd* found = nullptr;
  while (getpwnam_r(kServiceUser, &entry, buffer.data(), buffer.size(), &found) == ERANGE) {
    buffer.resize(buffer.size() * 2);
  }
  return found == nullptr ? Owner() : Owner{entry.pw_uid, entry.pw_gid};
}

// A volume that is not there is not made: what was written into it would be lost under the disk that belongs there.
bool IsVolumeThere(const std::string& path) {
  const std::shared_ptr<const ShareList> shares = Shares();
  if (shares == nullptr) return false;
  for (size_t end = path.find('/', 1); end != std::string::npos; end = path.find('/', end + 1)) {
    const std::string prefix = path.substr(0, end);
    if (access(prefix.c_str(), F_OK) != 0) return !shares->IsVolume(prefix);
  }
  return true;
}

// An index's queue names everybody's files, so its directory is for the service alone.
bool MakeQueueDirectory(const std::string& queue) {
  const std::string directory = quarrox::Dirname(queue);
  if (directory.empty() || access(directory.c_str(), F_OK) == 0) return true;
  return IsVolumeThere(queue) && MakeDirectory(directory, 0700, ServiceUser());
}

bool RemoveFile(const std::string& directory, const std::string& file) {
  if (unlink(file.c_str()) != 0) return errno == ENOENT;
  const quarrox::UniqueFd fd(open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  return fd && fsync(fd.get()) == 0;
}

}  // namespace

bool UpsertMonitor(const std::string& directory, const Json::Value& config, const std::string& application,
                   MONITOR_QUEUE_TYPE type) {
  if (!IsApplication(application) || !IsConfig(config)) return BadParameter();
  Json::Value file;
  file["application"] = application;
  file["type"] = static_cast<int>(type);
  file["queue"] = config["queue"];
  file["config"] = config["config"];
  const std::string queue = config["queue"].asString();
  const bool stored = MakeQueueDirectory(queue) && MakeDirectory(directory, 0755) &&
                      quarrox::toFile(file, MonitorFile(directory, queue, application));
  return stored || SystemFailure();
}

bool DeleteMonitor(const std::string& directory, const std::string& queue_path, const std::string& application) {
  if (!IsApplication(application)) return BadParameter();
  return RemoveFile(directory, MonitorFile(directory, queue_path, application)) || SystemFailure();
}

}  // namespace platform

namespace VEXO::VEXONOTIFYD {

MonitorQueue::MonitorQueue(const Json::Value& config) : config_(config) {}

bool MonitorQueue::Upsert(const MonitorQueue& queue, const std::string& application, MONITOR_QUEUE_TYPE type) {
  return platform::UpsertMonitor(platform::kMonitorDirectory, queue.config_, application, type);
}

bool MonitorQueue::Delete(const std::string& queue_path, const std::string& application, MONITOR_QUEUE_TYPE) {
  return platform::DeleteMonitor(platform::kMonitorDirectory, queue_path, application);
}

}  // namespace VEXO::VEXONOTIFYD
