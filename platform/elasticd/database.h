// A database on disk: documents with terms, numbers and a place, and beside them keys with values. Both are committed
// together, and a process that dies leaves what was last committed.
//
// Everything throws Error 618 where there is no room, 617 where the disk fails, and DamagedDatabase where the files are
// not what was written; a Reader also OutdatedReader. Not logged. One object, one thread at a time.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "analysis.h"
#include "common/error.h"
#include "error_code.h"
#include "query.h"

namespace quarrox::elasticd {

// What keeps the files, and its version.
std::string LibraryVersion();

class DamagedDatabase : public Error {
 public:
  explicit DamagedDatabase(const std::string& reason) : Error(kInputOutput, reason) {}
};

// The database has been committed twice since the reader was refreshed, which has to be done again.
class OutdatedReader : public Error {
 public:
  explicit OutdatedReader(const std::string& reason) : Error(kInputOutput, reason) {}
};

// Keys have 1 to 240 bytes, values any number; no value is the empty one.
class Store {
 public:
  virtual ~Store() = default;
  virtual std::string Get(const std::string& key) const = 0;

  // Hands out the keys that begin with `prefix`, in order of bytes, until `take` returns false. The store must not be
  // changed meanwhile.
  virtual void ForEachKey(const std::string& prefix, const std::function<bool(const std::string&)>& take) const = 0;

  // A document's place; empty where there is no such document.
  virtual std::string Place(DocumentId id) const = 0;
};

// What changes in a document; what is not named stays.
struct DocumentChanges {
  AnalyzedDocument removed;  // terms count what they lose
  AnalyzedDocument added;    // and what they gain; numbers replace
  std::optional<std::string> place;
};

// What the owner has written is seen by itself at once, by readers after a commit. What was not committed is dropped
// when the object goes, and after any exception the object is good for nothing else.
class Writer final : public Store {
 public:
  // Opens the database in `directory`, or makes an empty one, for which the directory must not exist or be empty.
  enum Mode { kOpen, kCreate };
  Writer(const std::string& directory, Mode mode);
  ~Writer() override;
  Writer(const Writer&) = delete;
  Writer& operator=(const Writer&) = delete;

  std::string Get(const std::string& key) const override;
  void ForEachKey(const std::string& prefix, const std::function<bool(const std::string&)>& take) const override;
  std::string Place(DocumentId id) const override;

  // Hands out each document with its place, in order of identifiers, until `take` returns false.
  void ForEachPlace(const std::function<bool(DocumentId id, const std::string& place)>& take) const;

  // The numbers that some documents, in order of identifiers, have in a field; NaN for those that have none.
  std::vector<double> Numbers(unsigned int field, const std::vector<DocumentId>& ids) const;

  void Set(const std::string& key, const std::string& value);

  // The identifier that the next Add() gives its document.
  DocumentId NextId() const;
  void Add(const AnalyzedDocument& content, const std::string& place);
  void Replace(DocumentId id, const AnalyzedDocument& content, const std::string& place);
  void Change(DocumentId id, const DocumentChanges& changes);
  void Delete(DocumentId id);

  // Takes a word into what suggestions are made from.
  void AddSuggestion(const std::string& word);

  // When this returns, everything is on the disk.
  void Commit();

 private:
  struct Impl;
  std::unique_ptr<Impl> impl_;
};

struct Hit {
  DocumentId id;
  double score;
};

struct SearchResult {
  std::vector<Hit> hits;
  uint64_t total = 0;  // of all that match; an estimate where `exact` is false
  bool exact = true;
  bool cut = false;  // a beginning of words stood for too many, and only the first of them were looked for
};

struct SearchOptions {
  uint64_t from = 0;
  uint64_t size = ~uint64_t{0};
  std::vector<std::pair<unsigned int, bool>> sort;  // numbers of fields and whether descending; by score where empty

  // What is told follows from the documents that pass alone: no score depends on how many others have a word, and a
  // total that is not exact is of those that were seen, which is at least so many.
  bool discreet = false;
};

// Sees what was committed when it was made or last refreshed.
class Reader final : public Store {
 public:
  explicit Reader(const std::string& directory);
  ~Reader() override;
  Reader(const Reader&) = delete;
  Reader& operator=(const Reader&) = delete;

  // Goes on to the last commit.
  void Refresh();

  std::string Get(const std::string& key) const override;
  void ForEachKey(const std::string& prefix, const std::function<bool(const std::string&)>& take) const override;
  std::string Place(DocumentId id) const override;

  SearchResult Search(Query query, const SearchOptions& options) const;

  // How many documents have a term, and whether one has it.
  uint64_t CountWith(const std::string& term) const;
  bool Has(DocumentId id, const std::string& term) const;

  // Hands out the terms that begin so, and the documents that have a term, until `take` returns false.
  void ForEachTerm(const std::string& begin, const std::function<bool(const std::string& term)>& take) const;
  void ForEachWith(const std::string& term, const std::function<bool(DocumentId id)>& take) const;

  // A beginning stands for so many terms at most, and all of a query for so many: each costs memory and a look-up.
  static constexpr size_t kMostBeginnings = 1000;
  static constexpr size_t kMostInQuery = 4000;

  // A document's number in a field; NaN where it has none.
  double Number(DocumentId id, unsigned int field) const;

  // Hands out the words among the suggestions. Documents need not have them.
  void ForEachSuggestion(const std::function<void(const std::string& word)>& take) const;

  // The word among the suggestions that is most like another one; empty where none is.
  std::string Suggestion(const std::string& word) const;

 private:
  struct Impl;
  std::unique_ptr<Impl> impl_;
};

// Reads the whole database and prints what is wrong with it to standard error; whether it is sound. It may also crash:
// it belongs into a process of its own.
bool IsSound(const std::string& directory);

}  // namespace quarrox::elasticd
