// How well a file's name fits what a person looks for: the whole name before one that begins so, that before one that
// has it somewhere, and any of them before the best text. Any thread.
#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace quarrox::elasticd {

// More than all words of a query together are worth in a text.
inline constexpr double kNamePart = 10000;
inline constexpr double kNameBeginning = 2 * kNamePart;
inline constexpr double kWholeName = 3 * kNamePart;

// A word of a name, or its beginning.
struct NameWord {
  std::string text;  // folded
  bool beginning = false;
};

// What a name is worth in which all of these words stand; negative for others. The words are as WordsOf() gives them.
double RateWords(const std::vector<NameWord>& words, std::string_view name);

// What a name is worth that has a text as a part of it; negative for others.
double RatePart(const std::string& folded_part, std::string_view name);

// A text in which stars stand for any letters.
class NamePattern {
 public:
  NamePattern(std::string_view text, const std::vector<size_t>& stars);

  // Whether it stands for the whole of a folded text.
  bool Fits(std::string_view folded) const;

  // What stands between the stars, folded.
  const std::vector<std::string>& pieces() const { return pieces_; }

 private:
  std::vector<std::string> pieces_;  // one more than stars
};

}  // namespace quarrox::elasticd
