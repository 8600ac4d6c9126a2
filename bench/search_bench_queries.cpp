#include "search_bench_queries.h"

#include <algorithm>
#include <random>
#include <stdexcept>

#include "analysis.h"
#include "common/strings.h"
#include "fileindex/elastic_control.h"
#include "mapping.h"

namespace quarrox::bench {
namespace {

constexpr double kFrequent = 0.05;
constexpr double kMiddlingLeast = 0.001;
constexpr double kMiddlingMost = 0.01;
constexpr size_t kShortestWord = 3;
constexpr size_t kShortestPiece = 3;
constexpr size_t kLongestPiece = 8;
constexpr size_t kPatience = 100;  // so many texts or names are tried for each search

using Word = BareSearch::Word;
using Random = std::mt19937;  // whose numbers are the same everywhere; a distribution's are not

size_t Below(Random& random, size_t end) {
  return random() % end;
}

// Takes one out at random.
Word Take(Random& random, std::vector<Word>& words) {
  const auto at = words.begin() + static_cast<std::ptrdiff_t>(Below(random, words.size()));
  Word word = *at;
  words.erase(at);
  return word;
}

// Two words of a document of which so many are frequent; none where it has not enough.
std::vector<Word> TakePair(Random& random, const std::vector<Word>& words, size_t wanted_frequent) {
  std::vector<Word> frequent;
  std::vector<Word> middling;
  for (const Word& word : words) {
    if (word.text.size() < kShortestWord) continue;
    if (word.share >= kFrequent) frequent.push_back(word);
    if (word.share >= kMiddlingLeast && word.share <= kMiddlingMost) middling.push_back(word);
  }
  std::vector<Word> pair;
  for (size_t i = 0; i < 2; ++i) {
    std::vector<Word>& from = i < wanted_frequent ? frequent : middling;
    if (from.empty()) return {};
    pair.push_back(Take(random, from));
  }
  return pair;
}

bool IsLetter(char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
}

// A piece that begins at random, or nothing where the letters are too few there.
std::string TakePiece(Random& random, const std::string& name) {
  const auto begin = name.begin() + static_cast<std::ptrdiff_t>(Below(random, name.size()));
  const size_t wanted = kShortestPiece + Below(random, kLongestPiece - kShortestPiece + 1);
  const auto room = std::min(name.end() - begin, static_cast<std::ptrdiff_t>(wanted));
  const std::string piece(begin, std::find_if_not(begin, begin + room, IsLetter));
  return piece.size() < kShortestPiece ? std::string() : piece;
}

}  // namespace

std::vector<SearchedFor> MakeWordPairs(const BareSearch& database, size_t documents, size_t count) {
  Random random;
  std::vector<SearchedFor> searches;
  for (size_t left = count * kPatience; searches.size() < count; --left) {
    if (left == 0) throw std::runtime_error("the texts have too few words in common");
    const auto document = static_cast<unsigned int>(1 + Below(random, documents));
    const std::vector<Word> pair = TakePair(random, database.Words(document), 2 - searches.size() % 3);
    if (pair.empty()) continue;
    SearchedFor search;
    search.qsl["query_string"]["query"] = pair[0].text + " " + pair[1].text;
    search.terms = {pair[0].term, pair[1].term};
    searches.push_back(search);
  }
  return searches;
}

std::vector<SearchedFor> MakeNamePieces(const std::vector<std::string>& paths, size_t count) {
  constexpr char kField[] = "VEXOMDSearchFileName";
  const elasticd::Field field = elasticd::Mapping(fileindex::elastic::GetFileIndexMappings()).Get(kField);
  Random random;
  std::vector<SearchedFor> searches;
  for (size_t left = count * kPatience; searches.size() < count; --left) {
    if (left == 0) throw std::runtime_error("the files' names have too few letters");
    const std::string piece = TakePiece(random, Basename(paths[Below(random, paths.size())]));
    if (piece.empty()) continue;
    SearchedFor search;
    search.qsl["match"][kField] = piece;
    for (const elasticd::WordTerms& word : elasticd::QueryWords(field, piece)) {
      for (const auto& group : word.groups) search.terms.push_back(group.front());
    }
    searches.push_back(search);
  }
  return searches;
}

}  // namespace quarrox::bench
