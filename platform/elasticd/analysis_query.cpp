// The query's side of the analysis.
#include <algorithm>

#include "analysis.h"
#include "analysis_pieces.h"
#include "analysis_unicode.h"
#include "analysis_words.h"

namespace quarrox::elasticd {
namespace {

using Group = std::vector<std::string>;

// Ideographs two by two; one that stands alone is found by itself.
std::vector<std::string_view> PairsOf(std::string_view signs) {
  std::vector<std::string_view> pairs;
  size_t previous = 0;
  for (size_t at = DecodeAt(signs, 0).length; at < signs.size();) {
    const size_t end = at + DecodeAt(signs, at).length;
    pairs.push_back(signs.substr(previous, end - previous));
    previous = at;
    at = end;
  }
  if (pairs.empty()) pairs.push_back(signs);
  return pairs;
}

// Makes each word of a text a word of the query that may stand under any of some prefixes.
class AskForWords {
 public:
  explicit AskForWords(std::vector<std::string> prefixes) : prefixes_(std::move(prefixes)) {}

  void Word(std::string_view word) { words_.push_back({{GroupOf(word)}, false}); }

  void Ideographs(std::string_view signs) {
    WordTerms run;
    for (const std::string_view pair : PairsOf(signs)) run.groups.push_back(GroupOf(pair));
    words_.push_back(std::move(run));
  }

  std::vector<WordTerms> Of(std::string_view text) {
    WordSplitter splitter;
    splitter.Split(text, *this);
    return std::move(words_);
  }

 private:
  Group GroupOf(std::string_view word) const {
    Group group;
    for (const std::string& prefix : prefixes_) {
      if (prefix.size() + word.size() <= kLongestTerm) group.push_back(std::string(prefix).append(word));
    }
    return group;
  }

  const std::vector<std::string> prefixes_;
  std::vector<WordTerms> words_;
};

struct ListPieces {
  std::vector<TextPiece> pieces;
  void Word(std::string_view word) { pieces.push_back({std::string(word), false}); }
  void Ideographs(std::string_view signs) { pieces.push_back({std::string(signs), true}); }
};

// A word in a field of n-grams. One shorter than an n-gram stands for all n-grams that begin so.
WordTerms AskForNgrams(const std::string& prefix, std::string_view word) {
  std::vector<std::string_view> ngrams;
  ForEachNgram(word, [&](std::string_view ngram) { ngrams.push_back(ngram); });
  WordTerms asked;
  asked.last_is_prefix = ngrams.size() < kNgram;
  ngrams.resize(asked.last_is_prefix ? 1 : ngrams.size() - (kNgram - 1));
  std::sort(ngrams.begin(), ngrams.end());
  ngrams.erase(std::unique(ngrams.begin(), ngrams.end()), ngrams.end());
  for (const std::string_view ngram : ngrams) asked.groups.push_back({std::string(prefix).append(ngram)});
  return asked;
}

}  // namespace

std::vector<WordTerms> QueryWords(const Field& field, std::string_view text) {
  if (field.IsNumber()) return {};
  const std::string prefix = PrefixOf(field);
  if (HoldsPlainWords(field)) return AskForWords({prefix}).Of(text);

  const size_t room = kLongestTerm - prefix.size();
  std::vector<WordTerms> words;
  const auto ask_for = [&](std::string_view word) { words.push_back({{{std::string(prefix).append(word)}}, false}); };
  if (field.list_ancestor) {
    if (!text.empty()) ask_for(WholeDirectory(text, room));
    return words;
  }
  std::string kept;
  ForEachWord(field, text, [&](std::string_view word) {
    if (field.ngram) {
      if (!word.empty()) words.push_back(AskForNgrams(prefix, word));
    } else if (field.analyzer == Analyzer::kKeyword) {
      ask_for(FitKeyword(word, room, kept));
    } else if (word.size() <= room) {
      ask_for(word);
    }
  });
  return words;
}

std::vector<WordTerms> QueryWordsInAll(const Mapping& mapping, std::string_view text) {
  return AskForWords(PrefixesOfAll(mapping)).Of(text);
}

std::vector<std::string> PrefixesOfAll(const Mapping& mapping) {
  std::vector<std::string> prefixes{std::string(kAllPrefix)};
  for (const Field& field : mapping.fields()) {
    if (field.in_all && HoldsPlainWords(field)) prefixes.push_back(PrefixOf(field));
  }
  return prefixes;
}

std::vector<TextPiece> PiecesOf(std::string_view text) {
  ListPieces list;
  WordSplitter splitter;
  splitter.Split(text, list);
  return std::move(list.pieces);
}

std::string ExactTerm(const Field& field, std::string_view value) {
  const std::vector<WordTerms> words = QueryWords(field, value);
  return words.size() == 1 && words.front().groups.size() == 1 ? words.front().groups.front().front() : std::string();
}

}  // namespace quarrox::elasticd
