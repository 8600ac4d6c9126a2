#include <algorithm>
#include <filesystem>
#include <system_error>
#include <utility>

#include "common/comm.h"
#include "common/error.h"
#include "common/file.h"
#include "common/json.h"
#include "common/sdk/share.h"
#include "common/strings.h"
#include "doctor.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/folder_pauses.h"

namespace fs = std::filesystem;

namespace quarrox::ctl::doctor {
namespace {

// The name under which the library registers its configurations.
constexpr char kApplication[] = "fileindex";

// False where the file is none of the index's, or cannot be read: to the daemon it is none either.
bool Read(const std::string& file, std::string& queue, MonitorConfig& config) {
  Json::Value object;
  if (!fromFile(object, file) || !object.isObject() || object["application"] != kApplication) return false;
  if (!object["queue"].isString() || !object["config"].isArray()) return false;
  config.file = file;
  queue = object["queue"].asString();
  for (const Json::Value& folder : std::as_const(object)["config"]) {
    if (folder.isObject() && folder["path"].isString()) config.directories.insert(folder["path"].asString());
  }
  return true;
}

std::string ShareOf(const fileindex::Folder& folder) {
  try {
    return folder.GetShare();
  } catch (const Error&) {
    return "";
  }
}

}  // namespace

const std::set<std::string>& Machine::share_names() {
  if (!share_names_) share_names_ = sdk::SDKShare::Enum();
  return *share_names_;
}

const std::map<std::string, Machine::FolderList>& Machine::folders() {
  if (folders_) return *folders_;
  std::map<std::string, FolderList> folders;
  for (const auto& folder : fileindex::FolderMgr().GetFolders()) folders[ShareOf(*folder)].push_back(folder);
  return folders_.emplace(std::move(folders));
}

bool Machine::IsPaused(const std::string& share) {
  const FolderList& list = folders().at(share);
  const fileindex::FolderPauses pauses;
  return std::none_of(list.begin(), list.end(), [&](const auto& folder) { return pauses.IsServed(*folder); });
}

bool Machine::IsServed(const std::string& share) {
  if (share_names().count(share) == 0) return false;
  const std::string directory = Share(share).GetPath();
  return Basename(directory) == share && IsDirExist(directory, false);
}

const std::vector<std::string>& Machine::served() {
  if (served_) return *served_;
  std::vector<std::string> served;
  for (const auto& [share, list] : folders()) {
    if (IsServed(share)) served.push_back(share);
  }
  return served_.emplace(std::move(served));
}

DaemonAnswer Machine::AskEngine(const Json::Value& request) {
  if (engine_failure_) throw Error(*engine_failure_);
  try {
    return Exchange(kElasticdSocketPath, request);
  } catch (const Error& error) {
    engine_failure_.emplace(error);
    throw;
  }
}

const std::map<std::string, MonitorConfig>& Machine::monitors() {
  if (monitors_) return *monitors_;
  std::map<std::string, MonitorConfig> monitors;
  damaged_monitors_.clear();
  std::error_code error;
  for (fs::directory_iterator file(kMonitorDirectory, error), end; !error && file != end; file.increment(error)) {
    std::string queue;
    MonitorConfig config;
    const std::string name = file->path().string();
    if (!name.ends_with(".json")) continue;
    if (Read(name, queue, config)) {
      monitors[queue] = config;
    } else if (Json::Value object; IsFileExist(name) && !fromFile(object, name)) {
      damaged_monitors_.push_back(name);
    }
  }
  if (error && error != std::errc::no_such_file_or_directory) {
    throw Error(kErrSystem, std::string("reading ") + kMonitorDirectory + " failed, reason=" + error.message());
  }
  return monitors_.emplace(std::move(monitors));
}

const std::set<std::string>& Machine::queues() {
  if (queues_) return *queues_;
  std::set<std::string> queues;
  for (const std::string& name : share_names()) queues.insert(Share(name).GetQueuePath());
  return queues_.emplace(std::move(queues));
}

// The places of all shares of a volume lie in one directory.
void Machine::FindStraysBeside(const sdk::SDKShare& share) {
  const std::string queue_name = '/' + Basename(share.GetQueuePath());
  std::error_code error;
  for (fs::directory_iterator place(Dirname(Dirname(share.GetQueuePath())), error), end; !error && place != end;
       place.increment(error)) {
    if (queues().count(place->path().string() + queue_name) != 0) continue;
    const std::string name = place->path().filename().string();
    Stray& stray = (*strays_)[name];
    stray.share_path = Dirname(share.GetPath()) + '/' + name;
    stray.database = place->path().string() + '/' + Basename(share.GetDBPath());
  }
}

const std::map<std::string, Stray>& Machine::strays() {
  if (strays_) return *strays_;
  strays_.emplace();
  for (const auto& [queue, config] : monitors()) {
    if (queues().count(queue) != 0) continue;
    const std::string place = Dirname(queue);  // VOLUME/@fileindex/NAME
    const std::string name = Basename(place);
    (*strays_)[name].share_path = Dirname(Dirname(place)) + "/" + name;
  }
  std::set<std::string> volumes;
  for (const std::string& name : share_names()) {
    if (volumes.insert(Dirname(Share(name).GetPath())).second) FindStraysBeside(Share(name));
  }
  return *strays_;
}

}  // namespace quarrox::ctl::doctor
