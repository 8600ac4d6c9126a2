#include "index_searches.h"

#include <algorithm>
#include <memory>
#include <utility>

#include "common/json.h"
#include "error_code.h"
#include "query_parser.h"
#include "readable.h"
#include "snippet.h"
#include "spelling.h"

namespace quarrox::elasticd {
namespace {

// Asks for how good a hit is, as if that were a field.
constexpr char kScore[] = "_score";

// Asks for the piece of a text that shows why it was found: {"text", "marks": [[OFFSET, LENGTH], ...]}, in bytes.
constexpr char kSnippet[] = "_snippet";

// Where fewer are found, perhaps another word was meant.
constexpr uint64_t kLittle = 3;

// A word that some documents have was meant all the same, unless so many times more have another one.
constexpr uint64_t kMuchMore = 10;

// For users all words of the dictionary are looked at for each of these.
constexpr size_t kMostGuessed = 4;

// More keys than anybody sorts by.
constexpr Json::ArrayIndex kMostKeys = 16;

// A search that meets commit after commit is tried again so often.
constexpr int kMostRefreshes = 20;

std::vector<std::pair<unsigned int, bool>> ParseSort(const Mapping& mapping, const Json::Value& sort) {
  std::vector<std::pair<unsigned int, bool>> keys;
  if (sort.size() > kMostKeys) throw Error(kBadQuery, "sort takes " + std::to_string(kMostKeys) + " fields at most");
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

// What of a hit is handed out.
class HitWriter {
 public:
  HitWriter(Searches& searches, const Mapping& mapping, const PathFields& path_fields, std::vector<std::string> names,
            const std::vector<LineWord>& words)
      : searches_(searches), mapping_(mapping), path_fields_(path_fields), names_(std::move(names)) {
    with_score_ = std::erase(names_, kScore) != 0;
    with_snippet_ = std::erase(names_, kSnippet) != 0;
    for (const LineWord& each : words) {
      for (const TextPiece& piece : each.pieces) {
        snippet_words_.Add(piece, each.beginning && &piece == &each.pieces.back());
      }
    }
  }

  // Null where the document was deleted since.
  Json::Value Show(const Hit& hit) {
    const std::string packed = searches_.reader.Place(hit.id);
    if (packed.empty()) return Json::Value();
    const Place place = UnpackPlace(packed);
    const std::string directory = searches_.places.DirectoryPath(place.directory);
    const bool plain = names_.empty() && (with_score_ || with_snippet_);
    Json::Value fields =
        plain ? Json::Value(Json::objectValue)
              : ShowFields(searches_.reader, mapping_, path_fields_, hit.id, directory, place.name, names_);
    if (fields.isNull()) return fields;
    if (with_score_) fields[kScore] = hit.score;
    if (with_snippet_ && !snippet_words_.empty()) ShowSnippet(hit.id, place.name, fields);
    return fields;
  }

 private:
  // Of the first text that has one of the words; long texts come first.
  void ShowSnippet(DocumentId id, const std::string& name, Json::Value& shown) const {
    Snippet found;
    ForEachText(searches_.reader, mapping_, id, [&](std::string_view text) {
      if (text != name) found = snippet_words_.Find(text);
      return found.text.empty();
    });
    if (found.text.empty()) return;
    Json::Value& snippet = shown[kSnippet];
    snippet["text"] = found.text;
    snippet["marks"] = Json::Value(Json::arrayValue);
    for (const auto& [offset, length] : found.marks) {
      Json::Value mark(Json::arrayValue);
      mark.append(Json::UInt64{offset});
      mark.append(Json::UInt64{length});
      snippet["marks"].append(mark);
    }
  }

  Searches& searches_;
  const Mapping& mapping_;
  const PathFields& path_fields_;
  std::vector<std::string> names_;
  bool with_score_ = false;
  bool with_snippet_ = false;
  SnippetWords snippet_words_;
};

// The line in a query as the command asks it: alone, or first among what must be.
Json::Value* FindLine(Json::Value& qsl) {
  Json::Value* at = &qsl;
  const auto step = [&at](const char* member) {
    const bool has = at->isObject() && at->isMember(member);
    if (has) at = &(*at)[member];
    return has;
  };
  if (step("bool")) {
    if (!step("must") || !at->isArray() || at->empty()) return nullptr;
    at = &(*at)[0];
  }
  if (!step("query_string")) return nullptr;
  step("query");
  return at->isString() ? at : nullptr;
}

// One question of somebody: its query, and what else has to be looked for to answer it.
class Question {
 public:
  Question(Searches& searches, const Mapping& mapping, const PathFields& path_fields, const SearchRequest& request)
      : reader_(searches.reader),
        mapping_(mapping),
        request_(request),
        options_{request.from, request.size, ParseSort(mapping, request.sort), request.as.has_value()},
        parser_(mapping, path_fields, searches.reader, searches.places) {
    if (request.as) readable_ = std::make_unique<ReadableOnly>(searches.reader, searches.places, mapping, *request.as);
  }

  SearchResult Ask() { return Search(parser_.Parse(request_.qsl), options_); }

  // Whether a hit may be told of; it may have changed, as may the file, since it was found.
  bool MayShow(const Hit& hit) { return !readable_ || readable_->IsReadable(hit.id); }

  const std::vector<LineWord>& words() const { return parser_.line_words(); }
  bool cut() const { return parser_.cut() || (readable_ && readable_->cut()); }

  // The line with words that documents have in place of those that none has, where that finds more than `found`; else
  // empty.
  std::string Suggest(uint64_t found) {
    const std::vector<LineWord> words = parser_.first_line_words();
    Json::Value qsl = request_.qsl;
    Json::Value* const line = FindLine(qsl);
    if (line == nullptr || (readable_ && words.size() > kMostGuessed)) return {};
    std::string changed = line->asString();
    for (auto word = words.rbegin(); word != words.rend(); ++word) {
      if (word->pieces.size() != 1 || word->pieces.front().ideographs || word->beginning) continue;
      const std::string meant = Meant(word->pieces.front().text);
      if (meant.empty() || CountWith(meant) <= CountWith(word->pieces.front().text) * kMuchMore) continue;
      const bool quoted = changed[word->begin] == '"';
      changed.replace(word->begin, word->end - word->begin, quoted ? '"' + meant + '"' : meant);
    }
    if (changed == line->asString()) return {};
    *line = changed;
    return Search(parser_.Parse(qsl), JustCount()).total > found ? changed : std::string();
  }

 private:
  // The word that was meant, perhaps. For a user it is sought among the words of what they may read: that there is none
  // because another word is nearer would tell of that one.
  std::string Meant(const std::string& word) const {
    if (!readable_) return reader_.Suggestion(word);
    std::string best;
    uint64_t most = 0;
    for (const std::vector<std::string>& near : FindNear(reader_, word)) {
      for (const std::string& candidate : near) {
        const uint64_t count = CountWith(candidate);
        if (count > most) best = candidate;
        most = std::max(most, count);
      }
      if (most > 0) break;
    }
    return best;
  }

  SearchOptions JustCount() const { return {0, 0, {}, options_.discreet}; }

  SearchResult Search(Query query, const SearchOptions& options) const {
    return reader_.Search(readable_ ? readable_->Restrict(std::move(query)) : std::move(query), options);
  }

  // How many documents have a word that is looked for in no particular field; of those that have it under several
  // prefixes, the most under one.
  uint64_t CountWith(const std::string& word) const {
    uint64_t most = 0;
    for (const std::string& prefix : PrefixesOfAll(mapping_)) {
      most = std::max(
          most, readable_ ? Search(Query::Term(prefix + word), JustCount()).total : reader_.CountWith(prefix + word));
    }
    return most;
  }

  const Reader& reader_;
  const Mapping& mapping_;
  const SearchRequest& request_;
  const SearchOptions options_;
  QueryParser parser_;
  std::unique_ptr<ReadableOnly> readable_;
};

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
  Question question(*searches_, mapping_, path_fields_, request);
  const SearchResult result = Retry(reader, places, [&] { return question.Ask(); });

  HitWriter writer(*searches_, mapping_, path_fields_, request.load_fields, question.words());
  answer.Append("[");
  bool first = true;
  for (const Hit& hit : result.hits) {
    const Json::Value fields =
        Retry(reader, places, [&] { return question.MayShow(hit) ? writer.Show(hit) : Json::Value(); });
    if (!fields.isNull()) AppendElement(answer, first, fields);
  }
  answer.Append("],\"total\":" + std::to_string(result.total));
  answer.Append(result.exact ? ",\"exact\":true" : ",\"exact\":false");
  if (request.as && !result.exact) answer.Append(",\"at_least\":true");
  if (result.cut || question.cut()) answer.Append(",\"cut\":true");
  if (!request.suggest || result.total >= kLittle) return;
  std::string suggestion;
  try {
    suggestion = Retry(reader, places, [&] { return question.Suggest(result.total); });
  } catch (const Error& error) {
    if (!request.as || error.code != kBadQuery) throw;  // what takes too long to be found for a user is not suggested
  }
  if (!suggestion.empty()) answer.Append(",\"suggestion\":" + toString(Json::Value(suggestion)));
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
