// What a search asks for, in terms of what an index stores.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_set>
#include <utility>
#include <vector>

namespace quarrox::elasticd {

using DocumentId = uint32_t;   // 0 is none
using DirectoryId = uint64_t;  // 0 is none

// A tree of conditions. A document's score comes from its terms and its name; everything else only lets it
// through or not.
struct Query {
  enum Kind {
    kNothing,
    kEverything,
    kTerm,       // `term`
    kBeginning,  // any term that begins with `term`
    kNumber,     // field number `field` from `low` to `high`, both included
    kDocument,   // the one with the identifier `document`
    kPlace,      // in one of `directories`, with a name that begins with `term`
    kName,       // with a name that `rate` lets through
    kCheck,      // which `check` lets through; dear, and to stand among other parts of kAnd
    kAnd,        // all of `parts`
    kOr,         // any of `parts`, the more the better
    kSame,       // any of `parts`, which count as one word
    kFilter,     // the only one of `parts`, which makes nothing better
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
  std::function<double(std::string_view name)> rate = {};  // what a name is worth; negative: it is not wanted
  double most = 0;                                         // what `rate` returns at most
  std::function<bool(DocumentId id)> check = {};
  std::vector<Query> parts = {};

  // Takes every check away that all documents must pass, and returns them.
  std::vector<std::function<bool(DocumentId)>> TakeChecks();

  static Query Of(Kind kind, std::vector<Query> parts) {
    Query query{kind};
    query.parts = std::move(parts);
    return query;
  }
  static Query Term(std::string term) { return Query{kTerm, std::move(term)}; }
};

}  // namespace quarrox::elasticd
