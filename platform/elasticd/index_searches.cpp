#include "index_searches.h"

#include <algorithm>

#include "common/json.h"
#include "error_code.h"
#include "query_parser.h"

namespace quarrox::elasticd {
namespace {

// Asks for how good a hit is, as if that were a field.
constexpr char kScore[] = "_score";

// A search that meets commit after commit is tried again so often.
constexpr int kMostRefreshes = 20;

std::vector<std::pair<unsigned int, bool>> ParseSort(const Mapping& mapping, const Json::Value& sort) {
  std::vector<std::pair<unsigned int, bool>> keys;
  for (const Json::Value& key : sort) {
    const bool is_object = key.isObject() && key.size() == 1;
    const std::string name = is_object ? key.begin().name() : key.isString() ? key.asString() : std::string();
    const Json::Value direction = is_object ? *key.begin() : Json::Value("asc");
    const Field field = mapping.Get(name);
    if (!field.IsNumber() || (direction != "asc" && direction != "desc")) {
      throw Error(kBadQuery,
                  "sort takes fields that hold numbers, as NAME or {NAME: \"asc\" or \"desc\"}, not " + toString(key));
    }
    keys.emplace_back(field.number, direction == "desc");
  }
  return keys;
}

// Runs what reads until no commit has come in between.
template <typename Read>
auto Retry(Reader& reader, Places& places, Read read) {
  for (int left = kMostRefreshes;; --left) {
    try {
      return read();
    } catch (const OutdatedReader&) {
      if (left == 0) throw;
      reader.Refresh();
      places.Forget();
    }
  }
}

}  // namespace

void AppendElement(Answer& answer, bool& first, const Json::Value& value) {
  if (!first) answer.Append(",");
  first = false;
  answer.Append(toString(value));
}

void Index::SearchCommitted(const SearchRequest& request, Answer& answer) {
  const std::lock_guard lock(search_mutex_);
  CheckState();
  if (searches_) {
    searches_->Refresh();
  } else if (files_.Exists()) {
    searches_ = std::make_unique<Searches>(files_.Database());
  } else {
    throw Error(kNoSuchIndex, "There is no database at " + files_.path());
  }
  Reader& reader = searches_->reader;
  Places& places = searches_->places;
  const SearchOptions options{request.from, request.size, ParseSort(mapping_, request.sort)};
  const SearchResult result = Retry(reader, places, [&] {
    return reader.Search(QueryParser(mapping_, path_fields_, places).Parse(request.qsl), options);
  });

  std::vector<std::string> names = request.load_fields;
  const bool with_score = std::erase(names, kScore) != 0;
  answer.Append("[");
  bool first = true;
  for (const Hit& hit : result.hits) {
    Json::Value fields = Retry(reader, places, [&] {
      const std::string packed = reader.Place(hit.id);
      if (packed.empty()) return Json::Value();  // deleted since
      const Place place = UnpackPlace(packed);
      const std::string directory = places.DirectoryPath(place.directory);
      if (names.empty() && with_score) return Json::Value(Json::objectValue);
      return ShowFields(reader, mapping_, path_fields_, hit.id, directory, place.name, names);
    });
    if (fields.isNull()) continue;
    if (with_score) fields[kScore] = hit.score;
    AppendElement(answer, first, fields);
  }
  answer.Append("],\"total\":" + std::to_string(result.total));
  answer.Append(result.exact ? ",\"exact\":true" : ",\"exact\":false");
}

void Index::Search(const SearchRequest& request, Answer& answer) {
  try {
    SearchCommitted(request, answer);
  } catch (const DamagedDatabase& error) {
    const std::lock_guard lock(mutex_);
    SetAside(error.reason);
    throw Error(kNoSuchIndex, "The index at " + files_.path() + " is damaged: " + error.reason);
  }
}

}  // namespace quarrox::elasticd
