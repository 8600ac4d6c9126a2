#include "search.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <iostream>
#include <iterator>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "command.h"
#include "common/comm.h"
#include "common/error.h"
#include "common/json.h"
#include "common/sdk/share.h"
#include "common/search_socket.h"
#include "common/strings.h"
#include "daemon_exchange.h"
#include "fileindex/elastic_control.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/util.h"
#include "output.h"

namespace quarrox::ctl {
namespace {

constexpr size_t kDefaultLimit = 10;

// No terminal shows a column behind it on the same line.
constexpr unsigned long long kWidest = 200;

constexpr const char* kFields[] = {"VEXOMDPath", "VEXOMDIsDir", "VEXOMDFSSize", "VEXOMDFSContentChangeDate", "_score"};

// A longer list is for programs, and each snippet costs a look at a text.
constexpr uint64_t kMostSnippets = 1000;

// Where fewer are found in all shares, perhaps another word was meant.
constexpr uint64_t kLittle = 3;

// So many hits of a share, and how many before them are passed over.
struct Page {
  uint64_t from = 0;
  uint64_t size = 0;
};

// The types of files by the names that people call them by.
constexpr std::pair<const char*, fileindex::FileType> kTypes[] = {{"document", fileindex::kFileTypeDocument},
                                                                  {"audio", fileindex::kFileTypeAudio},
                                                                  {"video", fileindex::kFileTypeVideo},
                                                                  {"photo", fileindex::kFileTypePhoto}};

bool IsType(const std::string& name) {
  return name == "folder" ||
         std::any_of(std::begin(kTypes), std::end(kTypes), [&](const auto& type) { return name == type.first; });
}

std::string Quoted(const std::string& text) {
  std::string quoted = "\"";
  for (const char c : text) {
    if (c == '"' || c == '\\') quoted += '\\';
    quoted += c;
  }
  return quoted + '"';
}

// The words between some characters, without empty ones.
std::vector<std::string> Split(const std::string& text, const char* between) {
  std::vector<std::string> words;
  for (size_t begin = text.find_first_not_of(between); begin != std::string::npos;) {
    const size_t end = std::min(text.find_first_of(between, begin), text.size());
    words.push_back(text.substr(begin, end - begin));
    begin = text.find_first_not_of(between, end);
  }
  return words;
}

// Types go along where the line may ask for them: the engine does not know which extensions they stand for.
Json::Value Line(const std::string& line) {
  Json::Value query(Json::objectValue);
  Json::Value& settings = query["query_string"];
  settings["query"] = line;
  if (ToLower(line).find("type:") == std::string::npos) return query;
  for (const auto& [name, type] : kTypes) {
    Json::Value& extensions = settings["types"][name];
    for (const std::string& extension : fileindex::ExtensionsOfFileType(type)) extensions.append(extension);
  }
  return query;
}

// Each word is a part of the name.
std::string ForNames(const std::string& text) {
  std::string line;
  for (const std::string& word : Split(text, " \t\r\n\v\f")) line += "name:" + Quoted(word) + ' ';
  return line;
}

// Any of some types or extensions, with a comma between two.
std::string ForTypes(const std::string& list) {
  std::string line;
  for (const std::string& type : Split(list, ",")) {
    line += (line.empty() ? "" : " OR ") + std::string(IsType(ToLower(type)) ? "type:" : "ext:") + Quoted(type);
  }
  return line;
}

Json::Value AsQuery(const Arguments& arguments) {
  const std::string& text = arguments.operands().front();
  Json::Value query = Line(arguments.Has("--name") ? ForNames(text) : text);
  if (!arguments.Has("--type")) return query;
  Json::Value both(Json::objectValue);
  both["bool"]["must"].append(query);
  both["bool"]["must"].append(Line(ForTypes(arguments.Value("--type", ""))));
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
  const Json::Value& snippet = fields["_snippet"];
  if (!snippet.isObject()) return hit;
  GetJsonValue(hit.snippet, snippet, "text", false);
  for (const Json::Value& mark : snippet["marks"]) {
    if (mark.isArray() && mark.size() == 2) hit.marks.emplace_back(mark[0].asUInt64(), mark[1].asUInt64());
  }
  return hit;
}

// What cannot be read is shown below the line on a terminal, where a person typed it.
[[noreturn]] void RefuseLine(const std::string& line, const std::string& message) {
  constexpr std::string_view kBeforeColumn = "column ";
  const size_t at = message.find(kBeforeColumn);
  const std::string reason = at == std::string::npos ? message : message.substr(at);
  if (at != std::string::npos && !line.empty() && isatty(STDERR_FILENO) == 1) {
    const auto column = strtoull(reason.c_str() + kBeforeColumn.size(), nullptr, 10);
    if (column > 0 && column < kWidest) {
      std::cerr << "  " << Visible(line) << "\n  " << std::string(column - 1, ' ') << "^\n";
    }
  }
  throw Error(static_cast<ErrorCode>(int{kElasticdBadQuery}), reason);
}

// Whose search it is: who may not command the engine asks as themselves, at a socket that knows who they are.
struct Asker {
  std::string user = {};  // empty: whoever runs the command
  bool is_ordinary = false;
};

// A search may take the engine seconds, and others may be before it.
constexpr ExchangeLimits kSearchLimits = {.seconds = 60, .longest = uint32_t{256} << 20};

Json::Value Answered(const Json::Value& request, const Asker& asker) {
  Json::Value response;
  if (!asker.is_ordinary) {
    SendRequestImpl(response, request);
    return response;
  }
  response = Exchange(kSearchSocketPath, request, kSearchLimits).object;
  if (response["success"].asBool()) return response;
  const Json::Value& error = std::as_const(response)["error"];
  if (!error.isObject() || !error["code"].isInt() || !error["msg"].isString()) {
    throw Error(kErrEngineReceive, toString(response));
  }
  throw Error(static_cast<ErrorCode>(error["code"].asInt()), error["msg"].asString());
}

void SearchShare(const std::string& share, const Json::Value& qsl, Page page, const Asker& asker, Found& found) {
  Json::Value request(Json::objectValue);
  request["command"] = "document_get_by_query";
  if (!asker.user.empty()) request["data"]["as"] = asker.user;
  request["data"]["id"] = fileindex::elastic::GetFileIndexID(share);
  Json::Value& query = request["data"]["query"];
  query["qsl"] = qsl;
  for (const char* field : kFields) query["load_field"].append(field);
  if (page.size <= kMostSnippets) query["load_field"].append("_snippet");
  query["suggest"] = true;
  query["from"] = Json::UInt64{page.from};
  query["size"] = Json::UInt64{page.size};
  const Json::Value response = Answered(request, asker);
  const Json::Value& hits = std::as_const(response)["data"];
  if (!hits.isArray()) throw Error(kErrEngineNoData, toString(response));
  for (const Json::Value& hit : hits) found.hits.push_back(AsHit(share, hit));
  found.total +=
      std::max(static_cast<uint64_t>(NumberOf(response, "total")), hits.empty() ? 0 : page.from + hits.size());
  const auto has = [&](const char* name, bool value) {
    const Json::Value& member = std::as_const(response)[name];
    return member.isBool() && member.asBool() == value;
  };
  if (has("exact", false)) found.total_is_exact = false;
  if (has("at_least", true)) found.total_is_least = true;
  if (has("cut", true)) found.cut = true;
  if (found.suggestion.empty()) GetJsonValue(found.suggestion, response, "suggestion", false);
}

Found SearchShares(const std::set<std::string>& shares, const std::string& line, const Json::Value& qsl, Page page,
                   const Asker& asker) {
  Found found;
  for (const std::string& share : shares) {
    try {
      SearchShare(share, qsl, page, asker, found);
    } catch (const Error& error) {
      if (int{error.code} == kElasticdBadQuery) RefuseLine(line, error.reason);
      const bool is_paused = int{error.code} == kElasticdIndexPaused;
      if (!is_paused && int{error.code} != kElasticdNoSuchIndex) throw;
      if (!is_paused && asker.is_ordinary) continue;  // it may well be none of those that are indexed
      std::cerr << "fileindexctl: the share " << Visible(share) << (is_paused ? " is paused" : " has no index yet")
                << ", so it is left out\n";
    }
  }
  std::stable_sort(found.hits.begin(), found.hits.end(), [](const Hit& a, const Hit& b) { return a.score > b.score; });
  if (found.total >= kLittle) found.suggestion.clear();  // one share's, while others have it
  if (found.cut) {
    std::cerr << "fileindexctl: the query fits too much to look at all of it; more letters or words make it exact\n";
  }
  return found;
}

Asker WhoAsks(const Arguments& arguments) {
  Asker asker{arguments.Value("--as", "")};
  if (arguments.Has("--as") && asker.user.empty()) throw UsageError("--as takes the login name of a user");
  if (access(kElasticdSocketPath, W_OK) == 0) return asker;
  // The channel waits for an engine that is about to start; a person need not.
  if (errno != EACCES) throw Error(kErrEngineReceive, "the search engine is not running");
  asker.is_ordinary = true;
  return asker;
}

// Ordinary users do not see the list of folders; the engine says which shares have no index.
std::set<std::string> SharesToSearch(const Arguments& arguments, const Asker& asker) {
  if (arguments.Has("--share")) return {sdk::SDKShare(arguments.Value("--share", "")).GetName()};
  if (!asker.is_ordinary) return fileindex::FolderMgr().GetIndexedShares();
  return sdk::SDKShare::Enum();
}

}  // namespace

int Search(const Arguments& arguments) {
  if (Trim(arguments.operands().front()).empty()) throw UsageError("QUERY is empty");
  const size_t offset = arguments.Number("--offset", 0);
  const size_t limit = arguments.Number("--limit", kDefaultLimit);
  const size_t end = offset + std::min(limit, SIZE_MAX - offset);
  const Asker asker = WhoAsks(arguments);
  const std::set<std::string> shares = SharesToSearch(arguments, asker);
  if (shares.empty()) std::cerr << "fileindexctl: no folder is indexed\n";

  // The best of several shares are known when the best of each are.
  const size_t begin = shares.size() == 1 ? offset : 0;
  const bool is_as_typed = !arguments.Has("--name") && !arguments.Has("--type");
  const std::string line = is_as_typed ? arguments.operands().front() : std::string();
  Found found = SearchShares(shares, line, AsQuery(arguments), {begin, end - begin}, asker);
  std::vector<Hit>& hits = found.hits;
  hits.resize(std::min(end - begin, hits.size()));
  hits.erase(hits.begin(), hits.begin() + static_cast<ptrdiff_t>(std::min(offset - begin, hits.size())));
  if (arguments.Has("--json")) {
    PrintHitsAsJson(found);
  } else {
    PrintHits(found, offset);
  }
  return kDone;
}

}  // namespace quarrox::ctl
