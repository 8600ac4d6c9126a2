// Leaves out of a search what a user may not read.
#pragma once

#include <chrono>
#include <string>
#include <unordered_map>

#include "analysis.h"
#include "database.h"
#include "mapping.h"
#include "places.h"
#include "query.h"
#include "user_view.h"

namespace quarrox::elasticd {

// A document is found where the index does not rule out that the user may read its file, the user may read it now, and
// the file is the one that the index knows: the same owner, group, mode, size and time of change. Else whoever may
// write to a directory could put a file of their own in the place of one that they may not read, and be shown that
// one's words. One search, one thread. Looks into the reader and the places for as long as they are good.
class ReadableOnly {
 public:
  // Throws Error 612 where the index does not keep what is needed, or the process may not act as the user.
  ReadableOnly(const Reader& reader, const Places& places, const Mapping& mapping, const Identity& user);

  // The query, for this user. The object has to live as long as what is returned.
  Query Restrict(Query query);

  // Whether a beginning stood for too many words, of which only the first were looked for.
  bool cut() const { return cut_; }

  // By a look now, at what the reader now knows. Throws Error 613 where all looks together have taken too long.
  bool IsReadable(DocumentId id);

 private:
  Query MayBeRead() const;
  void RestrictParts(Query& query);
  void Expand(Query& beginning);
  bool WasReadable(DocumentId id);
  bool MayEnter(DirectoryId directory, const std::string& path);
  bool IsKnownAs(DocumentId id, const struct stat& info) const;

  const Reader& reader_;
  const Places& places_;
  const Field privilege_;
  const Field owner_;
  const Field group_;
  const Field size_;
  const Field changed_;
  const Field is_directory_;
  const uid_t user_;
  const UserView view_;
  const std::chrono::steady_clock::time_point end_;
  std::unordered_map<DocumentId, bool> looked_;  // in the query that was restricted last
  size_t left_ = 0;                              // terms that its beginnings may yet stand for
  bool cut_ = false;
  std::unordered_map<DirectoryId, bool> entered_;  // whether the user may enter a directory
};

}  // namespace quarrox::elasticd
