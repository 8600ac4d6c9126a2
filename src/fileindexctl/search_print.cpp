#include <unistd.h>

#include <algorithm>
#include <ctime>
#include <iostream>
#include <sstream>

#include "common/json.h"
#include "common/search_language.h"
#include "output.h"
#include "search.h"

namespace quarrox::ctl {
namespace {

std::string AsJson(const Hit& hit) {
  Json::Value object;
  object["share"] = hit.share;
  object["path"] = hit.path;
  object["is_dir"] = hit.is_directory;
  object["size"] = Json::Int64{hit.size};
  object["changed"] = Json::Int64{hit.changed};
  object["score"] = hit.score;
  if (!hit.snippet.empty()) {
    Json::Value& snippet = object["snippet"];
    snippet["text"] = hit.snippet;
    for (const auto& [offset, length] : hit.marks) {
      Json::Value& mark = snippet["marks"].append(Json::Value(Json::arrayValue));
      mark.append(Json::UInt64{offset});
      mark.append(Json::UInt64{length});
    }
  }
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

std::string Marked(const Hit& hit, bool bold) {
  std::string text;
  size_t at = 0;
  for (const auto& [offset, length] : hit.marks) {
    if (!bold || offset < at || offset + length > hit.snippet.size()) continue;
    text += Visible(hit.snippet.substr(at, offset - at));
    text += "\x1b[1m" + Visible(hit.snippet.substr(offset, length)) + "\x1b[0m";
    at = offset + length;
  }
  return text + Visible(hit.snippet.substr(at));
}

// Each hit's snippet stands below its line of the table.
void PrintTableOf(const std::vector<Hit>& hits) {
  std::vector<std::vector<std::string>> rows = {{"PATH", "SIZE", "CHANGED"}};
  for (const Hit& hit : hits) rows.push_back({Visible(hit.path), SizeOf(hit), DateOf(hit)});
  std::stringstream table;
  PrintTable(table, rows);
  const bool bold = isatty(STDOUT_FILENO) == 1;
  std::string line;
  for (size_t row = 0; std::getline(table, line); ++row) {
    std::cout << line << '\n';
    if (row > 0 && !hits[row - 1].snippet.empty()) std::cout << "    " << Marked(hits[row - 1], bold) << '\n';
  }
}

}  // namespace

void PrintHitsAsJson(const Found& found) {
  for (const Hit& hit : found.hits) std::cout << AsJson(hit) << '\n';
  if (found.suggestion.empty()) return;
  Json::Value meant;
  meant["did_you_mean"] = found.suggestion;
  std::cout << toString(meant) << '\n';
}

void PrintHits(const Found& found, size_t offset) {
  const std::vector<Hit>& hits = found.hits;
  const char* about = found.total_is_exact ? "" : found.total_is_least ? "at least " : "about ";
  if (!hits.empty()) PrintTableOf(hits);
  if (found.total == 0) {
    std::cout << "nothing found\n";
  } else if (hits.empty()) {
    std::cout << about << found.total << " found, none from " << offset << " on\n";
  } else {
    std::cout << offset + 1 << " to " << offset + hits.size() << " of " << about << found.total << '\n';
  }
  if (!found.suggestion.empty()) std::cout << "did you mean: " << Visible(found.suggestion) << '\n';
}

void PrintSearchLanguage(std::ostream& out) {
  std::vector<std::vector<std::string>> rows = {{"QUERY may hold:", ""}};
  for (const SearchElement& element : kSearchLanguage) {
    rows.push_back({std::string("  ") + element.written, element.meaning});
  }
  out << '\n';
  PrintTable(out, rows);
}

}  // namespace quarrox::ctl
