// What a search found, and how it is printed.
#pragma once

#include <cstddef>
#include <cstdint>
#include <iosfwd>
#include <string>
#include <utility>
#include <vector>

namespace quarrox::ctl {

struct Hit {
  std::string share = {};
  std::string path = {};
  bool is_directory = false;
  int64_t size = 0;     // bytes
  int64_t changed = 0;  // seconds since the epoch
  double score = 0;
  std::string snippet = {};                           // a piece of its text; empty where none has the words
  std::vector<std::pair<size_t, size_t>> marks = {};  // the words in it: offsets and lengths in bytes
};

struct Found {
  std::vector<Hit> hits = {};  // the best of each share
  uint64_t total = 0;
  bool total_is_exact = true;
  bool total_is_least = false;  // where it is not exact: there are at least so many
  bool cut = false;             // not everything that may fit was looked at
  std::string suggestion = {};  // the line that was meant, perhaps; empty where nothing like it finds more
};

// One object a line; what was meant, perhaps, comes behind them.
void PrintHitsAsJson(const Found& found);

// A table whose first line is number `offset`, counted from 0. On a terminal the words are bold.
void PrintHits(const Found& found, size_t offset);

// For people who read the help: what a line may hold.
void PrintSearchLanguage(std::ostream& out);

}  // namespace quarrox::ctl
