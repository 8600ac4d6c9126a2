// One share's index: its database, and the document commands on it.
#pragma once

#include <atomic>
#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include <json/json.h>

#include "analysis.h"
#include "answer.h"
#include "common/error.h"
#include "common/peer.h"
#include "database.h"
#include "fields.h"
#include "index_files.h"
#include "mapping.h"
#include "places.h"

namespace quarrox::elasticd {

// A search: the query and what is wanted of its hits.
struct SearchRequest {
  Json::Value qsl;
  std::vector<std::string> load_fields;  // all stored ones where it is empty
  uint64_t from = 0;
  uint64_t size = ~uint64_t{0};
  Json::Value sort;
  bool suggest = false;        // where hardly anything is found, look for words that were meant
  std::optional<Identity> as;  // whose search it is: nothing speaks of what they may not read
};

struct Searches;

// Thread-safe. Changes and look-ups by path go one by one and see every change that was accepted; searches go one by
// one beside them and see what was committed. The document commands throw Error: 608 while a damaged database is looked
// at, 609 where the index is gone, 610 while it is paused, 612 to 614 for what is asked, 617 and 618 where the disk
// fails; what was accepted since the last commit is then lost, which the next Commit() says. Nothing is logged but
// that.
class Index {
 public:
  // The documents and bytes of text that are taken before they go to disk by themselves. Larger portions take more
  // memory and, because that memory is then no longer in the processor's cache, more time (bench/search_bench.cpp).
  static constexpr size_t kPortionDocuments = 1000;
  static constexpr size_t kPortionBytes = size_t{16} << 20;

  Index(const std::string& path, const Json::Value& mappings, bool paused);
  ~Index();
  Index(const Index&) = delete;
  Index& operator=(const Index&) = delete;

  std::string path() const;

  // Makes an empty database where there is none.
  void Create();
  bool HasDatabase() const;

  // Whether the database must be looked at before it is used, because nobody has closed it in order.
  bool NeedsRecovery() const;

  // While it is, document commands wait for a moment and then throw 608. `sound` is what was found out; a database that
  // is not is set aside, and the index is gone.
  void BeginRecovery();
  void EndRecovery(bool sound);

  // Commits and closes the database, so that its files are nobody's.
  void Pause();
  void Resume();
  void Close();

  // Moves the database's files where only the old ones exist.
  void MoveTo(const std::string& path);

  // Deletes the database's files. The object answers 609 from then on.
  void Delete();

  // Makes or replaces a document, in two steps. Accept() refuses what can be refused and takes the fields away; what
  // happens to the document afterwards is as with any accepted change. Settle() indexes it, unless somebody had to do
  // so before. Both call `make_way` before they wait or write much. Settle() throws nothing.
  using MakeWay = std::function<void()>;
  void Accept(const std::string& path, Json::Value& fields, const MakeWay& make_way);
  void Settle(const MakeWay& make_way);

  void Set(const std::string& path, const Json::Value& fields);
  void Remove(const std::string& path);
  void RemoveMatching(const Json::Value& qsl);
  void Commit();

  // Appends an array of the hits to the answer, and the member "total" after a comma where that is known.
  void Find(const SearchRequest& request, Answer& answer);

  // Takes the words of a document into the suggestions.
  void AddSuggestions(const std::string& path);
  bool HasSuggestions();

 private:
  enum class State { kReady, kRecovering, kPaused, kGone };

  // Who waits for the same index at most; each costs a thread.
  static constexpr int kMostWaiting = 64;

  struct Open;  // the database while it is in use

  enum class Access { kLook, kChange };

  template <typename Work>
  auto Run(Access access, Work work, const MakeWay* make_way = nullptr);
  template <typename Work>
  void Administer(Work work);
  void CheckState() const;
  void WaitForRecovery(std::unique_lock<std::mutex>& lock);
  Open& Opened();
  void CloseNow();
  void Lose(const Error& error);
  void SetAside(const std::string& why);
  void Account(Open& open, size_t bytes, const MakeWay* make_way = nullptr);
  void Check(const std::string& path, const Json::Value& fields) const;
  void Save(Open& open, const std::string& path, Json::Value fields, const AnalyzedDocument& content);
  void Finish(Open& open, const MakeWay* make_way = nullptr);

  void Drop(Open& open, DocumentId id, const std::string& path);
  void DropBelow(Open& open, const std::string& prefix);
  void ShowByPath(const std::string& path, bool is_prefix, const SearchRequest& request, Answer& answer);
  void Search(const SearchRequest& request, Answer& answer);
  void SearchCommitted(const SearchRequest& request, Answer& answer);

  const Mapping mapping_;
  const PathFields path_fields_;
  std::atomic<int> waiting_{0};

  // `mutex_` is for changes, `search_mutex_` for searches; the state and the files change under both, in this order.
  mutable std::mutex mutex_;
  std::mutex search_mutex_;
  std::condition_variable recovered_;
  IndexFiles files_;
  std::atomic<State> state_;
  std::unique_ptr<Open> open_;
  std::optional<Error> lost_;  // why changes that were accepted are no more
  std::unique_ptr<Searches> searches_;
};

}  // namespace quarrox::elasticd
