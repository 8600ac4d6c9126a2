// Words that stand one behind the other. Of ideographs, each one counts as a word.
//
// The index does not keep where words stand: in a tree of its own for each word of each document, that would take more
// room than all the rest. What was kept of a document is looked at instead.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "analysis.h"
#include "analysis_words.h"

namespace quarrox::elasticd {

// Every word, and every ideograph.
std::vector<std::string> WordsOf(const std::vector<TextPiece>& pieces);

// One object, one thread.
class Phrase {
 public:
  // As WordsOf() gives them; one at least.
  explicit Phrase(std::vector<std::string> words);

  bool StandsIn(std::string_view text);

 private:
  const std::vector<std::string> words_;
  std::vector<size_t> shorter_;  // where to go on behind so many words, when the next is another one
  WordSplitter splitter_;
};

}  // namespace quarrox::elasticd
