// The search engine: its indexes and the commands that it takes.
#pragma once

#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>

#include <json/json.h>

#include "answer.h"
#include "common/error.h"
#include "common/peer.h"
#include "index.h"
#include "recovery.h"
#include "registry.h"

namespace quarrox::elasticd {

// Thread-safe.
class Engine {
 public:
  // Knows the indexes that the registry in `data_directory` has, and begins to check those that were not closed in
  // order. Throws Error 502 where the directory cannot be used.
  explicit Engine(const std::string& data_directory);
  ~Engine();

  // Carries out a request and makes the answer to it, whatever it is, and returns what is left to do after the answer,
  // which may be nothing. Neither throws. `make_way` is called before what may take long.
  using MakeWay = std::function<void()>;
  using Rest = std::function<void()>;
  Rest Handle(const std::string& request, Answer& answer, const MakeWay& make_way);

  // Answers a search of somebody who may do nothing else, as that user. Throws Error where it is refused; the answer is
  // then of no use.
  void HandleSearch(const Identity& user, const std::string& request, Answer& answer);

  // The answer to a request that is refused.
  static std::string Refusal(ErrorCode code, const std::string& reason);

  // Commits and closes all indexes. No request is to be handled meanwhile.
  void Close();

 private:
  using IndexPointer = std::shared_ptr<Index>;
  using Method = void (Engine::*)(const Json::Value& data, Answer& answer);
  struct Command;

  static const std::map<std::string, Command>& Commands();

  Rest Upsert(Json::Value& data, Answer& answer, const MakeWay& make_way);
  void HandleCompound(const Json::Value& items, Answer& answer);
  void Execute(const Json::Value& request, Answer& answer);
  IndexPointer Find(const std::string& id);
  IndexPointer Get(const Json::Value& data);

  void IndexCreate(const Json::Value& data, Answer& answer);
  void IndexDelete(const Json::Value& data, Answer& answer);
  void IndexPause(const Json::Value& data, Answer& answer);
  void IndexResume(const Json::Value& data, Answer& answer);
  void IndexConfigSet(const Json::Value& data, Answer& answer);
  void DocumentUpsert(const Json::Value& data, Answer& answer);
  void DocumentSet(const Json::Value& data, Answer& answer);
  void DocumentDelete(const Json::Value& data, Answer& answer);
  void DocumentDeleteByQuery(const Json::Value& data, Answer& answer);
  void DocumentGetByQuery(const Json::Value& data, Answer& answer);
  void Commit(const Json::Value& data, Answer& answer);
  void ListTermSuggestions(const Json::Value& data, Answer& answer);
  void UpdateTermSuggestion(const Json::Value& data, Answer& answer);

  bool IsTaken(const std::string& path, const std::string& id) const;

  std::mutex lifecycle_mutex_;  // one lifecycle command at a time; taken before the other
  Registry registry_;           // under the former

  std::mutex indexes_mutex_;
  std::map<std::string, IndexPointer> indexes_;

  Recovery recovery_;
};

// Checks the database in a directory for who has started a process for it: 0 where it is sound, 1 where it is not.
int CheckDatabase(const std::string& directory);

}  // namespace quarrox::elasticd
