// From a request's query to what the index is asked.
//
//   {"match": {FIELD: TEXT}}      every word of the text; FIELD may be "_all"
//   {"query_string": LINE}        what a person types (common/search_language.h); or {"query": LINE} with settings
//   {"term": {FIELD: VALUE}}      the exact value
//   {"prefix": {FIELD: TEXT}}     values that begin so
//   {"range": {FIELD: {"gte", "gt", "lte", "lt": NUMBER}}}
//   {"bool": {"must": [...], "should": [...], "must_not": [...]}}
#pragma once

#include <deque>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <json/json.h>

#include "fields.h"
#include "line_query.h"
#include "mapping.h"
#include "places.h"
#include "query.h"

namespace quarrox::elasticd {

// Paths are looked up while a query is parsed, so the result is good for what the places then hold, and until the
// object parses the next one.
class QueryParser {
 public:
  QueryParser(const Mapping& mapping, const PathFields& path_fields, const Store& store, const Places& places)
      : mapping_(mapping), path_fields_(path_fields), store_(store), places_(places) {}

  // Throws Error 613 that says what cannot be read; not logged.
  Query Parse(const Json::Value& qsl);

  // What the typed lines of the last query look for in texts.
  const std::vector<LineWord>& line_words() const { return line_words_; }
  const std::vector<LineWord>& first_line_words() const { return first_line_words_; }

  // Whether a search for that query left out documents because it had looked at too many.
  bool cut() const;

 private:
  Query ParseAt(const Json::Value& qsl, int depth);
  Query Match(const std::string& name, const Json::Value& value);
  Query Term(const std::string& name, const Json::Value& value);
  Query Prefix(const std::string& name, const Json::Value& value);
  Query Range(const std::string& name, const Json::Value& bounds) const;
  Query Bool(const Json::Value& clauses, int depth);
  Query Line(const Json::Value& value);
  Query WordsInAll(std::string_view text) const;
  void TakePath();
  Query Below(std::string_view directory);
  Query PathPrefix(const std::string& prefix);

  const Mapping& mapping_;
  const PathFields& path_fields_;
  const Store& store_;
  const Places& places_;
  std::deque<LineQuery> lines_;  // of the last query, which refers to them
  LineBudget budget_;
  size_t parts_ = 0;
  std::vector<LineWord> line_words_;
  std::vector<LineWord> first_line_words_;
};

// A query that asks for one document, or for all that begin with a path, and nothing else: {"term"} or {"prefix"} of
// the identity.
struct PathQuery {
  bool is_prefix = false;
  std::string path;
};
std::optional<PathQuery> AsPathQuery(const Json::Value& qsl, const Mapping& mapping);

}  // namespace quarrox::elasticd
