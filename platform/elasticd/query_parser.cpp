#include "query_parser.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <ctime>
#include <limits>

#include "analysis.h"
#include "common/error.h"
#include "common/json.h"
#include "error_code.h"

namespace quarrox::elasticd {
namespace {

using Kind = PathFields::Kind;

// Nobody writes a query like that; each level costs stack.
constexpr int kDeepest = 32;

// Each costs a look-up at least.
constexpr size_t kMostWords = 256;
constexpr size_t kMostParts = 1024;

[[noreturn]] void Fail(const std::string& reason) {
  throw Error(kBadQuery, reason);
}

Query Simplify(Query::Kind kind, std::vector<Query> parts) {
  if (parts.empty()) return Query{Query::kNothing};
  if (parts.size() == 1) return std::move(parts.front());
  return Query::Of(kind, std::move(parts));
}

// The only member of an object.
struct Member {
  std::string name;
  const Json::Value& value;
};

Member OnlyMember(const Json::Value& object, const char* what) {
  if (!object.isObject() || object.size() != 1) {
    Fail(std::string(what) + " must be an object with one member, not " + toString(object));
  }
  return {object.begin().name(), *object.begin()};
}

std::string Text(const std::string& field, const Json::Value& value) {
  if (!value.isString()) Fail("The text for " + field + " must be a string, not " + toString(value));
  return value.asString();
}

std::optional<double> ParseNumber(std::string_view text) {
  double number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (text.empty() || error != std::errc() || end != text.data() + text.size() || !std::isfinite(number)) return {};
  return number;
}

double Number(const std::string& field, const Json::Value& value) {
  if (value.isBool()) return value.asBool() ? 1 : 0;
  if (value.isNumeric()) return value.asDouble();
  const std::optional<double> number = value.isString() ? ParseNumber(value.asString()) : std::nullopt;
  if (!number) Fail("The value for " + field + " must be a number, not " + toString(value));
  return *number;
}

Query NumberRange(const Field& field, double low, double high) {
  if (low > high) return Query{Query::kNothing};
  Query query{Query::kNumber};
  query.field = field.number;
  query.low = low;
  query.high = high;
  return query;
}

Query OfWord(const WordTerms& word) {
  std::vector<Query> groups;
  for (const std::vector<std::string>& group : word.groups) {
    const bool is_beginning = word.last_is_prefix && &group == &word.groups.back();
    std::vector<Query> terms;
    for (const std::string& term : group) terms.push_back(Query{is_beginning ? Query::kBeginning : Query::kTerm, term});
    groups.push_back(Simplify(Query::kSame, std::move(terms)));
  }
  return Simplify(Query::kAnd, std::move(groups));
}

Query OfWords(const std::vector<WordTerms>& words) {
  if (words.size() > kMostWords) Fail("The query has more than " + std::to_string(kMostWords) + " words");
  std::vector<Query> parts;
  for (const WordTerms& word : words) parts.push_back(OfWord(word));
  return Simplify(Query::kAnd, std::move(parts));
}

Query InDirectories(std::unordered_set<DirectoryId> directories, std::string_view begin) {
  Query query{Query::kPlace, std::string(begin)};
  query.directories = std::make_shared<const std::unordered_set<DirectoryId>>(std::move(directories));
  return query;
}

}  // namespace

Query QueryParser::Parse(const Json::Value& qsl) {
  lines_.clear();
  budget_ = LineBudget();
  parts_ = 0;
  line_words_.clear();
  first_line_words_.clear();
  return ParseAt(qsl, 0);
}

Query QueryParser::ParseAt(const Json::Value& qsl, int depth) {
  if (++parts_ > kMostParts) Fail("The query has more than " + std::to_string(kMostParts) + " parts");
  if (depth > kDeepest) Fail("The query is nested more than " + std::to_string(kDeepest) + " levels deep");
  const Member query = OnlyMember(qsl, "A query");
  if (query.name == "bool") return Bool(query.value, depth);
  if (query.name == "query_string") return Line(query.value);
  if (query.name != "match" && query.name != "term" && query.name != "prefix" && query.name != "range") {
    Fail("There is no query \"" + query.name + "\"");
  }
  const Member field = OnlyMember(query.value, query.name.c_str());
  if (query.name == "match") return Match(field.name, field.value);
  if (query.name == "term") return Term(field.name, field.value);
  if (query.name == "prefix") return Prefix(field.name, field.value);
  return Range(field.name, field.value);
}

// A word that is a number is also looked for in the numbers that take part in such searches.
Query QueryParser::WordsInAll(std::string_view text) const {
  const std::vector<WordTerms> words = QueryWordsInAll(mapping_, text);
  Query query = OfWords(words);
  if (words.size() != 1) return query;
  const std::optional<double> number = ParseNumber(text);
  if (!number) return query;
  std::vector<Query> parts = {std::move(query)};
  for (const Field& field : mapping_.fields()) {
    if (field.in_all && field.IsNumber() && field.type != FieldType::kBool) {
      parts.push_back(NumberRange(field, *number, *number));
    }
  }
  return Query::Of(Query::kOr, std::move(parts));
}

Query QueryParser::Match(const std::string& name, const Json::Value& value) {
  if (name == "_all") return WordsInAll(Text(name, value));
  const Field field = mapping_.Get(name);
  const Kind kind = path_fields_.KindOf(name);
  if (field.IsNumber() || kind == Kind::kPath || kind == Kind::kDirectory) return Term(name, value);
  const std::vector<WordTerms> words = QueryWords(field, Text(name, value));
  if (kind != Kind::kAncestor) return OfWords(words);
  std::vector<Query> parts;
  const size_t prefix = PrefixOf(field).size();
  for (const WordTerms& word : words) {
    for (const auto& group : word.groups) parts.push_back(Below(std::string_view(group.front()).substr(prefix)));
  }
  return Simplify(Query::kAnd, std::move(parts));
}

// Each reads the directories below it.
void QueryParser::TakePath() {
  if (!budget_.TakePath()) Fail("The query has too many conditions on paths");
}

// The documents in a directory and below it.
Query QueryParser::Below(std::string_view directory) {
  TakePath();
  if (directory == "/") directory = {};
  const DirectoryId top = places_.FindDirectory(directory);
  return top == 0 ? Query{Query::kNothing} : InDirectories(places_.Tree(top), {});
}

Query QueryParser::Term(const std::string& name, const Json::Value& value) {
  const Field field = mapping_.Get(name);
  if (field.IsNumber()) {
    const double number = Number(name, value);
    return NumberRange(field, number, number);
  }
  const std::string text = Text(name, value);
  const Kind kind = path_fields_.KindOf(name);
  if (kind == Kind::kPath) {
    Query query{Query::kDocument};
    query.document = text.empty() ? 0 : places_.Find(text);
    return query.document == 0 ? Query{Query::kNothing} : query;
  }
  if (kind == Kind::kAncestor) return Below(text);
  if (kind == Kind::kDirectory) {
    const DirectoryId directory = places_.FindDirectory(text == "/" ? "" : text);
    return directory == 0 ? Query{Query::kNothing} : InDirectories({directory}, {});
  }
  const std::string term = ExactTerm(field, text);
  return term.empty() ? Query{Query::kNothing} : Query::Term(term);
}

// What stands in the directory itself, and everything below those of its directories that fit.
Query QueryParser::PathPrefix(const std::string& prefix) {
  TakePath();
  const size_t slash = prefix.rfind('/');
  if (slash == std::string::npos) return Query{prefix.empty() ? Query::kEverything : Query::kNothing};
  const DirectoryId directory = places_.FindDirectory(std::string_view(prefix).substr(0, slash));
  if (directory == 0) return Query{Query::kNothing};
  const std::string_view begin = std::string_view(prefix).substr(slash + 1);
  if (begin.empty()) return InDirectories(places_.Tree(directory), {});
  return Query::Of(Query::kOr,
                   {InDirectories({directory}, begin), InDirectories(places_.TreesIn(directory, begin), {})});
}

Query QueryParser::Prefix(const std::string& name, const Json::Value& value) {
  const std::string text = Text(name, value);
  const Field field = mapping_.Get(name);
  const Kind kind = path_fields_.KindOf(name);
  if (kind == Kind::kPath) return PathPrefix(text);
  if (field.IsNumber() || kind == Kind::kDirectory || kind == Kind::kAncestor) {
    Fail("The field " + name + " is not searched by the beginning of its value: use term, or range for numbers");
  }
  const bool is_word = field.analyzer == Analyzer::kStandard || field.to_lower;
  return Query{Query::kBeginning, PrefixOf(field) + (is_word ? FoldWord(text) : text)};
}

Query QueryParser::Range(const std::string& name, const Json::Value& bounds) const {
  const Field field = mapping_.Get(name);
  if (!field.IsNumber()) Fail("The field " + name + " holds no numbers, so it has no range");
  if (!bounds.isObject()) Fail("The range of " + name + " must be an object with gte, gt, lte or lt");
  constexpr double kInfinity = std::numeric_limits<double>::infinity();
  double low = -kInfinity;
  double high = kInfinity;
  for (auto bound = bounds.begin(); bound != bounds.end(); ++bound) {
    const std::string which = bound.name();
    const double number = Number(name, *bound);
    if (which == "gte" || which == "gt") {
      low = std::max(low, which == "gt" ? std::nextafter(number, kInfinity) : number);
    } else if (which == "lte" || which == "lt") {
      high = std::min(high, which == "lt" ? std::nextafter(number, -kInfinity) : number);
    } else {
      Fail("A range has gte, gt, lte and lt, not " + which);
    }
  }
  return NumberRange(field, low, high);
}

Query QueryParser::Bool(const Json::Value& clauses, int depth) {
  if (!clauses.isObject()) Fail("bool must be an object with must, should or must_not");
  std::vector<Query> must;
  std::vector<Query> should;
  std::vector<Query> must_not;
  for (auto clause = clauses.begin(); clause != clauses.end(); ++clause) {
    const std::string name = clause.name();
    std::vector<Query>* parts = name == "must"       ? &must
                                : name == "should"   ? &should
                                : name == "must_not" ? &must_not
                                                     : nullptr;
    if (parts == nullptr) Fail("bool has must, should and must_not, not " + name);
    if (clause->isObject()) {
      parts->push_back(ParseAt(*clause, depth + 1));
    } else if (clause->isArray()) {
      for (const Json::Value& part : *clause) parts->push_back(ParseAt(part, depth + 1));
    } else {
      Fail(name + " must be a query or an array of queries");
    }
  }
  Query query{Query::kEverything};
  if (must.empty() && !should.empty()) {
    query = Simplify(Query::kOr, std::move(should));
  } else if (!must.empty()) {
    query = Simplify(Query::kAnd, std::move(must));
    if (!should.empty()) {
      should.insert(should.begin(), std::move(query));
      query = Query::Of(Query::kAndPerhaps, std::move(should));
    }
  }
  if (must_not.empty()) return query;
  must_not.insert(must_not.begin(), std::move(query));
  return Query::Of(Query::kAndNot, std::move(must_not));
}

// What goes with the line is optional: {"query": LINE, "types": {NAME: [EXTENSION, ...]}, "now": SECONDS}.
Query QueryParser::Line(const Json::Value& value) {
  const std::string line = Text("query_string", value.isObject() ? value["query"] : value);
  LineSettings settings;
  settings.now = time(nullptr);
  if (value.isObject() && value["now"].isInt64()) settings.now = value["now"].asInt64();
  const Json::Value types = value.isObject() ? value["types"] : Json::Value();
  if (!types.isNull() && !types.isObject()) Fail("types must be an object");
  for (auto type = types.begin(); type != types.end(); ++type) {
    for (const Json::Value& extension : *type) settings.types[type.name()].push_back(Text("types", extension));
  }
  LineQuery& made = lines_.emplace_back(mapping_, store_, places_, std::move(settings), budget_);
  Query query = made.Make(line);
  line_words_.insert(line_words_.end(), made.words().begin(), made.words().end());
  if (lines_.size() == 1) first_line_words_ = line_words_;
  return query;
}

bool QueryParser::cut() const {
  return std::any_of(lines_.begin(), lines_.end(), [](const LineQuery& line) { return line.cut(); });
}

std::optional<PathQuery> AsPathQuery(const Json::Value& qsl, const Mapping& mapping) {
  for (const char* kind : {"term", "prefix"}) {
    if (!qsl.isObject() || qsl.size() != 1 || !qsl.isMember(kind)) continue;
    const Json::Value& fields = qsl[kind];
    if (!fields.isObject() || fields.size() != 1 || !fields.isMember(mapping.identity())) continue;
    const Json::Value& value = fields[mapping.identity()];
    if (value.isString()) return PathQuery{std::string_view(kind) == "prefix", value.asString()};
  }
  return std::nullopt;
}

}  // namespace quarrox::elasticd
