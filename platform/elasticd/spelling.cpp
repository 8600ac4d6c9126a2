#include "spelling.h"

#include <algorithm>
#include <cstdlib>
#include <utility>

#include "analysis_unicode.h"

namespace quarrox::elasticd {
namespace {

constexpr size_t kShortWord = 4;
constexpr size_t kMostBytes = 4;  // of a letter in UTF-8

using Letters = std::vector<int32_t>;

void Split(const std::string& word, Letters& letters) {
  letters.clear();
  for (size_t at = 0; at < word.size();) {
    const CodePoint letter = DecodeAt(word, at);
    letters.push_back(letter.value);
    at += letter.length;
  }
}

// The changes from one word to another one, by a table of which three rows are kept.
class Distance {
 public:
  size_t operator()(const Letters& a, const Letters& b) {
    for (std::vector<size_t>& row : rows_) row.assign(b.size() + 1, 0);
    for (size_t j = 0; j <= b.size(); ++j) rows_[0][j] = j;
    for (size_t i = 1; i <= a.size(); ++i) {
      std::rotate(rows_.begin(), rows_.end() - 1, rows_.end());
      rows_[0][0] = i;
      for (size_t j = 1; j <= b.size(); ++j) {
        const size_t other = rows_[1][j - 1] + (a[i - 1] == b[j - 1] ? 0 : 1);
        rows_[0][j] = std::min({other, rows_[1][j] + 1, rows_[0][j - 1] + 1});
        const bool crossed = i > 1 && j > 1 && a[i - 1] == b[j - 2] && a[i - 2] == b[j - 1];
        if (crossed) rows_[0][j] = std::min(rows_[0][j], rows_[2][j - 2] + 1);
      }
    }
    return rows_[0][b.size()];
  }

 private:
  std::array<std::vector<size_t>, 3> rows_;  // the last first
};

size_t Difference(size_t a, size_t b) {
  return a > b ? a - b : b - a;
}

}  // namespace

std::array<std::vector<std::string>, 2> FindNear(const Reader& reader, const std::string& word) {
  std::array<std::vector<std::string>, 2> near;
  Letters letters;
  Split(word, letters);
  const size_t most = letters.size() <= kShortWord ? 1 : near.size();
  Letters others;
  Distance distance;
  reader.ForEachSuggestion([&](const std::string& other) {
    if (Difference(word.size(), other.size()) > most * kMostBytes) return;
    Split(other, others);
    if (Difference(letters.size(), others.size()) > most) return;
    const size_t changes = distance(letters, others);
    if (changes > 0 && changes <= most) near[changes - 1].push_back(other);
  });
  return near;
}

}  // namespace quarrox::elasticd
