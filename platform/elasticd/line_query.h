// From a line that a person typed to what the index is asked.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "analysis.h"
#include "database.h"
#include "mapping.h"
#include "name_rating.h"
#include "places.h"
#include "query.h"
#include "search_line.h"

namespace quarrox::elasticd {

// What a line means depends on.
struct LineSettings {
  int64_t now = 0;  // seconds since the epoch
  // The types of files by the names that people call them by, each as its extensions. Directories are known anyway.
  std::map<std::string, std::vector<std::string>> types;
};

// What a line looks for in texts.
struct LineWord {
  std::vector<TextPiece> pieces;
  bool beginning = false;  // the last one stands for all that begin so
  size_t begin = 0;        // in the line, in bytes
  size_t end = 0;
};

// What the lines of one query may cost together.
struct LineBudget {
  size_t words = 0;                             // so far, with those that must not be there
  size_t paths = 0;                             // conditions on paths
  std::shared_ptr<size_t> looks = MostLooks();  // so many documents may yet be looked at
  static std::shared_ptr<size_t> MostLooks();

  // Counts a condition on paths; false where there are too many.
  bool TakePath();
};

// Paths are looked up while a query is made, so it is good for what the places then hold. What it returns looks into
// the store, too, and is good for as long as that.
class LineQuery {
 public:
  LineQuery(const Mapping& mapping, const Store& store, const Places& places, LineSettings settings,
            LineBudget& budget);

  // Throws Error 613 that says what cannot be read, and in which column; not logged.
  Query Make(std::string_view line);

  // Of the last line, without those that must not be there.
  const std::vector<LineWord>& words() const { return words_; }

  // Whether there were more documents to be looked at for phrases than are.
  bool cut() const { return *left_ == 0; }

 private:
  // A condition that says nothing, such as a lone dash, gives no query: it is kAll without parts.
  Query Of(const LineNode& node, bool wanted);
  Query All(const std::vector<LineNode>& nodes, bool wanted);
  Query Any(const std::vector<LineNode>& nodes, bool wanted);
  Query Text(const LineNode& node, bool wanted);
  Query Word(const std::string& word, bool beginning) const;
  Query Words(const std::vector<TextPiece>& pieces, bool beginning) const;
  Query InOrder(const std::vector<TextPiece>& pieces) const;
  Query NamedSo(const std::vector<NameWord>& words) const;
  Query ByName(const LineNode& node) const;
  Query ByExtensions(const std::vector<std::string>& extensions) const;
  Query ByType(const LineNode& node) const;
  Query BySize(const LineNode& node) const;
  Query ByDate(const LineNode& node) const;
  Query ByPath(const LineNode& node);
  Query ByField(const LineNode& node);
  Query InNumbers(const char* field, double low, double high) const;
  [[noreturn]] void Refuse(const LineNode& node, const char* wanted) const;

  const Mapping& mapping_;
  const Store& store_;
  const Places& places_;
  const LineSettings settings_;
  const std::vector<std::string> prefixes_;
  std::string_view line_;
  std::vector<LineWord> words_;
  LineBudget& budget_;
  const std::shared_ptr<size_t> left_;  // of the budget; a query goes on with it when this object is gone
};

}  // namespace quarrox::elasticd
