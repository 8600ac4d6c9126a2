// The indexes that the engine knows, kept on disk: one file each, replaced as a whole.
#pragma once

#include <map>
#include <string>

#include <json/json.h>

namespace quarrox::elasticd {

// What an index was made with. The settings and the event handler are kept for whoever asks, and are not used.
struct IndexRecord {
  std::string id;
  std::string path;  // of its directory
  Json::Value settings;
  Json::Value mappings;
  Json::Value event_handler;
  bool paused = false;
};

// Not thread-safe.
class Registry {
 public:
  // Reads what is in the directory, which is made where it is missing. A file that cannot be read is logged and left.
  // Throws Error 502 where the directory cannot be made.
  explicit Registry(const std::string& directory);

  const std::map<std::string, IndexRecord>& records() const { return records_; }

  // Throw Error 617 where the disk refuses; the record is then as it was.
  void Save(const IndexRecord& record);
  void Remove(const std::string& id);

  // Saves a record that had another identifier.
  void Replace(const std::string& old_id, const IndexRecord& record);

 private:
  std::string PathOf(const std::string& id) const;

  const std::string directory_;
  std::map<std::string, IndexRecord> records_;
};

}  // namespace quarrox::elasticd
