// Code points: which are part of words, and how words are folded. Any thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace quarrox::elasticd {

struct CodePoint {
  int32_t value;  // negative for a byte that is no part of well-formed UTF-8
  size_t length;  // in bytes; 1 for such a byte
};

// The one that begins at `at`, which is inside `text`.
CodePoint DecodeAt(std::string_view text, size_t at);

// Letters, digits and the marks that combine with them.
bool IsWordCharacter(int32_t code_point);

// Of a script that is written without blanks between words, and with so many signs that two of them tell much.
bool IsIdeograph(int32_t code_point);

// Finds the words of texts beyond ASCII. Reuses its memory. One object, one thread.
class UnicodeSplitter {
 public:
  // A word, or where `ideographs` is true, several signs that stand together.
  struct Piece {
    std::string_view text;  // folded UTF-8; the first 16 bytes may be read whatever its length
    bool ideographs;
  };

  // The pieces of `run` in order, good until the next call. Words longer than kLongestWord are left out.
  const std::vector<Piece>& Split(std::string_view run);

 private:
  struct Place {
    size_t offset, length;
    bool ideographs;
  };

  size_t SplitSegment(std::string_view run, size_t begin);
  void FoldSegment(std::string_view segment);
  void Take(int32_t code_point);
  void EndPiece();

  std::string bytes_;          // of the pieces, one after the other
  size_t begin_ = 0;           // in bytes_, of the piece that is being made
  bool ideographs_ = false;    // whether that is one of ideographs
  std::vector<Place> places_;  // of the pieces that are made
  std::vector<Piece> pieces_;
};

}  // namespace quarrox::elasticd
