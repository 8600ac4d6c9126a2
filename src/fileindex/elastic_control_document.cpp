#define QUARROX_LOG_UNIT "elastic_control"
#include <cxxabi.h>

#include <algorithm>
#include <cerrno>
#include <iterator>
#include <new>
#include <system_error>
#include <utility>

#include "common/json.h"
#include "common/log.h"
#include "common/sdk/share.h"
#include "common/strings.h"
#include "fileindex/elastic_control.h"
#include "fileindex/elastic_control_request.h"
#include "fileindex/status_mgr.h"
#include "vexo/content_extract.h"

namespace quarrox::fileindex::elastic {
namespace {

// How many documents a rename moves between two commits.
constexpr Json::ArrayIndex kRenamePage = 10000;

// How many of them with one request where somebody wants to be asked in between: the engine takes a fraction of a
// second.
constexpr Json::ArrayIndex kMovesAtOnce = 500;

// {"id", "query": {"qsl": {kind: {"VEXOMDPath": path}}}}
Json::Value PathQuery(const std::string& index_id, const char* kind, const std::string& path) {
  Json::Value data(Json::objectValue);
  data["id"] = index_id;
  data["query"]["qsl"][kind]["VEXOMDPath"] = path;
  return data;
}

// What is below a directory, and not what only begins with its name.
Json::Value BelowQuery(const std::string& index_id, const std::string& directory) {
  return PathQuery(index_id, "prefix", directory + "/");
}

Json::Value DocumentRequest(const char* command, const std::string& index_id, const Json::Value& doc_id) {
  Json::Value data(Json::objectValue);
  data["id"] = index_id;
  data["doc_id"] = doc_id;
  return MakeRequest(command, data);
}

Json::Value DocumentRequest(const char* command, const std::string& index_id, const Json::Value& doc_id,
                            Json::Value document) {
  Json::Value request = DocumentRequest(command, index_id, doc_id);
  request["data"]["data"] = std::move(document);
  return request;
}

// The documents that a query finds. `function` is whose failure it is.
Json::Value GetByQuery(const char* function, const Json::Value& data) {
  Json::Value res;
  SendElasticRequest(res, MakeRequest("document_get_by_query", data));
  if (!res.isMember("data") || !res["data"].isArray()) {
    QUARROX_THROW_IN(function, "!res.isMember(\"data\") || !res[\"data\"].isArray()", kErrEngineNoData, toString(res));
  }
  return std::move(res["data"]);
}

// The errno behind the exception that is being handled, 0 where there is none.
int SystemError() {
  try {
    throw;
  } catch (const std::system_error& error) {
    return error.code().category() == std::generic_category() ? error.code().value() : 0;
  } catch (const std::bad_alloc&) {
    return ENOMEM;
  } catch (...) {
    return 0;
  }
}

Json::Value BuildDocument(const std::string& path, bool need_meta) {
  Json::Value options(Json::objectValue);
  options["need_meta"] = need_meta;
  Json::Value document(Json::objectValue);
  try {
    VEXO::CONTENT_EXTRACT::ParseFile(path, options, document);
    document["VEXOMDSearchFileName"] = document["VEXOMDFSName"];
    document["VEXOMDSearchAncestor"] = document["VEXOMDParent"];
  } catch (const abi::__forced_unwind&) {
    throw;  // the thread is cancelled
  } catch (...) {
    const int system_error = SystemError();
    const Error error(kErrEngineParse, "Parse failed, path=" + path);
    errno = system_error;
    throw error;
  }
  return document;
}

// The new fields of the path that a rename was asked for.
Json::Value RenamedDocument(const std::string& new_path) {
  const std::string base = Basename(new_path);
  const std::string dir = Dirname(new_path);
  const std::string ext = GetFileExtension(new_path, true);
  Json::Value document(Json::objectValue);
  document["VEXOMDPath"] = new_path;
  document["VEXOMDParent"] = dir;
  document["VEXOMDFSName"] = base;
  document["VEXOMDSearchFileName"] = base;
  document["VEXOMDSearchAncestor"] = dir;
  document["VEXOMDDisplayName"] = base;
  document["VEXOMDKind"] = ext;
  document["VEXOMDExtension"] = ext;
  return document;
}

// The request that moves a document from below `old_path`.
Json::Value MoveRequest(const std::string& index_id, const Json::Value& hit, const std::string& new_path,
                        const std::string& old_path) {
  std::string name;
  std::string parent;
  GetJsonValue(name, hit, "VEXOMDFSName", true);
  GetJsonValue(parent, hit, "VEXOMDParent", true);
  const std::string new_parent = parent.replace(0, old_path.size(), new_path);
  Json::Value document(Json::objectValue);
  document["VEXOMDParent"] = new_parent;
  document["VEXOMDPath"] = new_parent + "/" + name;
  document["VEXOMDSearchFileName"] = name;
  document["VEXOMDSearchAncestor"] = new_parent;
  return DocumentRequest("document_set_by_id", index_id, hit["VEXOMDPath"], std::move(document));
}

void MoveAll(const std::string& index_id, const Json::Value& hits, const std::string& new_path,
             const std::string& old_path, const std::function<void()>& between) {
  Json::Value request(Json::objectValue);
  Json::Value& moves = request["compound"];
  for (const Json::Value& hit : hits) {
    moves.append(MoveRequest(index_id, hit, new_path, old_path));
    if (!between || moves.size() < kMovesAtOnce) continue;
    SendElasticCommand(request);
    moves.clear();
    between();
  }
  if (!moves.empty()) SendElasticCommand(request);
}

}  // namespace

std::string LastReadFailure() {
  return VEXO::CONTENT_EXTRACT::LastFailure();
}

Json::Value ReaderFeatures() {
  return VEXO::CONTENT_EXTRACT::ReaderFeatures();
}

bool IsDocumentExists(const std::string& share, const std::string& path) {
  return !GetByQuery(__func__, PathQuery(GetFileIndexID(share), "term", path)).empty();
}

void IndexUpsert(const std::string& share, const std::string& path, bool need_meta) {
  SendElasticCommand(
      DocumentRequest("document_upsert_by_id", GetFileIndexID(share), path, BuildDocument(path, need_meta)));
}

void IndexAttr(const std::string& share, const std::string& path) {
  if (!IsDocumentExists(share, path)) throw Error(kErrEngineReply);
  SendElasticCommand(DocumentRequest("document_set_by_id", GetFileIndexID(share), path, BuildDocument(path, false)));
}

bool IndexAttrOfSame(const std::string& share, const std::string& path) {
  constexpr const char* kIdentity[] = {"VEXOMDOwnerUserID", "VEXOMDFSSize", "VEXOMDFSContentChangeDate"};
  constexpr const char* kIsDirectory = "VEXOMDIsDir";
  Json::Value data = PathQuery(GetFileIndexID(share), "term", path);
  for (const char* field : kIdentity) data["query"]["load_field"].append(field);
  data["query"]["load_field"].append(kIsDirectory);
  const Json::Value hits = GetByQuery(__func__, data);
  if (hits.empty()) return false;
  const Json::Value& known = hits[0];
  Json::Value document = BuildDocument(path, false);
  if (known[kIsDirectory] != document[kIsDirectory]) return false;
  const bool is_directory = document[kIsDirectory] == true;
  const auto is_same = [&](const char* field) {
    const Json::Value& now = document[field];
    return now.isNumeric() ? known[field].isNumeric() && known[field].asDouble() == now.asDouble()
                           : known[field] == now;
  };
  if (!is_directory && !std::all_of(std::begin(kIdentity), std::end(kIdentity), is_same)) return false;
  SendElasticCommand(DocumentRequest("document_set_by_id", GetFileIndexID(share), path, std::move(document)));
  return true;
}

void IndexDel(const std::string& share, const std::string& path) {
  SendElasticCommand(DocumentRequest("document_del_by_id", GetFileIndexID(share), path));
}

void IndexDelDir(const std::string& share, const std::string& path) {
  SendElasticCommand(MakeRequest("document_del_by_query", BelowQuery(GetFileIndexID(share), path)));
}

void IndexCommit(const std::string& share) {
  try {
    Json::Value data(Json::objectValue);
    data["id"] = GetFileIndexID(share);
    SendElasticCommand(MakeRequest("commit", data));
  } catch (const Error&) {
    if (sdk::SDKShare(share).IsSpaceEnough()) throw;
    StatusMgr().SetShareStatus(share, kShareNeedReindex);
    throw Error(kErrNoSpace, "Share (" + share + ") space not enough");
  }
}

void IndexGetByPrefixPath(const std::string& index_id, const std::string& path, std::vector<std::string>& paths) {
  Json::Value data = BelowQuery(index_id, path);
  data["query"]["load_field"].append("VEXOMDPath");
  std::vector<std::string> found;
  for (const Json::Value& hit : GetByQuery(__func__, data)) {
    Json::Value found_path;
    GetJsonValue(found_path, hit, "VEXOMDPath", false);
    if (found_path.isString()) found.push_back(found_path.asString());
  }
  paths.insert(paths.end(), found.begin(), found.end());
}

// A full page may have more behind it. It is committed, so that what it moved is no longer found below the old path,
// and the first page is asked for again.
void IndexRename(const std::string& share, const std::string& new_path, const std::string& old_path,
                 const std::function<void()>& between) {
  if (!IsDocumentExists(share, old_path)) throw Error(kErrEngineReply);
  const std::string index_id = GetFileIndexID(share);
  SendElasticCommand(DocumentRequest("document_set_by_id", index_id, old_path, RenamedDocument(new_path)));

  Json::Value data = BelowQuery(index_id, old_path);
  Json::Value& query = data["query"];
  for (const char* field : {"VEXOMDPath", "VEXOMDFSName", "VEXOMDParent"}) query["load_field"].append(field);
  query["from"] = 0;
  query["size"] = kRenamePage;
  for (;;) {
    const Json::Value hits = GetByQuery(__func__, data);
    if (hits.empty()) return;
    MoveAll(index_id, hits, new_path, old_path, between);
    if (hits.size() < kRenamePage) return;
    IndexCommit(share);
    if (between) between();
  }
}

}  // namespace quarrox::fileindex::elastic
