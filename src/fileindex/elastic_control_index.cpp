#include "common/json.h"
#include "common/sdk/share.h"
#include "fileindex/elastic_control.h"
#include "fileindex/elastic_control_request.h"

namespace quarrox::fileindex::elastic {
namespace {

Json::Value IdData(const std::string& share) {
  Json::Value data(Json::objectValue);
  data["id"] = GetFileIndexID(share);
  return data;
}

// "id" names the index as the engine knows it now, the inner "data" is what changes.
void SendConfig(const std::string& share, const Json::Value& changes) {
  Json::Value data = IdData(share);
  data["data"] = changes;
  SendElasticCommand(MakeRequest("index_config_set", data));
}

}  // namespace

void ShareIndexCreate(const std::string& share) {
  Json::Value data = IdData(share);
  data["path"] = sdk::SDKShare(share).GetDBPath();
  data["settings"] = GetFileIndexSettings();
  data["mappings"] = GetFileIndexMappings();
  data["event_handler"] = GetFileIndexEventHandler();
  SendElasticCommand(MakeRequest("index_create", data));
}

void ShareIndexDelete(const std::string& share) {
  SendElasticCommand(MakeRequest("index_delete", IdData(share)));
}

void ShareIndexPause(const std::string& share) {
  SendElasticCommand(MakeRequest("index_pause", IdData(share)));
}

void ShareIndexResume(const std::string& share) {
  SendElasticCommand(MakeRequest("index_resume", IdData(share)));
}

void ShareIndexRename(const std::string& old_share, const std::string& new_share, const std::string& db_path) {
  Json::Value changes = IdData(new_share);
  changes["path"] = db_path;
  SendConfig(old_share, changes);
}

void ShareIndexMigrate(const std::string& share, const std::string& db_path) {
  Json::Value changes(Json::objectValue);
  changes["path"] = db_path;
  SendConfig(share, changes);
}

void ListUnAvailTermSuggDB(std::vector<std::string>& dbs) {
  Json::Value res;
  SendElasticRequest(res, MakeRequest("list_term_sugg_db", Json::Value(Json::objectValue)));
  Json::Value data(Json::objectValue);
  Json::Value unavail(Json::arrayValue);
  GetJsonValue(data, res, "data", false);
  GetJsonValue(unavail, data, "unavail", false);
  for (const Json::Value& db : unavail) {
    if (db.isString()) dbs.push_back(db.asString());
  }
}

void UpdateTermSuggestion(const std::string& db, const std::vector<std::string>& doc_ids) {
  Json::Value request(Json::objectValue);
  Json::Value& compound = request["compound"] = Json::Value(Json::arrayValue);
  for (const std::string& doc_id : doc_ids) {
    Json::Value data(Json::objectValue);
    data["doc_id_field"] = doc_id;
    data["db_name"] = db;
    compound.append(MakeRequest("update_term_suggestion", data));
  }
  SendElasticCommand(request);
}

}  // namespace quarrox::fileindex::elastic
