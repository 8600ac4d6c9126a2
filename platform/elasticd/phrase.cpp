#include "phrase.h"

#include <utility>

#include "analysis_unicode.h"

namespace quarrox::elasticd {
namespace {

template <typename Take>
void ForEachSign(std::string_view signs, Take take) {
  for (size_t at = 0; at < signs.size();) {
    const size_t length = DecodeAt(signs, at).length;
    take(signs.substr(at, length));
    at += length;
  }
}

// Follows how many words of the phrase stand behind each other up to the word that came last.
struct Matcher {
  const std::vector<std::string>& words;
  const std::vector<size_t>& shorter;
  size_t matched = 0;

  void Word(std::string_view word) {
    if (matched == words.size()) return;
    while (matched > 0 && words[matched] != word) matched = shorter[matched];
    if (words[matched] == word) ++matched;
  }
  void Ideographs(std::string_view signs) {
    ForEachSign(signs, [this](std::string_view sign) { Word(sign); });
  }
};

}  // namespace

std::vector<std::string> WordsOf(const std::vector<TextPiece>& pieces) {
  std::vector<std::string> words;
  for (const TextPiece& piece : pieces) {
    if (piece.ideographs) {
      ForEachSign(piece.text, [&](std::string_view sign) { words.emplace_back(sign); });
    } else {
      words.push_back(piece.text);
    }
  }
  return words;
}

Phrase::Phrase(std::vector<std::string> words) : words_(std::move(words)), shorter_(words_.size() + 1, 0) {
  for (size_t i = 1, matched = 0; i < words_.size(); ++i) {
    while (matched > 0 && words_[i] != words_[matched]) matched = shorter_[matched];
    if (words_[i] == words_[matched]) ++matched;
    shorter_[i + 1] = matched;
  }
}

bool Phrase::StandsIn(std::string_view text) {
  Matcher matcher{words_, shorter_};
  splitter_.Split(text, matcher);
  return matcher.matched == words_.size();
}

}  // namespace quarrox::elasticd
