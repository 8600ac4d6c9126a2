// The piece of a text that shows best why it was found.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <unordered_set>
#include <utility>
#include <vector>

#include "analysis.h"

namespace quarrox::elasticd {

struct Snippet {
  std::string text;                              // on one line, with single blanks; empty where no word was found
  std::vector<std::pair<size_t, size_t>> marks;  // offsets and lengths in bytes of the words that were looked for
};

// The words that are looked for, folded. One object, one thread.
class SnippetWords {
 public:
  void Add(const TextPiece& piece, bool beginning);
  bool empty() const { return words_.empty() && beginnings_.empty(); }

  // Finds the piece in which most different words stand close to each other, and of several the first. Only the
  // beginning of a very long text is looked at. A text may be any bytes.
  Snippet Find(std::string_view text) const;

 private:
  struct Found {
    size_t begin, end;  // in the text
    size_t word;        // which of the words it is
  };

  void TakeRun(std::string_view text, size_t begin, size_t end, std::vector<Found>& found) const;
  void TakeForeign(std::string_view text, size_t begin, size_t end, std::vector<Found>& found) const;
  void TakeWord(const std::string& folded, size_t begin, size_t end, std::vector<Found>& found) const;
  void TakeSigns(std::string_view text, size_t begin, size_t end, std::vector<Found>& found) const;
  std::vector<Found> FindAll(std::string_view text) const;

  std::vector<TextPiece> words_;
  std::vector<std::string> beginnings_;
  bool firsts_[256] = {};  // the bytes with which a word may begin
};

}  // namespace quarrox::elasticd
