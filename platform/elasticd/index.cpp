#include "index.h"

#include <algorithm>
#include <chrono>
#include <ctime>
#include <utility>

#include "common/json.h"
#include "common/log.h"
#include "document_change.h"
#include "error_code.h"
#include "index_listing.h"
#include "index_searches.h"
#include "query_parser.h"

namespace quarrox::elasticd {
namespace {

// Stands while the index has suggestions.
constexpr char kSuggestionsKey[] = "S";

// How long a document command waits for a recovery to end, before its caller is told to come back in half a minute.
constexpr std::chrono::seconds kWaitForRecovery(3);

// Documents that are collected before they are deleted.
constexpr size_t kDeletedAtOnce = 1000;

// A shorter word suggests nothing.
constexpr size_t kShortestSuggestion = 3;

bool IsRefusal(ErrorCode code) {
  return code == kBadArgument || code == kBadQuery || code == kNoSuchDocument || code == kNoSuchIndex;
}

// The words of texts, without numbers.
std::vector<std::string> SuggestionWords(const Mapping& mapping, const AnalyzedDocument& document) {
  std::string prefixes(kAllPrefix);
  for (const Field& field : mapping.fields()) {
    if (field.in_all && field.analyzer == Analyzer::kStandard && !field.IsNumber()) prefixes += PrefixOf(field);
  }
  std::vector<std::string> words;
  for (const auto& [term, count] : document.terms) {
    const std::string_view word = term.substr(1);
    const bool is_word = word.size() >= kShortestSuggestion && (word.front() < '0' || word.front() > '9');
    if (is_word && prefixes.find(term.front()) != std::string::npos) words.emplace_back(word);
  }
  return words;
}

// Of the texts among the fields.
size_t BytesOf(const Json::Value& fields) {
  size_t bytes = 0;
  for (const Json::Value& field : fields) {
    const char* begin = nullptr;
    const char* end = nullptr;
    if (field.getString(&begin, &end)) bytes += static_cast<size_t>(end - begin);
  }
  return bytes;
}

std::string Base(const std::string& path) {
  return path.substr(path.rfind('/') + 1);
}

}  // namespace

struct Index::Open {
  Open(const std::string& directory, Writer::Mode mode, const Mapping& mapping)
      : writer(directory, mode), places(writer), analyzer(mapping), other_analyzer(mapping) {}

  Writer writer;
  PlaceWriter places;
  DocumentAnalyzer analyzer;
  DocumentAnalyzer other_analyzer;
  // A document that was accepted and is not indexed yet. Whoever looks at the database finishes it first.
  struct Accepted {
    std::string path;
    Json::Value fields;
    const AnalyzedDocument* content;  // of `analyzer`, which does nothing else meanwhile
  };

