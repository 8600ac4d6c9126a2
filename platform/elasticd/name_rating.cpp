#include "name_rating.h"

#include <algorithm>

#include "analysis.h"
#include "phrase.h"

namespace quarrox::elasticd {
namespace {

// A dot in front hides a file; it does not begin an extension.
std::string_view WithoutExtension(std::string_view name) {
  const size_t dot = name.rfind('.');
  return dot == std::string_view::npos || dot == 0 ? name : name.substr(0, dot);
}

bool Fits(const NameWord& word, const std::string& of_name) {
  return word.beginning ? of_name.starts_with(word.text) : of_name == word.text;
}

}  // namespace

double RateWords(const std::vector<NameWord>& words, std::string_view name) {
  const std::vector<std::string> of_name = WordsOf(PiecesOf(name));
  const bool begins = words.size() <= of_name.size() && std::equal(words.begin(), words.end(), of_name.begin(), Fits);
  if (begins) {
    const bool whole =
        words.size() == of_name.size() || words.size() == WordsOf(PiecesOf(WithoutExtension(name))).size();
    return whole ? kWholeName : kNameBeginning;
  }
  const bool has_all = std::all_of(words.begin(), words.end(), [&](const NameWord& word) {
    return std::any_of(of_name.begin(), of_name.end(), [&](const std::string& other) { return Fits(word, other); });
  });
  return has_all ? kNamePart : -1;
}

double RatePart(const std::string& folded_part, std::string_view name) {
  const std::string folded = FoldWord(name);
  const size_t at = folded.find(folded_part);
  if (at == std::string::npos) return -1;
  if (folded == folded_part || WithoutExtension(folded) == folded_part) return kWholeName;
  return at == 0 ? kNameBeginning : kNamePart;
}

NamePattern::NamePattern(std::string_view text, const std::vector<size_t>& stars) {
  size_t begin = 0;
  for (const size_t star : stars) {
    pieces_.push_back(FoldWord(text.substr(begin, star - begin)));
    begin = star + 1;
  }
  pieces_.push_back(FoldWord(text.substr(begin)));
}

bool NamePattern::Fits(std::string_view folded) const {
  const std::string& first = pieces_.front();
  const std::string& last = pieces_.back();
  if (pieces_.size() == 1) return folded == first;
  if (folded.size() < first.size() + last.size() || !folded.starts_with(first) || !folded.ends_with(last)) return false;
  const size_t end = folded.size() - last.size();
  size_t at = first.size();
  for (size_t i = 1; i + 1 < pieces_.size(); ++i) {
    const size_t found = folded.substr(0, end).find(pieces_[i], at);
    if (found == std::string_view::npos) return false;
    at = found + pieces_[i].size();
  }
  return true;
}

}  // namespace quarrox::elasticd
