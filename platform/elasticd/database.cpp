#include "database.h"

#include <xapian.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <iostream>
#include <limits>
#include <map>
#include <sstream>

#include "database_match.h"

namespace quarrox::elasticd {
namespace {

// The library commits by itself after so many changes, in the middle of a document's; a transaction keeps it from that.
constexpr bool kFlushed = true;

// Up to so many hits the total is exact. A person sees at once that it is not, and more would cost time.
constexpr uint64_t kCountedHits = 100;

[[noreturn]] void Translate(const Xapian::Error& error) {
  const std::string text = error.get_description();
  const char* system = error.get_error_string();
  for (const int no_room : {ENOSPC, EDQUOT, EFBIG}) {
    // An error that another one followed is told in its text alone.
    if (text.find(strerror(no_room)) != std::string::npos) throw Error(kNoRoom, text);
    if (system != nullptr && strcmp(system, strerror(no_room)) == 0) throw Error(kNoRoom, text);
  }
  if (strcmp(error.get_type(), "DatabaseModifiedError") == 0) throw OutdatedReader(text);
  const bool is_missing = system != nullptr && strcmp(system, strerror(ENOENT)) == 0;
  const bool is_locked = strcmp(error.get_type(), "DatabaseLockError") == 0;
  if ((system != nullptr && !is_missing) || is_locked) throw Error(kInputOutput, text);
  throw DamagedDatabase(text);
}

// Damage may show as any of the library's exceptions, or as a size that makes no sense.
template <typename Call>
auto Guard(Call call) {
  try {
    return call();
  } catch (const Xapian::Error& error) {
    Translate(error);
  } catch (const std::length_error& error) {
    throw DamagedDatabase(error.what());
  }
}

std::string ToString(std::string_view text) {
  return std::string(text);
}

void SetContent(Xapian::Document& document, const AnalyzedDocument& content) {
  std::string term;
  for (const auto& [text, count] : content.terms) {
    term = text;
    document.add_term(term, count);
  }
  for (const auto& [field, number] : content.numbers) {
    document.add_value(kFirstNumberSlot + field, Xapian::sortable_serialise(number));
  }
}

Xapian::Document MakeDocument(const AnalyzedDocument& content, const std::string& place) {
  Xapian::Document document;
  SetContent(document, content);
  document.add_value(kPlaceSlot, place);
  return document;
}

// How often a term is in a document now.
Xapian::termcount CountOf(const Xapian::Document& document, const std::string& term) {
  Xapian::TermIterator found = document.termlist_begin();
  found.skip_to(term);
  return found != document.termlist_end() && *found == term ? found.get_wdf() : 0;
}

// Terms are shared by fields, so that one is gone only when nothing is left of its count. One without a count belongs
// to one field alone, by its prefix.
void RemoveTerm(Xapian::Document& document, const std::string& term, Xapian::termcount count) {
  const Xapian::termcount now = count == 0 ? 0 : CountOf(document, term);
  try {
    document.remove_term(term);
  } catch (const Xapian::InvalidArgumentError&) {
    return;  // it was not there
  }
  if (now > count) document.add_term(term, now - count);
}

void ApplyChanges(Xapian::Document& document, const DocumentChanges& changes) {
  for (const auto& [term, count] : changes.removed.terms) RemoveTerm(document, ToString(term), count);
  for (const auto& [field, number] : changes.removed.numbers) document.remove_value(kFirstNumberSlot + field);
  SetContent(document, changes.added);
  if (changes.place) document.add_value(kPlaceSlot, *changes.place);
}

// The keys live beside the postings, in the same tree on disk.
template <typename Database>
void ForEachMetadataKey(const Database& database, const std::string& prefix,
                        const std::function<bool(const std::string&)>& take) {
  const Xapian::TermIterator end = database.metadata_keys_end(prefix);
  for (Xapian::TermIterator key = database.metadata_keys_begin(prefix); key != end; ++key) {
    if (!take(*key)) return;
  }
}

Xapian::doccount Bound(uint64_t number, uint64_t bound) {
  return static_cast<Xapian::doccount>(std::min(number, bound));
}

// So many hits are counted one by one.
uint64_t AllCounted(const SearchOptions& options) {
  const uint64_t wanted = options.from + std::min(options.size, ~uint64_t{0} - options.from);
  return std::max(kCountedHits, wanted);
}

}  // namespace

std::string LibraryVersion() {
  return std::string("Xapian ") + Xapian::version_string();
}

// Keys are written in order and all at once, before a commit: the tree on disk then grows by full blocks, not by
// halves.
struct Writer::Impl {
  Xapian::WritableDatabase database;
  std::map<std::string, std::string> pending = {};

