#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <ctime>
#include <iostream>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "command.h"
#include "common/comm.h"
#include "common/error.h"
#include "common/json.h"
#include "common/sdk/share.h"
#include "common/strings.h"
#include "fileindex/elastic_control.h"
#include "fileindex/folder_mgr.h"
#include "output.h"

namespace quarrox::ctl {
namespace {

constexpr size_t kDefaultLimit = 10;

struct Hit {
  std::string share = {};
  std::string path = {};
  bool is_directory = false;
  int64_t size = 0;     // bytes
  int64_t changed = 0;  // seconds since the epoch
  double score = 0;
};

struct Found {
  std::vector<Hit> hits = {};  // the best of each share
  uint64_t total = 0;
  bool total_is_exact = true;
};

Json::Value Query(const char* kind, const char* field, const std::string& text) {
  Json::Value query(Json::objectValue);
  query[kind][field] = text;
  return query;
}

// Any of some extensions, with a comma between two.
Json::Value WithExtensions(const std::string& extensions) {
  Json::Value any(Json::objectValue);
  for (size_t begin = 0; begin <= extensions.size();) {
    const size_t end = std::min(extensions.find(',', begin), extensions.size());
    const std::string extension = ToLower(extensions.substr(begin, end - begin));
    any["bool"]["should"].append(Query("term", "VEXOMDExtension", extension));
    begin = end + 1;
  }
  return any;
}

Json::Value AsQuery(const Arguments& arguments) {
  const std::string& text = arguments.operands().front();
  Json::Value query =
      arguments.Has("--name") ? Query("match", "VEXOMDSearchFileName", text) : Query("query_string", "query", text);
  if (!arguments.Has("--type")) return query;
  Json::Value both(Json::objectValue);
  both["bool"]["must"].append(query);
  both["bool"]["must"].append(WithExtensions(arguments.Value("--type", "")));
  return both;
}

double NumberOf(const Json::Value& hit, const char* field) {
  const Json::Value& value = hit[field];
  return value.isNumeric() ? value.asDouble() : 0;
}

Hit AsHit(const std::string& share, const Json::Value& fields) {
  Hit hit{.share = share};
  GetJsonValue(hit.path, fields, "VEXOMDPath", false);
  GetJsonValue(hit.is_directory, fields, "VEXOMDIsDir", false);
  hit.size = static_cast<int64_t>(NumberOf(fields, "VEXOMDFSSize"));
  hit.changed = static_cast<int64_t>(NumberOf(fields, "VEXOMDFSContentChangeDate"));
  hit.score = NumberOf(fields, "_score");
  return hit;
}

void SearchShare(const std::string& share, const Json::Value& qsl, uint64_t wanted, Found& found) {
  Json::Value request(Json::objectValue);
  request["command"] = "document_get_by_query";
  request["data"]["id"] = fileindex::elastic::GetFileIndexID(share);
  Json::Value& query = request["data"]["query"];
  query["qsl"] = qsl;
  for (const char* field : {"VEXOMDPath", "VEXOMDIsDir", "VEXOMDFSSize", "VEXOMDFSContentChangeDate", "_score"}) {
    query["load_field"].append(field);
  }
  query["from"] = 0;
  query["size"] = Json::UInt64{wanted};
  Json::Value response;
  SendRequestImpl(response, request);
  const Json::Value& hits = std::as_const(response)["data"];
  if (!hits.isArray()) throw Error(kErrEngineNoData, toString(response));
  for (const Json::Value& hit : hits) found.hits.push_back(AsHit(share, hit));
  found.total += std::max(static_cast<uint64_t>(NumberOf(response, "total")), uint64_t{hits.size()});
  const Json::Value& exact = std::as_const(response)["exact"];
  if (exact.isBool() && !exact.asBool()) found.total_is_exact = false;
}

Found SearchShares(const std::set<std::string>& shares, const Json::Value& qsl, uint64_t wanted) {
  // The channel waits for an engine that is about to start; a person need not.
  if (access(kElasticdSocketPath, F_OK) != 0) throw Error(kErrEngineReceive, "the search engine is not running");
  Found found;
  for (const std::string& share : shares) {
    try {
      SearchShare(share, qsl, wanted, found);
    } catch (const Error& error) {
      const bool is_paused = int{error.code} == kElasticdIndexPaused;
      if (!is_paused && int{error.code} != kElasticdNoSuchIndex) throw;
      std::cerr << "fileindexctl: the share " << Visible(share) << (is_paused ? " is paused" : " has no index yet")
                << ", so it is left out\n";
    }
  }
  std::sort(found.hits.begin(), found.hits.end(),
            [](const Hit& a, const Hit& b) { return a.score != b.score ? a.score > b.score : a.path < b.path; });
  return found;
}

std::string AsJson(const Hit& hit) {
  Json::Value object;
  object["share"] = hit.share;
  object["path"] = hit.path;
  object["is_dir"] = hit.is_directory;
  object["size"] = Json::Int64{hit.size};
  object["changed"] = Json::Int64{hit.changed};
  object["score"] = hit.score;
  return toString(object);
}

std::string SizeOf(const Hit& hit) {
  if (hit.is_directory) return "directory";
  return SizeText(static_cast<uint64_t>(std::max<int64_t>(hit.size, 0)));
}

std::string DateOf(const Hit& hit) {
  const time_t time = hit.changed;
  tm parts = {};
  char text[32] = "";
  if (localtime_r(&time, &parts) != nullptr) strftime(text, sizeof(text), "%Y-%m-%d %H:%M", &parts);
  return text;
}

void PrintHits(const Found& found, size_t offset) {
  const std::vector<Hit>& hits = found.hits;
  if (found.total == 0) {
    std::cout << "nothing found\n";
    return;
  }
  std::vector<std::vector<std::string>> rows = {{"PATH", "SIZE", "CHANGED"}};
  for (const Hit& hit : hits) rows.push_back({Visible(hit.path), SizeOf(hit), DateOf(hit)});
  if (rows.size() > 1) PrintTable(std::cout, rows);
  const char* about = found.total_is_exact ? "" : "about ";
  if (hits.empty()) {
    std::cout << about << found.total << " found, none from " << offset << " on\n";
  } else {
    std::cout << offset + 1 << " to " << offset + hits.size() << " of " << about << found.total << '\n';
  }
}

}  // namespace

int Search(const Arguments& arguments) {
  if (Trim(arguments.operands().front()).empty()) throw UsageError("QUERY is empty");
  const size_t offset = arguments.Number("--offset", 0);
  const size_t limit = arguments.Number("--limit", kDefaultLimit);
  const size_t wanted = offset + std::min(limit, SIZE_MAX - offset);
  std::set<std::string> shares;
  if (arguments.Has("--share")) {
    shares = {sdk::SDKShare(arguments.Value("--share", "")).GetName()};
  } else {
    shares = fileindex::FolderMgr().GetIndexedShares();
  }
  if (shares.empty()) std::cerr << "fileindexctl: no folder is indexed\n";

  Found found = SearchShares(shares, AsQuery(arguments), wanted);
  std::vector<Hit>& hits = found.hits;
  hits.erase(hits.begin() + static_cast<ptrdiff_t>(std::min(wanted, hits.size())), hits.end());
  hits.erase(hits.begin(), hits.begin() + static_cast<ptrdiff_t>(std::min(offset, hits.size())));
  if (arguments.Has("--json")) {
    for (const Hit& hit : hits) std::cout << AsJson(hit) << '\n';
  } else {
    PrintHits(found, offset);
  }
  return kDone;
}

}  // namespace quarrox::ctl
