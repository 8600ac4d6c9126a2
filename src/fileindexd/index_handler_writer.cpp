#include "index_handler_writer.h"

#include <cerrno>
#include <utility>

#include "common/comm.h"
#include "common/error.h"
#include "common/log.h"
#include "fileindex/elastic_control.h"

namespace quarrox::fileindexd {
namespace {

namespace elastic = fileindex::elastic;

// Refusals of the engine that concern the one document.
constexpr int kBadArgument = 612;
constexpr int kNoSuchDocument = 614;

}  // namespace

Entry LookAt(const std::string& path) {
  Entry entry;
  if (lstat(path.c_str(), &entry.info) == 0) {
    entry.presence = Entry::kThere;
  } else if (errno != ENOENT && errno != ENOTDIR) {
    QUARROX_LOG_FAILURE("%.8192s cannot be looked at; what the index has of it stays", path.c_str());
    entry.presence = Entry::kUnknown;
  }
  errno = 0;
  return entry;
}

// Throws what is no matter of this one path.
void IndexWriter::HandleFailure(const Error& error, const std::string& path) {
  if (error.code != kErrEngineParse && error.code != kBadArgument && error.code != kNoSuchDocument) throw error;
  if (LookAt(path).presence == Entry::kGone) return Delete(path);
  errno = 0;
  QUARROX_LOG_FAILURE("%.8192s is not indexed as it is, code=%d, reason=%.8192s", path.c_str(), error.code,
                      error.reason.c_str());
}

void IndexWriter::Upsert(const std::string& path) {
  try {
    elastic::IndexUpsert(scope_.share(), path, scope_.NeedsMeta(path));
    fresh_.insert(std::hash<std::string>()(path));
  } catch (const Error& error) {
    HandleFailure(error, path);
  }
}

bool IndexWriter::RefreshAttributes(const std::string& path) {
  try {
    elastic::IndexAttr(scope_.share(), path);
  } catch (const Error& error) {
    if (error.code == kErrEngineReply) return false;
    HandleFailure(error, path);
  }
  return true;
}

void IndexWriter::Delete(const std::string& path) {
  Forget(path);
  try {
    elastic::IndexDel(scope_.share(), path);
  } catch (const Error& error) {
    if (error.code != kNoSuchDocument) throw;
  }
}

void IndexWriter::DeleteWithAllBelow(const std::string& path) {
  Delete(path);
  elastic::IndexDelDir(scope_.share(), path);
}

void IndexWriter::Delete(const std::vector<std::string>& paths) {
  const std::string index_id = elastic::GetFileIndexID(scope_.share());
  Json::Value request(Json::objectValue);
  for (const std::string& path : paths) {
    Forget(path);
    Json::Value item(Json::objectValue);
    item["command"] = "document_del_by_id";
    item["data"]["id"] = index_id;
    item["data"]["doc_id"] = path;
    request["compound"].append(std::move(item));
  }
  Json::Value response;
  SendRequestImpl(response, request);
}

}  // namespace quarrox::fileindexd
