#include "index_listing.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <utility>

#include "common/json.h"

namespace quarrox::elasticd {
namespace {

// Up to here a double tells each whole number.
constexpr double kLargestWhole = 9007199254740992.0;

void AppendNumber(std::string& text, const Field& field, double number) {
  if (field.type == FieldType::kBool) {
    text += number != 0 ? "true" : "false";
  } else if (std::fabs(number) <= kLargestWhole && std::trunc(number) == number && field.type == FieldType::kInt) {
    char digits[24];
    const auto [end, error] = std::to_chars(digits, digits + sizeof(digits), static_cast<int64_t>(number));
    text.append(digits, end);
  } else {
    text += toString(Json::Value(number));
  }
}

}  // namespace

Listing::Listing(const Writer& writer, const Mapping& mapping, const PathFields& path_fields,
                 const std::vector<std::string>& names, Answer& answer)
    : writer_(writer), path_fields_(path_fields), answer_(answer) {
  for (const std::string& name : names) {
    columns_.push_back({name, toString(Json::Value(name)) + ':', mapping.Get(name), path_fields.Has(name)});
  }
}

bool Listing::CanShow(const Mapping& mapping, const PathFields& path_fields, const std::vector<std::string>& names) {
  const auto can_show = [&](const std::string& name) {
    const Field* field = mapping.Find(name);
    return path_fields.Has(name) || (field != nullptr && field->IsNumber() && field->stored);
  };
  return !names.empty() && std::all_of(names.begin(), names.end(), can_show);
}

void Listing::Add(DocumentId id, const std::string& directory, const std::string& base) {
  rows_.push_back({id, directory, base});
  if (rows_.size() == kAtOnce) Finish();
}

void Listing::AppendRow(const Row& row, const std::vector<std::vector<double>>& numbers, size_t index) {
  text_ = std::exchange(first_, false) ? "{" : ",{";
  for (size_t i = 0; i < columns_.size(); ++i) {
    const Column& column = columns_[i];
    if (!column.is_path_field && std::isnan(numbers[i][index])) continue;
    if (text_.back() != '{') text_ += ',';
    text_ += column.key;
    if (column.is_path_field) {
      text_ += toString(path_fields_.Value(column.name, row.directory, row.base));
    } else {
      AppendNumber(text_, column.field, numbers[i][index]);
    }
  }
  answer_.Append(text_ += '}');
}

void Listing::Finish() {
  std::sort(rows_.begin(), rows_.end(), [](const Row& a, const Row& b) { return a.id < b.id; });
  std::vector<DocumentId> ids;
  ids.reserve(rows_.size());
  for (const Row& row : rows_) ids.push_back(row.id);
  std::vector<std::vector<double>> numbers;
  numbers.reserve(columns_.size());
  for (const Column& column : columns_) {
    numbers.push_back(column.is_path_field ? std::vector<double>() : writer_.Numbers(column.field.number, ids));
  }
  for (size_t i = 0; i < rows_.size(); ++i) AppendRow(rows_[i], numbers, i);
  rows_.clear();
}

void ForEachAt(const Writer& writer, const Places& places, const std::string& path, bool is_prefix, bool in_any_order,
               const Places::Take& take) {
  if (!is_prefix) {
    const DocumentId id = path.empty() ? 0 : places.Find(path);
    const size_t slash = path.rfind('/');
    if (id != 0) take(id, path.substr(0, slash), path.substr(slash + 1));
  } else if (path == "/" && in_any_order) {
    writer.ForEachPlace([&](DocumentId id, const std::string& packed) {
      const Place place = UnpackPlace(packed);
      return take(id, places.DirectoryPath(place.directory), place.name);
    });
  } else {
    places.ForEach(path, take);
  }
}

}  // namespace quarrox::elasticd
