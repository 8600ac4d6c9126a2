// A line that a person typed, as a tree. What the line may hold stands in common/search_language.h. Any thread.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "common/search_language.h"

namespace quarrox::elasticd {

struct LineNode {
  enum Kind {
    kAll,   // all of `parts`
    kAny,   // any of `parts`
    kNot,   // not the only one of `parts`
    kText,  // words
    kField  // what `field` says of `text`
  };

  Kind kind = kAll;
  SearchField field = SearchField::kNone;
  std::string text = {};           // without quotes and backslashes
  std::vector<size_t> stars = {};  // where in `text` a * stands for anything
  bool quoted = false;
  size_t begin = 0;  // in the line, in bytes
  size_t end = 0;
  std::vector<LineNode> parts = {};
};

// Throws Error 613 that says what cannot be read and where. The tree is no deeper and no larger than a person's.
LineNode ReadLine(std::string_view line);

// Throws Error 613 with the column, which counts characters from 1: "column 7: REASON".
[[noreturn]] void FailAt(std::string_view line, size_t at, const std::string& reason);

// As much of a text as a message shows.
std::string Shown(std::string_view text);

}  // namespace quarrox::elasticd