  std::optional<Accepted> accepted;
  bool marked = true;        // nothing was changed since the database was closed in order
  size_t pending = 0;        // documents that are not committed
  size_t pending_bytes = 0;  // and the size of their texts
};

Index::Index(const std::string& path, const Json::Value& mappings, bool paused)
    : mapping_(mappings), path_fields_(mapping_), files_(path), state_(paused ? State::kPaused : State::kReady) {}

Index::~Index() = default;

std::string Index::path() const {
  const std::lock_guard lock(mutex_);
  return files_.path();
}

void Index::CheckState() const {
  switch (state_) {
    case State::kReady:
      return;
    case State::kRecovering:
      throw Error(kIndexRecovering, "The index at " + files_.path() + " is being checked");
    case State::kPaused:
      throw Error(kIndexPaused, "The index at " + files_.path() + " is paused");
    case State::kGone:
      break;
  }
  throw Error(kNoSuchIndex, "The index at " + files_.path() + " is gone");
}

void Index::WaitForRecovery(std::unique_lock<std::mutex>& lock) {
  recovered_.wait_for(lock, kWaitForRecovery, [this] { return state_ != State::kRecovering; });
}

Index::Open& Index::Opened() {
  if (open_) return *open_;
  if (!files_.Exists()) throw Error(kNoSuchIndex, "There is no database at " + files_.path());
  open_ = std::make_unique<Open>(files_.Database(), Writer::kOpen, mapping_);
  return *open_;
}

// Drops everything since the last commit: of a change that failed half way nobody knows what is there.
void Index::Lose(const Error& error) {
  const bool any = open_ && (open_->pending != 0 || open_->accepted);
  open_.reset();
  if (any && !lost_) lost_.emplace(error.code, "Changes accepted since the last commit are lost: " + error.reason);
}

void Index::SetAside(const std::string& why) {
  const std::lock_guard lock(search_mutex_);
  if (state_ == State::kGone) return;
  errno = 0;
  QUARROX_LOG_FAILURE("The index at %s is damaged and set aside, reason: %.4096s", files_.path().c_str(), why.c_str());
  open_.reset();
  searches_.reset();
  state_ = State::kGone;
  files_.SetAside();
}

// Runs a change, or a look at what may not be committed yet.
template <typename Work>
auto Index::Run(Access access, Work work, const MakeWay* make_way) {
  std::unique_lock lock(mutex_, std::try_to_lock);
  if (!lock || state_ != State::kReady || !open_) {
    if (make_way != nullptr) (*make_way)();
    if (waiting_ >= kMostWaiting) throw Error(kTooManyRequests, "Too many requests wait for an index");
    ++waiting_;
    if (!lock) lock.lock();
    --waiting_;
  }
  WaitForRecovery(lock);
  CheckState();
  bool failing = false;  // whether a failure leaves changes half done
  try {
    Open& open = Opened();
    if (access == Access::kChange && std::exchange(open.marked, false)) files_.RemoveMark();
    failing = access == Access::kChange || open.accepted;
    Finish(open, make_way);
    failing = access == Access::kChange;
    return work(open);
  } catch (const DamagedDatabase& error) {
    SetAside(error.reason);
    throw Error(kNoSuchIndex, "The index at " + files_.path() + " is damaged: " + error.reason);
  } catch (const Error& error) {
    if (failing && !IsRefusal(error.code)) Lose(error);
    throw;
  } catch (const std::exception& error) {
    const Error failure(kInputOutput, error.what());
    if (failing) Lose(failure);
    throw failure;
  }
}

// Runs what nobody else may see half done. Commands of this kind come one by one.
template <typename Work>
void Index::Administer(Work work) {
  const std::scoped_lock lock(mutex_, search_mutex_);
  work();
}

// Commits and leaves the mark that spares the next one who opens the database a check.
void Index::CloseNow() {
  searches_.reset();
  if (!open_) return;
  const std::unique_ptr<Open> open = std::move(open_);
  try {
    Finish(*open);
    if (open->marked) return;
    open->writer.Commit();
  } catch (const Error& error) {
    if (open->pending != 0) lost_.emplace(error.code, error.reason);
    errno = 0;
    QUARROX_LOG_FAILURE("The index at %s was closed without what came last, reason: %s", files_.path().c_str(),
                        error.reason.c_str());
    return;
  }
  files_.MarkClosed();
}

void Index::Create() {
  Administer([this] {
    if (files_.Exists() && state_ != State::kGone) return;
    if (files_.Exists()) files_.Delete();  // what an attempt left that failed
    files_.MakeDirectory();
    files_.RemoveMark();
    open_.reset();
    open_ = std::make_unique<Open>(files_.Database(), Writer::kCreate, mapping_);
    open_->writer.Commit();
    open_->marked = false;
    if (state_ == State::kGone) state_ = State::kReady;
  });
}

bool Index::HasDatabase() const {
  const std::lock_guard lock(mutex_);
  return files_.Exists();
}

bool Index::NeedsRecovery() const {
  const std::lock_guard lock(mutex_);
  return files_.Exists() && !files_.WasClosedInOrder();
}

void Index::BeginRecovery() {
  Administer([this] {
    if (state_ == State::kReady) state_ = State::kRecovering;
  });
}

void Index::EndRecovery(bool sound) {
  if (!sound) {
    const std::lock_guard lock(mutex_);
    SetAside("it was not closed in order, and a check found faults");
  } else {
    Administer([this] {
      if (state_ == State::kRecovering) state_ = State::kReady;
    });
  }
  recovered_.notify_all();
}

void Index::Pause() {
  Administer([this] {
    if (state_ == State::kGone) return;
    CloseNow();
    state_ = State::kPaused;
  });
  recovered_.notify_all();
}

void Index::Resume() {
  Administer([this] {
    if (state_ == State::kPaused) state_ = State::kReady;
  });
}

void Index::Close() {
  Administer([this] { CloseNow(); });
}

void Index::MoveTo(const std::string& path) {
  {
    std::unique_lock lock(mutex_);
    recovered_.wait(lock, [this] { return state_ != State::kRecovering; });
  }
  Administer([this, &path] {
    if (path == files_.path()) return;
    CloseNow();
    const bool in_order = files_.WasClosedInOrder();
    if (files_.Exists()) files_.MoveTo(path);
    files_ = IndexFiles(path);
    if (in_order) files_.MarkClosed();
  });
}

void Index::Delete() {
  Administer([this] {
    searches_.reset();
    open_.reset();
    lost_.reset();
    state_ = State::kGone;
    files_.Delete();
  });
  recovered_.notify_all();
}

// Counts a change, and writes a portion to the disk when it is large enough.
void Index::Account(Open& open, size_t bytes, const MakeWay* make_way) {
  ++open.pending;
  open.pending_bytes += bytes;
  if (open.pending < kPortionDocuments && open.pending_bytes < kPortionBytes) return;
  if (make_way != nullptr) (*make_way)();
  open.writer.Commit();
  open.pending = 0;
  open.pending_bytes = 0;
}

void Index::Check(const std::string& path, const Json::Value& fields) const {
  if (path.front() != '/') throw Error(kBadArgument, "A document's path begins with a slash: '" + path + "' does not");
  for (const Field& field : mapping_.fields()) {
    if (field.required && !fields.isMember(field.name)) {
      throw Error(kBadArgument, "The document of " + path + " lacks its " + field.name);
    }
  }
  if (fields.isMember(mapping_.identity()) && fields[mapping_.identity()] != path) {
    throw Error(kBadArgument, "The document of " + path + " has another " + mapping_.identity());
  }
}

void Index::Save(Open& open, const std::string& path, Json::Value fields, const AnalyzedDocument& content) {
  DocumentId id = open.places.Find(path);
  if (id != 0) {
    open.writer.Replace(id, content, open.writer.Place(id));
  } else {
    id = open.writer.NextId();
    const Place place = open.places.Put(path, id);
    open.writer.Add(content, PackPlace(place));
  }
  KeptFields kept = PartFields(std::move(fields), path_fields_);
  kept.indexed = time(nullptr);
  SaveFields(open.writer, id, kept, Texts::kBoth);
}

// Indexes the document that was accepted last.
void Index::Finish(Open& open, const MakeWay* make_way) {
  if (!open.accepted) return;
  const size_t bytes = BytesOf(open.accepted->fields);
  Save(open, open.accepted->path, std::move(open.accepted->fields), *open.accepted->content);
  open.accepted.reset();
  Account(open, bytes, make_way);
}

void Index::Accept(const std::string& path, Json::Value& fields, const MakeWay& make_way) {
  Check(path, fields);
  const auto accept = [&](Open& open) {
    const AnalyzedDocument& content = open.analyzer.Analyze(fields, path_fields_.unindexed());
    open.accepted.emplace(Open::Accepted{path, Json::Value(), &content});
    open.accepted->fields.swap(fields);
  };
  Run(Access::kChange, accept, &make_way);
}

// A failure is told by the next commit.
void Index::Settle(const MakeWay& make_way) {
  try {
    Run(
        Access::kChange, [](Open&) {}, &make_way);
  } catch (const Error&) {
    return;
  }
}

void Index::Set(const std::string& path, const Json::Value& fields) {
  Run(Access::kChange, [&](Open& open) {
    const DocumentId id = open.places.Find(path);
    if (id == 0) throw Error(kNoSuchDocument, "There is no document of " + path);
    const Json::Value& identity = fields[mapping_.identity()];
    if (!identity.isNull() && !identity.isString()) throw Error(kBadArgument, mapping_.identity() + " is no string");
    const std::string target = identity.isNull() ? path : identity.asString();
    const DocumentId replaced = open.places.Find(target);
    const FieldChange change = ChangeFields(open.writer, id, path_fields_, fields, Base(path), Base(target));
    DocumentChanges changes;
    changes.removed = open.analyzer.Analyze(change.before, path_fields_.unindexed());
    changes.added = open.other_analyzer.Analyze(change.after, path_fields_.unindexed());
    if (target != path) {
      if (replaced != 0) Drop(open, replaced, target);
      const Place place = open.places.Put(target, id);
      open.places.Remove(path);
      changes.place = PackPlace(place);
    }
    if (!change.after.empty()) SaveFields(open.writer, id, change.kept, change.texts);
    if (changes.place || !change.after.empty()) open.writer.Change(id, changes);
    Account(open, BytesOf(change.after));
  });
}

void Index::Drop(Open& open, DocumentId id, const std::string& path) {
  open.places.Remove(path);
  open.writer.Delete(id);
  DropFields(open.writer, id);
}

void Index::Remove(const std::string& path) {
  Run(Access::kChange, [&](Open& open) {
    const DocumentId id = open.places.Find(path);
    if (id == 0) return;
    Drop(open, id, path);
    Account(open, 0);
  });
}

void Index::DropBelow(Open& open, const std::string& prefix) {
  std::vector<std::pair<DocumentId, std::string>> found;
  do {
    found.clear();
    open.places.ForEach(prefix, [&](DocumentId id, const std::string& directory, const std::string& base) {
      found.emplace_back(id, directory + '/' + base);
      return found.size() < kDeletedAtOnce;
    });
    for (const auto& [id, path] : found) {
      Drop(open, id, path);
      Account(open, 0);
    }
  } while (found.size() == kDeletedAtOnce);
}

// Whatever is not asked for by its path is looked for in what was committed, so everything is, first.
void Index::RemoveMatching(const Json::Value& qsl) {
  const std::optional<PathQuery> query = AsPathQuery(qsl, mapping_);
  if (query && !query->is_prefix) return Remove(query->path);
  Run(Access::kChange, [&](Open& open) {
    if (query) return DropBelow(open, query->path);
    open.writer.Commit();
    open.pending = 0;
    const Reader reader(files_.Database());
    const Places places(reader);
    QueryParser parser(mapping_, path_fields_, reader, places);
    const Query parsed = parser.Parse(qsl);
    for (const Hit& hit : reader.Search(parsed, SearchOptions()).hits) {
      Drop(open, hit.id, open.places.PathOf(UnpackPlace(open.writer.Place(hit.id))));
      Account(open, 0);
    }
  });
}

void Index::Commit() {
  {
    const std::lock_guard lock(mutex_);
    if (lost_) {
      const Error error = *lost_;
      lost_.reset();
      throw Error(error);
    }
  }
  Run(Access::kChange, [](Open& open) {
    open.writer.Commit();
    open.pending = 0;
    open.pending_bytes = 0;
  });
}

void Index::Find(const SearchRequest& request, Answer& answer) {
  const std::optional<PathQuery> query = request.as ? std::nullopt : AsPathQuery(request.qsl, mapping_);
  if (query) return ShowByPath(query->path, query->is_prefix, request, answer);
  Search(request, answer);
}

// The number of all hits is told where all were looked at.
void Index::ShowByPath(const std::string& path, bool is_prefix, const SearchRequest& request, Answer& answer) {
  if (!request.sort.empty()) throw Error(kBadQuery, "A search by path is not sorted by a field");
  const std::vector<std::string>& names = request.load_fields;
  const bool is_listing = Listing::CanShow(mapping_, path_fields_, names);
  Run(Access::kLook, [&](Open& open) {
    answer.Append("[");
    Listing listing(open.writer, mapping_, path_fields_, names, answer);
    bool first = true;
    uint64_t count = 0;
    bool more = false;
    ForEachAt(open.writer, open.places, path, is_prefix, is_listing,
              [&](DocumentId id, const std::string& directory, const std::string& base) {
                more = count >= request.from && count - request.from >= request.size;
                if (more) return false;
                if (count++ < request.from) return true;
                if (is_listing) {
                  listing.Add(id, directory, base);
                } else {
                  AppendElement(answer, first,
                                ShowFields(open.writer, mapping_, path_fields_, id, directory, base, names));
                }
                return true;
              });
    listing.Finish();
    answer.Append(more ? "]" : "],\"total\":" + std::to_string(count));
  });
}

void Index::AddSuggestions(const std::string& path) {
  Run(Access::kChange, [&](Open& open) {
    const DocumentId id = open.places.Find(path);
    if (id == 0) throw Error(kNoSuchDocument, "There is no document of " + path);
    const KeptFields fields = LoadFields(open.writer, id, Texts::kBoth);
    for (const Json::Value* part : {&fields.plain, &fields.texts}) {
      if (part->isNull()) continue;
      for (const std::string& word :
           SuggestionWords(mapping_, open.analyzer.Analyze(*part, path_fields_.unindexed()))) {
        open.writer.AddSuggestion(word);
      }
    }
    open.writer.Set(kSuggestionsKey, "1");
    Account(open, BytesOf(fields.texts));
  });
}

bool Index::HasSuggestions() {
  return Run(Access::kLook, [](Open& open) { return !open.writer.Get(kSuggestionsKey).empty(); });
}

}  // namespace quarrox::elasticd
