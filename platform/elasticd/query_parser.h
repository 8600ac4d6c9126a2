// From a request's query to what the index is asked.
//
//   {"match": {FIELD: TEXT}}      every word of the text; FIELD may be "_all"
//   {"query_string": LINE}        what a person types: words, -words that must not be there, beginnings*
//   {"term": {FIELD: VALUE}}      the exact value
//   {"prefix": {FIELD: TEXT}}     values that begin so
//   {"range": {FIELD: {"gte", "gt", "lte", "lt": NUMBER}}}
//   {"bool": {"must": [...], "should": [...], "must_not": [...]}}
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include <json/json.h>

#include "fields.h"
#include "mapping.h"
#include "places.h"
#include "query.h"

namespace quarrox::elasticd {

// Paths are looked up while a query is parsed, so the result is good for what the places then hold.
class QueryParser {
 public:
  QueryParser(const Mapping& mapping, const PathFields& path_fields, const Places& places)
      : mapping_(mapping), path_fields_(path_fields), places_(places) {}

  // Throws Error 613 that says what cannot be read; not logged.
  Query Parse(const Json::Value& qsl) const;

 private:
  Query ParseAt(const Json::Value& qsl, int depth) const;
  Query Match(const std::string& name, const Json::Value& value) const;
  Query Term(const std::string& name, const Json::Value& value) const;
  Query Prefix(const std::string& name, const Json::Value& value) const;
  Query Range(const std::string& name, const Json::Value& bounds) const;
  Query Bool(const Json::Value& clauses, int depth) const;
  Query Line(const Json::Value& value) const;
  Query WordsInAll(std::string_view text) const;
  Query Beginnings(std::string_view word) const;
  Query Below(std::string_view directory) const;
  Query PathPrefix(const std::string& prefix) const;

  const Mapping& mapping_;
  const PathFields& path_fields_;
  const Places& places_;
};

// A query that asks for one document, or for all that begin with a path, and nothing else: {"term"} or {"prefix"} of
// the identity.
struct PathQuery {
  bool is_prefix = false;
  std::string path;
};
std::optional<PathQuery> AsPathQuery(const Json::Value& qsl, const Mapping& mapping);

}  // namespace quarrox::elasticd
