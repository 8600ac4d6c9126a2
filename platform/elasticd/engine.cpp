#include "engine.h"

#include <algorithm>
#include <exception>
#include <optional>
#include <utility>
#include <vector>

#include "common/json.h"
#include "common/search_socket.h"
#include "database.h"
#include "error_code.h"
#include "index_files.h"

namespace quarrox::elasticd {
namespace {

// Codes that callers take for the state of the whole engine or index, and wait: they are answered for a compound
// request as a whole.
bool ConcernsAll(ErrorCode code) {
  return code == kIndexOpening || code == kIndexRecovering || code == kIndexPaused || code == kOutOfMemory ||
         code == kTooManyRequests;
}

const Json::Value& Member(const Json::Value& object, const char* name) {
  if (!object.isMember(name)) throw Error(kBadArgument, std::string("The request lacks \"") + name + "\"");
  return object[name];
}

std::string Text(const Json::Value& object, const char* name) {
  const Json::Value& value = Member(object, name);
  if (!value.isString() || value.asString().empty()) {
    throw Error(kBadArgument, std::string("\"") + name + "\" must be a text, not " + toString(value));
  }
  return value.asString();
}

const Json::Value& Object(const Json::Value& object, const char* name) {
  const Json::Value& value = Member(object, name);
  if (!value.isObject()) throw Error(kBadArgument, std::string("\"") + name + "\" must be an object");
  return value;
}

uint64_t Number(const Json::Value& object, const char* name, uint64_t otherwise) {
  if (!object.isMember(name)) return otherwise;
  if (!object[name].isUInt64()) throw Error(kBadQuery, std::string("\"") + name + "\" must be a number from 0 on");
  return object[name].asUInt64();
}

// A path that names the same directory in one way only.
std::string Directory(const Json::Value& object) {
  std::string path = Text(object, "path");
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  if (path.front() != '/' || path == "/") throw Error(kBadArgument, "\"path\" must be the full path of a directory");
  return path;
}

SearchRequest ParseSearch(const Json::Value& query) {
  SearchRequest search;
  if (!query.isMember("qsl")) throw Error(kBadQuery, "The query lacks \"qsl\"");
  search.qsl = query["qsl"];
  search.from = Number(query, "from", 0);
  search.size = Number(query, "size", ~uint64_t{0});
  if (query.isMember("sort")) {
    if (!query["sort"].isArray()) throw Error(kBadQuery, "\"sort\" must be an array");
    search.sort = query["sort"];
  }
  search.suggest = query["suggest"].isBool() && query["suggest"].asBool();
  if (!query.isMember("load_field")) return search;
  const Json::Value& names = query["load_field"];
  if (!names.isArray()) throw Error(kBadQuery, "\"load_field\" must be an array of names");
  for (const Json::Value& name : names) {
    if (!name.isString()) throw Error(kBadQuery, "\"load_field\" must be an array of names");
    search.load_fields.push_back(name.asString());
  }
  return search;
}

// The user whose search it is to be; nothing for root, who may read everything.
std::optional<Identity> ParseUser(const Json::Value& data) {
  if (!data.isMember("as")) return std::nullopt;
  const std::string name = Text(data, "as");
  const std::optional<Identity> user = FindIdentity(name);
  if (!user) throw Error(kBadArgument, "There is no user " + name);
  return user->user == 0 ? std::nullopt : user;
}

constexpr char kUpsert[] = "document_upsert_by_id";
constexpr char kSearch[] = "document_get_by_query";

std::string Failure(const Error& error) {
  return Engine::Refusal(error.code, error.reason);
}

// Runs `work`, whose exceptions all become Errors.
template <typename Work>
void AsErrors(Work work) {
  try {
    work();
  } catch (const Error&) {
    throw;
  } catch (const std::bad_alloc&) {
    throw Error(kInputOutput, "There is not enough memory for this request");
  } catch (const std::exception& error) {
    throw Error(kMalformedRequest, error.what());
  }
}

}  // namespace

struct Engine::Command {
  Method method;
  bool has_result;  // appends the value of "data", perhaps with members that follow it
};

const std::map<std::string, Engine::Command>& Engine::Commands() {
  static const std::map<std::string, Command> commands = {
      {"index_create", {&Engine::IndexCreate, false}},
      {"index_delete", {&Engine::IndexDelete, false}},
      {"index_pause", {&Engine::IndexPause, false}},
      {"index_resume", {&Engine::IndexResume, false}},
      {"index_config_set", {&Engine::IndexConfigSet, false}},
      {kUpsert, {&Engine::DocumentUpsert, false}},
      {"document_set_by_id", {&Engine::DocumentSet, false}},
      {"document_del_by_id", {&Engine::DocumentDelete, false}},
      {"document_del_by_query", {&Engine::DocumentDeleteByQuery, false}},
      {kSearch, {&Engine::DocumentGetByQuery, true}},
      {"commit", {&Engine::Commit, false}},
      {"list_term_sugg_db", {&Engine::ListTermSuggestions, true}},
      {"update_term_suggestion", {&Engine::UpdateTermSuggestion, false}},
  };
  return commands;
}

Engine::Engine(const std::string& data_directory) : registry_(data_directory) {
  std::vector<Recovery::Job> jobs;
  for (const auto& [id, record] : registry_.records()) {
    const auto index = std::make_shared<Index>(record.path, record.mappings, record.paused);
    indexes_[id] = index;
    if (record.paused || !index->NeedsRecovery()) continue;
    index->BeginRecovery();
    jobs.push_back({IndexFiles(record.path).Database(), [index](bool sound) { index->EndRecovery(sound); }});
  }
  recovery_.Start(std::move(jobs));
}

Engine::~Engine() = default;

std::string Engine::Refusal(ErrorCode code, const std::string& reason) {
  Json::Value response(Json::objectValue);
  response["success"] = false;
  response["error"]["code"] = static_cast<int>(code);
  response["error"]["msg"] = reason;
  return toString(response);
}

void Engine::Close() {
  recovery_.Stop();
  const std::lock_guard lock(indexes_mutex_);
  for (const auto& [id, index] : indexes_) index->Close();
}

Engine::Rest Engine::Handle(const std::string& request, Answer& answer, const MakeWay& make_way) {
  Rest rest;
  try {
    AsErrors([&] {
      Json::Value parsed;
      if (!fromString(parsed, request)) throw Error(kMalformedRequest, "The request is no JSON text");
      if (!parsed.isObject()) throw Error(kMalformedRequest, "The request must be an object");
      if (parsed["command"] == kUpsert && parsed["data"].isObject() && !parsed.isMember("compound")) {
        rest = Upsert(parsed["data"], answer, make_way);
        return;
      }
      make_way();
      if (parsed.isMember("compound")) {
        HandleCompound(parsed["compound"], answer);
      } else {
        Execute(parsed, answer);
      }
    });
  } catch (const Error& error) {
    answer.Clear();
    answer.Append(Failure(error));
  }
  return rest;
}

void Engine::HandleSearch(const Identity& user, const std::string& request, Answer& answer) {
  AsErrors([&] {
    Json::Value parsed;
    if (!fromString(parsed, request) || !parsed.isObject() || !parsed["data"].isObject()) {
      throw Error(kMalformedRequest, "A request is an object with \"command\" and \"data\"");
    }
    if (parsed["command"] != kSearch)
      throw Error(kUnknownCommand, std::string("Users may ask for ") + kSearch + " only");
    const Json::Value& data = parsed["data"];
    SearchRequest search = ParseSearch(Object(data, "query"));
    const std::optional<Identity> named = data.isMember("as") ? FindIdentity(Text(data, "as")) : user;
    if (!named || named->user != user.user) throw Error(kBadArgument, "Only root may search as another user");
    if (!data["query"].isMember("size")) search.size = kMostHitsOfUsers - std::min(search.from, kMostHitsOfUsers);
    if (search.from > kMostHitsOfUsers || search.size > kMostHitsOfUsers - search.from) {
      throw Error(kBadQuery, "Ask for no more than the first " + std::to_string(kMostHitsOfUsers) + " hits");
    }
    if (user.user != 0) search.as = user;
    answer.Append("{\"success\":true,\"data\":");
    Get(data)->Find(search, answer);
    answer.Append("}");
  });
}

// The one command that comes by the thousand: it is answered as soon as it cannot be refused any more, so that the
// client goes on to the next document while this one is indexed.
Engine::Rest Engine::Upsert(Json::Value& data, Answer& answer, const MakeWay& make_way) {
  const IndexPointer index = Get(data);
  const std::string path = Text(data, "doc_id");
  Object(data, "data");
  index->Accept(path, data["data"], make_way);
  answer.Append("{\"success\":true}");
  return [index, &make_way] { index->Settle(make_way); };
}

void Engine::HandleCompound(const Json::Value& items, Answer& answer) {
  if (!items.isArray()) throw Error(kMalformedRequest, "\"compound\" must be an array of requests");
  answer.Append("{\"success\":true,\"data\":[");
  bool failed = false;
  bool first = true;
  for (const Json::Value& item : items) {
    if (!std::exchange(first, false)) answer.Append(",");
    const uint64_t begin = answer.size();
    try {
      AsErrors([&] { Execute(item, answer); });
    } catch (const Error& error) {
      if (ConcernsAll(error.code)) throw;
      failed = true;
      answer.Cut(begin);
      answer.Append(Failure(error));
    }
  }
  answer.Append(failed ? "],\"has_fail\":true}" : "],\"has_fail\":false}");
}

void Engine::Execute(const Json::Value& request, Answer& answer) {
  if (!request.isObject() || !request["command"].isString()) {
    throw Error(kMalformedRequest, "A request is an object with \"command\" and \"data\"");
  }
  const std::string name = request["command"].asString();
  const auto command = Commands().find(name);
  if (command == Commands().end()) throw Error(kUnknownCommand, "There is no command \"" + name + "\"");
  const Json::Value& data = request["data"];
  if (!data.isObject()) throw Error(kMalformedRequest, "\"data\" of " + name + " must be an object");
  answer.Append(command->second.has_result ? "{\"success\":true,\"data\":" : "{\"success\":true");
  (this->*command->second.method)(data, answer);
  answer.Append("}");
}

Engine::IndexPointer Engine::Find(const std::string& id) {
  const std::lock_guard lock(indexes_mutex_);
  const auto found = indexes_.find(id);
  return found == indexes_.end() ? nullptr : found->second;
}

Engine::IndexPointer Engine::Get(const Json::Value& data) {
  const std::string id = Text(data, "id");
  IndexPointer index = Find(id);
  if (!index) throw Error(kNoSuchIndex, "There is no index " + id);
  return index;
}

bool Engine::IsTaken(const std::string& path, const std::string& id) const {
  for (const auto& [other, record] : registry_.records()) {
    if (other != id && record.path == path) return true;
  }
  return false;
}

// An index that lost its database is made anew with whatever is asked for.
void Engine::IndexCreate(const Json::Value& data, Answer&) {
  const std::lock_guard lifecycle(lifecycle_mutex_);
  IndexRecord record{Text(data, "id"), Directory(data), data["settings"], Member(data, "mappings"),
                     data["event_handler"]};
  if (IsTaken(record.path, record.id)) throw Error(kIndexExists, "Another index stands at " + record.path);
  IndexPointer index = Find(record.id);
  if (index) {
    const IndexRecord& known = registry_.records().at(record.id);
    const bool is_same = known.path == record.path && known.mappings == record.mappings;
    if (is_same) return index->Create();
    if (index->HasDatabase()) {
      throw Error(kIndexExists, "The index " + record.id + " stands at " + known.path + " with its own mappings");
    }
  }
  const auto made = std::make_shared<Index>(record.path, record.mappings, false);
  const IndexFiles files(record.path);
  if (files.Exists()) files.SetAside();  // nobody's, since no index stands there
  registry_.Save(record);
  made->Create();
  const std::lock_guard lock(indexes_mutex_);
  indexes_[record.id] = made;
}

void Engine::IndexDelete(const Json::Value& data, Answer&) {
  const std::lock_guard lifecycle(lifecycle_mutex_);
  const std::string id = Text(data, "id");
  const IndexPointer index = Find(id);
  if (!index) return;
  index->Delete();
  registry_.Remove(id);
  const std::lock_guard lock(indexes_mutex_);
  indexes_.erase(id);
}

void Engine::IndexPause(const Json::Value& data, Answer&) {
  const std::lock_guard lifecycle(lifecycle_mutex_);
  const IndexPointer index = Get(data);
  IndexRecord record = registry_.records().at(Text(data, "id"));
  index->Pause();
  record.paused = true;
  registry_.Save(record);
}

void Engine::IndexResume(const Json::Value& data, Answer&) {
  const std::lock_guard lifecycle(lifecycle_mutex_);
  const IndexPointer index = Get(data);
  IndexRecord record = registry_.records().at(Text(data, "id"));
  record.paused = false;
  registry_.Save(record);
  index->Resume();
}

// A caller that has said so before and died may say it again: the new identifier then has the new path already.
void Engine::IndexConfigSet(const Json::Value& data, Answer&) {
  const std::lock_guard lifecycle(lifecycle_mutex_);
  const std::string id = Text(data, "id");
  const Json::Value& changes = Object(data, "data");
  const std::string new_id = changes.isMember("id") ? Text(changes, "id") : id;
  const auto found = registry_.records().find(id);
  if (found == registry_.records().end()) {
    const auto done = registry_.records().find(new_id);
    if (done != registry_.records().end() && changes.isMember("path") && done->second.path == Directory(changes))
      return;
    throw Error(kNoSuchIndex, "There is no index " + id);
  }
  if (new_id != id && Find(new_id)) throw Error(kIndexExists, "There is already an index " + new_id);
  IndexRecord record = found->second;
  record.id = new_id;
  if (changes.isMember("path")) record.path = Directory(changes);
  if (IsTaken(record.path, id)) throw Error(kIndexExists, "Another index stands at " + record.path);
  const IndexPointer index = Find(id);
  index->MoveTo(record.path);
  registry_.Replace(id, record);
  const std::lock_guard lock(indexes_mutex_);
  indexes_.erase(id);
  indexes_[new_id] = index;
}

void Engine::DocumentUpsert(const Json::Value& data, Answer&) {
  Json::Value fields = Object(data, "data");
  Get(data)->Accept(Text(data, "doc_id"), fields, [] {});
}

void Engine::DocumentSet(const Json::Value& data, Answer&) {
  Get(data)->Set(Text(data, "doc_id"), Object(data, "data"));
}

void Engine::DocumentDelete(const Json::Value& data, Answer&) {
  Get(data)->Remove(Text(data, "doc_id"));
}

void Engine::DocumentDeleteByQuery(const Json::Value& data, Answer&) {
  const Json::Value& query = Object(data, "query");
  if (!query.isMember("qsl")) throw Error(kBadQuery, "The query lacks \"qsl\"");
  Get(data)->RemoveMatching(query["qsl"]);
}

void Engine::DocumentGetByQuery(const Json::Value& data, Answer& answer) {
  SearchRequest search = ParseSearch(Object(data, "query"));
  search.as = ParseUser(data);
  Get(data)->Find(search, answer);
}

void Engine::Commit(const Json::Value& data, Answer&) {
  Get(data)->Commit();
}

// An index that cannot be looked at now, paused perhaps, cannot be given suggestions either.
void Engine::ListTermSuggestions(const Json::Value&, Answer& answer) {
  std::map<std::string, IndexPointer> indexes;
  {
    const std::lock_guard lock(indexes_mutex_);
    indexes = indexes_;
  }
  Json::Value result(Json::objectValue);
  Json::Value& missing = result["unavail"] = Json::Value(Json::arrayValue);
  for (const auto& [id, index] : indexes) {
    try {
      if (!index->HasSuggestions()) missing.append(id);
    } catch (const Error&) {
      continue;
    }
  }
  answer.Append(toString(result));
}

void Engine::UpdateTermSuggestion(const Json::Value& data, Answer&) {
  const std::string id = Text(data, "db_name");
  const IndexPointer index = Find(id);
  if (!index) throw Error(kNoSuchIndex, "There is no index " + id);
  index->AddSuggestions(Text(data, "doc_id_field"));
}

int CheckDatabase(const std::string& directory) {
  return IsSound(directory) ? 0 : 1;
}

}  // namespace quarrox::elasticd
