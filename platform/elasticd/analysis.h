// From values to terms, the same way for documents and for queries.
//
// A term is the prefix of its field and a word. A word that would make a term longer than kLongestTerm is no word of a
// text; a keyword that long is cut and its hash takes the place of the rest, so that it is still found whole. Terms are
// bytes: a value that is no UTF-8 gives terms all the same.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <json/json.h>

#include "mapping.h"

namespace quarrox::elasticd {

// The index stores no longer ones.
inline constexpr size_t kLongestTerm = 245;

// What a word of a text has at most, in bytes; longer ones are encoded data that nobody types.
inline constexpr size_t kLongestWord = 64;

// The prefix of the words that are found by searches in no particular field. The words of a declared field with the
// analyzer "vexostandard" are not repeated there: such a search asks for them under their own prefixes.
inline constexpr std::string_view kAllPrefix = "\x7d";

// The prefix of a field's terms.
std::string PrefixOf(const Field& field);

// A word in the form in which words of texts are compared: case, accents and compatibility forms folded.
std::string FoldWord(std::string_view word);

// What a document is found by. Views point into the DocumentAnalyzer that made it.
struct AnalyzedDocument {
  // In order of bytes, none twice; how often in the document, 0 for what says nothing about relevance (keywords,
  // n-grams).
  std::vector<std::pair<std::string_view, uint32_t>> terms;
  // Numbers, dates and booleans (0 or 1) by the number of their field.
  std::vector<std::pair<unsigned int, double>> numbers;
};

// Reuses its memory from document to document. One object, one thread; `mapping` must live as long.
class DocumentAnalyzer {
 public:
  explicit DocumentAnalyzer(const Mapping& mapping);
  ~DocumentAnalyzer();
  DocumentAnalyzer(const DocumentAnalyzer&) = delete;
  DocumentAnalyzer& operator=(const DocumentAnalyzer&) = delete;

  // Analyzes an object of fields. Fields that `skipped` names are left out: the places of documents are kept elsewhere.
  // A text may be a string or an array of strings; null is as good as absent. Throws Error 612 where a value is not of
  // its field's type, naming the field; not logged. The result is good until the next call.
  const AnalyzedDocument& Analyze(const Json::Value& fields, const std::vector<std::string>& skipped);

 private:
  struct Impl;
  std::unique_ptr<Impl> impl_;
};

// What one word of a query asks for: every one of these groups, and of a group any term.
struct WordTerms {
  std::vector<std::vector<std::string>> groups;
  bool last_is_prefix =
      false;  // the last group's terms stand for all terms that begin so: a piece shorter than an n-gram
};

// A text as the query words for one field, in order. For an n-gram field each white-space word gives the n-grams it
// must contain, as groups of one.
std::vector<WordTerms> QueryWords(const Field& field, std::string_view text);

// The same for a search in no particular field: each group has the word under every prefix where it may stand.
std::vector<WordTerms> QueryWordsInAll(const Mapping& mapping, std::string_view text);

// The prefixes under which a word may stand that is looked for in no particular field.
std::vector<std::string> PrefixesOfAll(const Mapping& mapping);

// A word of a text, or ideographs that stand together; folded, without a prefix.
struct TextPiece {
  std::string text;
  bool ideographs;
};

std::vector<TextPiece> PiecesOf(std::string_view text);

// The single term of an exact search: a keyword as it is, else the one word of `value`; empty where it has none or
// several, and for numbers.
std::string ExactTerm(const Field& field, std::string_view value);

}  // namespace quarrox::elasticd
