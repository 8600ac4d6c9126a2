// What people search for in a corpus: made from its texts and names, the same each time.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include <json/json.h>

#include "search_bench_bare.h"

namespace quarrox::bench {

// One search, as the engine takes it and as the terms that a document must have.
struct SearchedFor {
  Json::Value qsl;
  std::vector<std::string> terms;
};

// Typed lines of two words that stand in one text, so that each finds something. By turns both words are frequent (in
// 5 % of the documents or more), one is, or none: the others are in 0.1 % to 1 %. `documents` are in the database.
std::vector<SearchedFor> MakeWordPairs(const BareSearch& database, size_t documents, size_t count);

// Pieces of 3 to 8 letters out of the files' names.
std::vector<SearchedFor> MakeNamePieces(const std::vector<std::string>& paths, size_t count);

}  // namespace quarrox::bench