  void WritePending() {
    for (const auto& [key, value] : pending) database.set_metadata(key, value);
    pending.clear();
  }
};

Writer::Writer(const std::string& directory, Mode mode) {
  Guard([&] {
    const int action = mode == kCreate ? Xapian::DB_CREATE : Xapian::DB_OPEN;
    impl_ = std::make_unique<Impl>(Impl{Xapian::WritableDatabase(directory, action | Xapian::DB_BACKEND_GLASS)});
    impl_->database.begin_transaction(kFlushed);
  });
}

// A transaction that is open when its database goes is cancelled.
Writer::~Writer() {
  try {
    impl_.reset();
  } catch (const Xapian::Error&) {  // nothing that was committed is at stake
  }
}

std::string Writer::Get(const std::string& key) const {
  const auto found = impl_->pending.find(key);
  if (found != impl_->pending.end()) return found->second;
  return Guard([&] { return impl_->database.get_metadata(key); });
}

// Two ordered lists as one, where the pending keys say the last word.
void Writer::ForEachKey(const std::string& prefix, const std::function<bool(const std::string&)>& take) const {
  auto pending = impl_->pending.lower_bound(prefix);
  const auto has_pending = [&] {
    return pending != impl_->pending.end() && pending->first.compare(0, prefix.size(), prefix) == 0;
  };
  // False once no more are wanted.
  const auto take_pending = [&] {
    const bool is_there = !pending->second.empty();
    const std::string& key = (pending++)->first;
    return !is_there || take(key);
  };
  bool going = true;
  Guard([&] {
    ForEachMetadataKey(impl_->database, prefix, [&](const std::string& key) {
      while (going && has_pending() && pending->first < key) going = take_pending();
      if (!going) return false;
      going = has_pending() && pending->first == key ? take_pending() : take(key);
      return going;
    });
  });
  while (going && has_pending()) going = take_pending();
}

std::string Writer::Place(DocumentId id) const {
  return Guard([&] { return impl_->database.get_document(id, Xapian::DOC_ASSUME_VALID).get_value(kPlaceSlot); });
}

void Writer::ForEachPlace(const std::function<bool(DocumentId id, const std::string& place)>& take) const {
  Guard([&] {
    const Xapian::ValueIterator end = impl_->database.valuestream_end(kPlaceSlot);
    for (Xapian::ValueIterator at = impl_->database.valuestream_begin(kPlaceSlot); at != end; ++at) {
      if (!take(at.get_docid(), *at)) return;
    }
  });
}

std::vector<double> Writer::Numbers(unsigned int field, const std::vector<DocumentId>& ids) const {
  std::vector<double> numbers(ids.size(), std::numeric_limits<double>::quiet_NaN());
  Guard([&] {
    const Xapian::ValueIterator end = impl_->database.valuestream_end(kFirstNumberSlot + field);
    Xapian::ValueIterator at = impl_->database.valuestream_begin(kFirstNumberSlot + field);
    for (size_t i = 0; i < ids.size() && at != end; ++i) {
      at.skip_to(ids[i]);
      if (at != end && at.get_docid() == ids[i]) numbers[i] = Xapian::sortable_unserialise(*at);
    }
  });
  return numbers;
}

void Writer::Set(const std::string& key, const std::string& value) {
  impl_->pending[key] = value;
}

DocumentId Writer::NextId() const {
  return Guard([&] { return impl_->database.get_lastdocid() + 1; });
}

void Writer::Add(const AnalyzedDocument& content, const std::string& place) {
  Guard([&] { impl_->database.add_document(MakeDocument(content, place)); });
}

void Writer::Replace(DocumentId id, const AnalyzedDocument& content, const std::string& place) {
  Guard([&] { impl_->database.replace_document(id, MakeDocument(content, place)); });
}

// A document that the database itself has handed out is replaced only in what was changed of it: neither its terms nor
// its data are touched for a new place.
void Writer::Change(DocumentId id, const DocumentChanges& changes) {
  Guard([&] {
    Xapian::Document document = impl_->database.get_document(id);
    ApplyChanges(document, changes);
    impl_->database.replace_document(id, document);
  });
}

void Writer::Delete(DocumentId id) {
  Guard([&] { impl_->database.delete_document(id); });
}

void Writer::AddSuggestion(const std::string& word) {
  Guard([&] { impl_->database.add_spelling(word); });
}

void Writer::Commit() {
  Guard([&] {
    impl_->WritePending();
    impl_->database.commit_transaction();
    impl_->database.begin_transaction(kFlushed);
  });
}

// Where look-ups were last in each slot and list. They mostly go on from one document to one behind it, and then cost a
// step there instead of a way down the tree and through a block.
struct Reader::Impl {
  Xapian::Database database;
  std::map<Xapian::valueno, Xapian::ValueIterator> values = {};
  std::map<std::string, Xapian::PostingIterator> postings = {};

  // A document's value in a slot; empty where it has none.
  std::string ValueOf(DocumentId id, Xapian::valueno slot) {
    const Xapian::ValueIterator end = database.valuestream_end(slot);
    Xapian::ValueIterator& at = values[slot];
    if (at == end || at.get_docid() > id) at = database.valuestream_begin(slot);
    if (at != end && at.get_docid() < id) at.skip_to(id);
    return at != end && at.get_docid() == id ? *at : std::string();
  }

