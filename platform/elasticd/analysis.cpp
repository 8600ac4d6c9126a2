#include "analysis.h"

#include <algorithm>
#include <cmath>

#include "analysis_pieces.h"
#include "analysis_terms.h"
#include "analysis_unicode.h"
#include "analysis_words.h"
#include "error_code.h"

namespace quarrox::elasticd {
namespace {

// A longer name of a field that is not declared goes by its hash, so that there is room for words behind it.
constexpr size_t kLongestName = 100;

constexpr std::string_view kUndeclaredPrefix = "\x7e";

[[noreturn]] void Refuse(const Field& field, const char* wanted) {
  throw Error(kBadArgument, "field \"" + field.name + "\": its value must be " + wanted);
}

double NumberOf(const Field& field, const Json::Value& value) {
  switch (field.type) {
    case FieldType::kInt:
      if (!value.isInt64() && !value.isUInt64()) Refuse(field, "a whole number");
      return value.asDouble();
    case FieldType::kBool:
      if (!value.isBool()) Refuse(field, "true or false");
      return value.asBool() ? 1 : 0;
    default:
      if (!value.isDouble() || !std::isfinite(value.asDouble())) Refuse(field, "a number");
      return value.asDouble();
  }
}

std::string_view TextOf(const Field& field, const Json::Value& value) {
  const char* begin = nullptr;
  const char* end = nullptr;
  if (!value.isString() || !value.getString(&begin, &end)) Refuse(field, "a string or an array of strings");
  return {begin, static_cast<size_t>(end - begin)};
}

// Counts the words of a text, and of ideographs each one and each two that stand together.
struct CountWords {
  TermTable& table;

  void Word(std::string_view word) const { table.AddReadable(word, 1); }

  void Ideographs(std::string_view signs) const {
    size_t previous = 0;
    for (size_t at = 0; at < signs.size();) {
      const size_t end = at + DecodeAt(signs, at).length;
      table.Add(signs.substr(at, end - at), 1);
      if (at > 0) table.Add(signs.substr(previous, end - previous), 1);
      previous = at;
      at = end;
    }
  }
};

}  // namespace

std::string PrefixOf(const Field& field) {
  if (field.number != Field::kUndeclared) return std::string(1, static_cast<char>(1 + field.number));
  std::string kept;
  // The zero byte ends the name, so a name that has one inside goes by its hash, too.
  const bool plain = field.name.find('\0') == std::string::npos;
  const std::string_view name = FitKeyword(field.name, plain ? kLongestName : 0, kept);
  return std::string(kUndeclaredPrefix).append(name) + '\0';
}

struct DocumentAnalyzer::Impl {
  explicit Impl(const Mapping& its_mapping) : mapping(its_mapping) {
    for (const Field& field : mapping.fields()) prefixes.push_back(PrefixOf(field));
  }

  void AddField(const Field& field, const Json::Value& value);
  void AddText(const Field& field, std::string_view text);
  void SetPrefixOf(const Field& field);
  void AddTerms(const Field& field, std::string_view text);

  const Mapping& mapping;
  std::vector<std::string> prefixes;  // of declared fields, by their numbers
  uint32_t undeclared = 0;            // so many undeclared fields the document had up to now
  TermTable table;
  WordSplitter splitter;
  AnalyzedDocument result;
};

// Prefixes are told apart by the field's number, then one for searches in no particular field, then the undeclared
// ones.
void DocumentAnalyzer::Impl::SetPrefixOf(const Field& field) {
  if (field.number != Field::kUndeclared) return table.SetPrefix(field.number, prefixes[field.number]);
  table.SetPrefix(static_cast<uint32_t>(prefixes.size()) + undeclared, PrefixOf(field));
}

void DocumentAnalyzer::Impl::AddField(const Field& field, const Json::Value& value) {
  if (value.isNull()) return;
  if (field.number == Field::kUndeclared) ++undeclared;
  if (field.IsNumber()) {
    const double number = NumberOf(field, value);
    if (field.number != Field::kUndeclared) result.numbers.emplace_back(field.number, number);
  } else if (value.isArray()) {
    for (const Json::Value& text : value) {
      if (!text.isNull()) AddText(field, TextOf(field, text));
    }
  } else {
    AddText(field, TextOf(field, value));
  }
}

void DocumentAnalyzer::Impl::AddText(const Field& field, std::string_view text) {
  SetPrefixOf(field);
  AddTerms(field, text);
  const bool searched_by_its_prefix = HoldsPlainWords(field) && field.number != Field::kUndeclared;
  if (!field.in_all || searched_by_its_prefix) return;
  table.SetPrefix(static_cast<uint32_t>(prefixes.size()), kAllPrefix);
  CountWords words{table};
  splitter.Split(text, words);
}

void DocumentAnalyzer::Impl::AddTerms(const Field& field, std::string_view text) {
  if (HoldsPlainWords(field)) {
    CountWords words{table};
    return splitter.Split(text, words);
  }
  const Visitor once = [this](std::string_view word) { table.Add(word, 0); };
  const size_t room = table.room();
  if (field.list_ancestor) return ForEachDirectory(text, room, once);
  if (field.ngram) {
    return ForEachWord(field, text, [&](std::string_view word) { ForEachNgram(word, once); });
  }
  if (field.analyzer == Analyzer::kKeyword) {
    std::string kept;
    return ForEachWord(field, text, [&](std::string_view word) { once(FitKeyword(word, room, kept)); });
  }
  ForEachWord(field, text, [this](std::string_view word) { table.Add(word, 1); });
}

DocumentAnalyzer::DocumentAnalyzer(const Mapping& mapping) : impl_(std::make_unique<Impl>(mapping)) {}

DocumentAnalyzer::~DocumentAnalyzer() = default;

const AnalyzedDocument& DocumentAnalyzer::Analyze(const Json::Value& fields, const std::vector<std::string>& skipped) {
  if (!fields.isObject()) throw Error(kBadArgument, "a document must be an object of fields");
  impl_->table.Clear();
  impl_->undeclared = 0;
  impl_->result.numbers.clear();
  for (auto it = fields.begin(); it != fields.end(); ++it) {
    const char* end = nullptr;
    const char* begin = it.memberName(&end);
    const std::string_view name(begin, static_cast<size_t>(end - begin));
    if (std::find(skipped.begin(), skipped.end(), name) != skipped.end()) continue;
    if (const Field* declared = impl_->mapping.Find(name)) {
      impl_->AddField(*declared, *it);
    } else {
      impl_->AddField(impl_->mapping.Get(std::string(name)), *it);
    }
  }
  impl_->table.Sort(impl_->result.terms);
  return impl_->result;
}

}  // namespace quarrox::elasticd
