// What a search asks for, in terms of what an index stores.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <unordered_set>
#include <utility>
#include <vector>

namespace quarrox::elasticd {

using DocumentId = uint32_t;   // 0 is none
using DirectoryId = uint64_t;  // 0 is none

// A tree of conditions. A document's score comes from its terms; everything else only lets it through or not.
struct Query {
  enum Kind {
    kNothing,
    kEverything,
    kTerm,       // `term`
    kBeginning,  // any term that begins with `term`
    kNumber,     // field number `field` from `low` to `high`, both included
    kDocument,   // the one with the identifier `document`
    kPlace,      // in one of `directories`, with a name that begins with `term`
    kAnd,        // all of `parts`
    kOr,         // any of `parts`, the more the better
    kSame,       // any of `parts`, which count as one word
    kAndNot,     // the first of `parts`, none of the others
    kAndPerhaps  // the first of `parts`, which the others make better
  };

  Kind kind = kNothing;
  std::string term = {};
  unsigned int field = 0;
  double low = 0;
  double high = 0;
  DocumentId document = 0;
  std::shared_ptr<const std::unordered_set<DirectoryId>> directories = {};
  std::vector<Query> parts = {};

  static Query Of(Kind kind, std::vector<Query> parts) {
    Query query{kind};
    query.parts = std::move(parts);
    return query;
  }
  static Query Term(std::string term) { return Query{kTerm, std::move(term)}; }
};

}  // namespace quarrox::elasticd
