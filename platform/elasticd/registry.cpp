#include "registry.h"

#include <sys/stat.h>
#include <unistd.h>
#define XXH_INLINE_ALL
#include <xxhash.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <filesystem>

#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "error_code.h"

namespace quarrox::elasticd {
namespace {

IndexRecord Parse(const Json::Value& json) {
  IndexRecord record;
  GetJsonValue(record.id, json, "id", true);
  GetJsonValue(record.path, json, "path", true);
  GetJsonValue(record.settings, json, "settings", false);
  GetJsonValue(record.mappings, json, "mappings", true);
  GetJsonValue(record.event_handler, json, "event_handler", false);
  GetJsonValue(record.paused, json, "paused", false);
  return record;
}

Json::Value Format(const IndexRecord& record) {
  Json::Value json(Json::objectValue);
  json["id"] = record.id;
  json["path"] = record.path;
  json["settings"] = record.settings;
  json["mappings"] = record.mappings;
  json["event_handler"] = record.event_handler;
  json["paused"] = record.paused;
  return json;
}

}  // namespace

Registry::Registry(const std::string& directory) : directory_(directory + "/indexes") {
  for (const std::string& path : {directory, directory_}) {
    if (mkdir(path.c_str(), 0700) != 0 && errno != EEXIST) {
      throw Error(kErrSystem, "mkdir " + path + " failed, reason=" + strerror(errno));
    }
  }
  std::error_code error;
  for (const auto& file : std::filesystem::directory_iterator(directory_, error)) {
    if (file.path().extension() != ".json") continue;
    Json::Value json;
    try {
      if (!fromFile(json, file.path().string())) throw Error(kErrJsonLoad, "it is no JSON text");
      IndexRecord record = Parse(json);
      records_[record.id] = std::move(record);
    } catch (const Error& failure) {
      errno = 0;
      QUARROX_LOG_FAILURE("The index of %s is left out, reason: %.1024s", file.path().c_str(), failure.reason.c_str());
    }
  }
  if (error) throw Error(kErrSystem, "reading " + directory_ + " failed, reason=" + error.message());
}

// An identifier holds a share's name, which may be longer than a file's with all that cannot stand in one.
std::string Registry::PathOf(const std::string& id) const {
  const XXH128_hash_t hash = XXH3_128bits(id.data(), id.size());
  char name[40];
  snprintf(name, sizeof(name), "%016llx%016llx.json", static_cast<unsigned long long>(hash.high64),
           static_cast<unsigned long long>(hash.low64));
  return directory_ + '/' + name;
}

void Registry::Save(const IndexRecord& record) {
  if (!toFile(Format(record), PathOf(record.id))) {
    throw Error(kInputOutput, "writing " + PathOf(record.id) + " failed, reason=" + strerror(errno));
  }
  records_[record.id] = record;
}

void Registry::Remove(const std::string& id) {
  if (unlink(PathOf(id).c_str()) != 0 && errno != ENOENT) {
    throw Error(kInputOutput, "unlink " + PathOf(id) + " failed, reason=" + strerror(errno));
  }
  records_.erase(id);
}

void Registry::Replace(const std::string& old_id, const IndexRecord& record) {
  Save(record);
  if (record.id != old_id) Remove(old_id);
}

}  // namespace quarrox::elasticd
