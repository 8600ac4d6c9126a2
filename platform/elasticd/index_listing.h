// Many documents at once, where only their paths and numbers are wanted: these are kept by field, so that the documents
// themselves need not be read.
#pragma once

#include <string>
#include <vector>

#include "answer.h"
#include "database.h"
#include "fields.h"
#include "mapping.h"
#include "places.h"

namespace quarrox::elasticd {

// Appends the elements of an array to an answer, with what ShowFields would show. Throws what the database and the
// answer throw. One object, one thread.
class Listing {
 public:
  Listing(const Writer& writer, const Mapping& mapping, const PathFields& path_fields,
          const std::vector<std::string>& names, Answer& answer);

  // Whether it can show these fields.
  static bool CanShow(const Mapping& mapping, const PathFields& path_fields, const std::vector<std::string>& names);

  // They may be held back until Finish(), which nothing follows.
  void Add(DocumentId id, const std::string& directory, const std::string& base);
  void Finish();

 private:
  // Documents of which the numbers are read together.
  static constexpr size_t kAtOnce = 1000;

  struct Column {
    std::string name;
    std::string key;  // as it stands in the answer
    Field field;
    bool is_path_field;
  };
  struct Row {
    DocumentId id;
    std::string directory;
    std::string base;
  };

  void AppendRow(const Row& row, const std::vector<std::vector<double>>& numbers, size_t index);

  const Writer& writer_;
  const PathFields& path_fields_;
  Answer& answer_;
  std::vector<Column> columns_;
  std::vector<Row> rows_;
  std::string text_;
  bool first_ = true;
};

// Hands out the document at a path, or all whose path begins so; `in_any_order` saves reading the directories.
void ForEachAt(const Writer& writer, const Places& places, const std::string& path, bool is_prefix, bool in_any_order,
               const Places::Take& take);

}  // namespace quarrox::elasticd