  bool Has(DocumentId id, const std::string& term) {
    const Xapian::PostingIterator end = database.postlist_end(term);
    Xapian::PostingIterator& at = postings[term];
    if (at == end || *at > id) at = database.postlist_begin(term);
    if (at != end && *at < id) at.skip_to(id);
    return at != end && *at == id;
  }

  void Forget() {
    values.clear();
    postings.clear();
  }
};

Reader::Reader(const std::string& directory) {
  Guard([&] { impl_ = std::make_unique<Impl>(Impl{Xapian::Database(directory)}); });
}

Reader::~Reader() = default;

void Reader::Refresh() {
  impl_->Forget();
  Guard([&] { impl_->database.reopen(); });
}

std::string Reader::Get(const std::string& key) const {
  return Guard([&] { return impl_->database.get_metadata(key); });
}

void Reader::ForEachKey(const std::string& prefix, const std::function<bool(const std::string&)>& take) const {
  Guard([&] { ForEachMetadataKey(impl_->database, prefix, take); });
}

std::string Reader::Place(DocumentId id) const {
  return Guard([&] { return impl_->ValueOf(id, kPlaceSlot); });
}

SearchResult Reader::Search(Query query, const SearchOptions& options) const {
  return Guard([&] {
    Xapian::Enquire enquire(impl_->database);
    const Decider decider(query.TakeChecks());
    Converter converter(impl_->database, kMostBeginnings, kMostInQuery);
    enquire.set_query(converter.Convert(query));
    if (options.discreet) enquire.set_weighting_scheme(OwnWeight());
    Xapian::MultiValueKeyMaker keys;
    for (const auto& [field, descending] : options.sort) keys.add_value(kFirstNumberSlot + field, descending);
    if (!options.sort.empty()) enquire.set_sort_by_key_then_relevance(&keys, false);
    const uint64_t all = impl_->database.get_doccount();
    const Xapian::MSet found =
        enquire.get_mset(Bound(options.from, all), Bound(options.size, all), Bound(kCountedHits, all), nullptr,
                         decider.is_needed() ? &decider : nullptr);
    SearchResult result;
    result.hits.reserve(found.size());
    for (Xapian::MSetIterator hit = found.begin(); hit != found.end(); ++hit) {
      result.hits.push_back({*hit, hit.get_weight()});
    }
    result.total = options.discreet ? found.get_matches_lower_bound() : found.get_matches_estimated();
    result.cut = converter.cut();
    result.exact = options.discreet ? result.total < AllCounted(options)
                                    : found.get_matches_lower_bound() == found.get_matches_upper_bound();
    return result;
  });
}

uint64_t Reader::CountWith(const std::string& term) const {
  return Guard([&] { return impl_->database.get_termfreq(term); });
}

bool Reader::Has(DocumentId id, const std::string& term) const {
  return Guard([&] { return impl_->Has(id, term); });
}

void Reader::ForEachTerm(const std::string& begin, const std::function<bool(const std::string& term)>& take) const {
  Guard([&] {
    const Xapian::TermIterator end = impl_->database.allterms_end(begin);
    for (Xapian::TermIterator term = impl_->database.allterms_begin(begin); term != end; ++term) {
      if (!take(*term)) return;
    }
  });
}

void Reader::ForEachWith(const std::string& term, const std::function<bool(DocumentId id)>& take) const {
  Guard([&] {
    const Xapian::PostingIterator end = impl_->database.postlist_end(term);
    for (Xapian::PostingIterator posting = impl_->database.postlist_begin(term); posting != end; ++posting) {
      if (!take(*posting)) return;
    }
  });
}

double Reader::Number(DocumentId id, unsigned int field) const {
  return Guard([&] {
    const std::string value = impl_->ValueOf(id, kFirstNumberSlot + field);
    return value.empty() ? std::numeric_limits<double>::quiet_NaN() : Xapian::sortable_unserialise(value);
  });
}

void Reader::ForEachSuggestion(const std::function<void(const std::string& word)>& take) const {
  Guard([&] {
    const Xapian::TermIterator end = impl_->database.spellings_end();
    for (Xapian::TermIterator word = impl_->database.spellings_begin(); word != end; ++word) take(*word);
  });
}

std::string Reader::Suggestion(const std::string& word) const {
  return Guard([&] { return impl_->database.get_spelling_suggestion(word); });
}

bool IsSound(const std::string& directory) {
  std::ostringstream findings;
  try {
    if (Xapian::Database::check(directory, 0, &findings) == 0) return true;
  } catch (const Xapian::Error& error) {
    findings << error.get_description() << '\n';
  }
  std::cerr << findings.str();
  return false;
}

}  // namespace quarrox::elasticd
