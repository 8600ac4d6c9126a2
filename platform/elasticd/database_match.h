// How the database's library is asked for what a Query says. A part of database.cpp, which alone includes it.
#pragma once

#include <xapian.h>

#include <algorithm>
#include <functional>
#include <iterator>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "query.h"

namespace quarrox::elasticd {

// Where a document stands: the identifier of its directory and its name. Numbers follow, each in the slot of its field.
inline constexpr Xapian::valueno kPlaceSlot = 0;
inline constexpr Xapian::valueno kFirstNumberSlot = 1;

// The first bytes of a place, the identifier in big-endian order.
inline constexpr size_t kDirectoryBytes = sizeof(DirectoryId);

// Lets documents through by their place, and rates them.
class PlaceSource final : public Xapian::ValuePostingSource {
 public:
  // What a place is worth; negative where it is not wanted.
  using Rate = std::function<double(std::string_view place)>;
  PlaceSource(Rate rate, double most) : Xapian::ValuePostingSource(kPlaceSlot), rate_(std::move(rate)), most_(most) {}

  PlaceSource* clone() const override { return new PlaceSource(rate_, most_); }
  std::string name() const override { return "PlaceSource"; }
  double get_weight() const override { return weight_; }

  void init(const Xapian::Database& database) override {
    Xapian::ValuePostingSource::init(database);
    set_maxweight(most_);
  }

  void next(double) override {
    Xapian::ValuePostingSource::next(0);
    SkipOthers();
  }

  void skip_to(Xapian::docid id, double) override {
    Xapian::ValuePostingSource::skip_to(id, 0);
    SkipOthers();
  }

  // Goes on to what is wanted: an answer that there is none would make an OR pass over documents of its other parts.
  bool check(Xapian::docid id, double) override {
    skip_to(id, 0);
    return true;
  }

 private:
  void SkipOthers() {
    while (!at_end() && !IsWanted()) Xapian::ValuePostingSource::next(0);
  }

  bool IsWanted() {
    const std::string place = get_value();
    weight_ = place.size() < kDirectoryBytes ? -1 : rate_(place);
    return weight_ >= 0;
  }

  const Rate rate_;
  const double most_;
  double weight_ = 0;
};

inline PlaceSource::Rate RateByDirectory(const Query& query) {
  return [directories = query.directories, name = query.term](std::string_view place) {
    if (place.compare(kDirectoryBytes, name.size(), name) != 0) return -1;
    DirectoryId directory = 0;
    for (size_t i = 0; i < kDirectoryBytes; ++i) directory = directory << 8 | static_cast<unsigned char>(place[i]);
    return directories->contains(directory) ? 0 : -1;
  };
}

inline PlaceSource::Rate RateByName(const Query& query) {
  return [rate = query.rate](std::string_view place) { return rate(place.substr(kDirectoryBytes)); };
}

// Lets through what stands a look at it, for which only documents come that everything else lets through: it says that
// it has all of them, and of several lists the longest is asked last.
class CheckSource final : public Xapian::PostingSource {
 public:
  explicit CheckSource(std::function<bool(DocumentId)> check) : check_(std::move(check)) {}

  CheckSource* clone() const override { return new CheckSource(check_); }
  std::string name() const override { return "CheckSource"; }
  void init(const Xapian::Database& database) override {
    id_ = 0;
    last_ = database.get_lastdocid();
    count_ = database.get_doccount();
  }
  Xapian::doccount get_termfreq_min() const override { return 0; }
  Xapian::doccount get_termfreq_est() const override { return count_; }
  Xapian::doccount get_termfreq_max() const override { return count_; }
  void next(double) override { SkipTo(id_ + 1); }
  void skip_to(Xapian::docid id, double) override { SkipTo(std::max(id, id_)); }
  bool check(Xapian::docid id, double) override {
    id_ = id;
    return id > last_ || check_(id);
  }
  bool at_end() const override { return id_ > last_; }
  Xapian::docid get_docid() const override { return id_; }

 private:
  void SkipTo(Xapian::docid id) {
    for (id_ = id; id_ <= last_ && !check_(id_); ++id_) continue;
  }

  const std::function<bool(DocumentId)> check_;
  Xapian::docid id_ = 0;
  Xapian::docid last_ = 0;
  Xapian::doccount count_ = 0;
};

// Passes what all checks let through. The library asks for documents only that are good enough to be shown or counted.
class Decider final : public Xapian::MatchDecider {
 public:
  explicit Decider(std::vector<std::function<bool(DocumentId)>> checks) : checks_(std::move(checks)) {}

  bool is_needed() const { return !checks_.empty(); }
  bool operator()(const Xapian::Document& document) const override {
    return std::all_of(checks_.begin(), checks_.end(), [&](const auto& check) { return check(document.get_docid()); });
  }

 private:
  const std::vector<std::function<bool(DocumentId)>> checks_;
};

// One document by its identifier.
class DocumentSource final : public Xapian::PostingSource {
 public:
  explicit DocumentSource(Xapian::docid id) : id_(id) {}

  DocumentSource* clone() const override { return new DocumentSource(id_); }
  std::string name() const override { return "DocumentSource"; }
  void init(const Xapian::Database&) override { state_ = kBefore; }
  Xapian::doccount get_termfreq_min() const override { return 0; }
  Xapian::doccount get_termfreq_est() const override { return 1; }
  Xapian::doccount get_termfreq_max() const override { return 1; }
  void next(double) override { state_ = state_ == kBefore ? kAt : kAfter; }
  void skip_to(Xapian::docid id, double) override { state_ = id <= id_ ? kAt : kAfter; }
  bool at_end() const override { return state_ == kAfter; }
  Xapian::docid get_docid() const override { return id_; }

 private:
  enum State { kBefore, kAt, kAfter };
  const Xapian::docid id_;
  State state_ = kBefore;
};

// Weighs a word by the document that has it alone: by how often it is there, less in long ones. As the usual weight
// does (BM25 with its usual k1 = 1.2 and b = 0.75), but without the two numbers that tell of other documents: how many
// have the word, and how long they are on average.
class OwnWeight final : public Xapian::Weight {
 public:
  OwnWeight() {
    need_stat(WDF);
    need_stat(DOC_LENGTH);
    need_stat(WQF);
  }
  OwnWeight* clone() const override { return new OwnWeight; }
  std::string name() const override { return "OwnWeight"; }
  std::string serialise() const override { return {}; }
  OwnWeight* unserialise(const std::string&) const override { return new OwnWeight; }
  void init(double factor) override { factor_ = factor * get_wqf(); }
  double get_sumpart(Xapian::termcount wdf, Xapian::termcount length, Xapian::termcount) const override {
    const double long_as_usual = 0.25 + 0.75 * length / kUsualLength;
    return factor_ * (1 + kSaturation) * wdf / (wdf + kSaturation * long_as_usual);
  }
  double get_maxpart() const override { return factor_ * (1 + kSaturation); }
  double get_sumextra(Xapian::termcount, Xapian::termcount) const override { return 0; }
  double get_maxextra() const override { return 0; }

 private:
  static constexpr double kSaturation = 1.2;
  static constexpr double kUsualLength = 500;  // words: a page or two
  double factor_ = 0;
};

// Makes of a query what the library understands.
class Converter {
 public:
  // A beginning stands for `most` terms, all of a query for `most_in_all`.
  Converter(const Xapian::Database& database, size_t most, size_t most_in_all)
      : database_(database), most_(most), left_(most_in_all) {}

  // Nesting is bounded by those who make queries.
  Xapian::Query Convert(const Query& query) {
    using Xapian::Query;
    switch (query.kind) {
      case elasticd::Query::kNothing:
        break;
      case elasticd::Query::kEverything:
        return Query::MatchAll;
      case elasticd::Query::kTerm:
        return Query(query.term);
      case elasticd::Query::kBeginning:
        return Beginning(query.term);
      case elasticd::Query::kNumber:
        return Number(query);
      case elasticd::Query::kDocument:
        return Query((new DocumentSource(query.document))->release());
      case elasticd::Query::kPlace:
        return Query((new PlaceSource(RateByDirectory(query), 0))->release());
      case elasticd::Query::kName:
        return Query((new PlaceSource(RateByName(query), query.most))->release());
      case elasticd::Query::kAnd:
        return Combine(Query::OP_AND, query);
      case elasticd::Query::kOr:
        return Combine(Query::OP_OR, query);
      case elasticd::Query::kSame:
        return Combine(Query::OP_SYNONYM, query);
      case elasticd::Query::kCheck:
        return Query((new CheckSource(query.check))->release());
      case elasticd::Query::kFilter:
        return Query(Query::OP_SCALE_WEIGHT, Convert(query.parts.front()), 0);
      case elasticd::Query::kAndNot:
        return Combine(Query::OP_AND_NOT, query, Query::OP_OR);
      case elasticd::Query::kAndPerhaps:
        return Combine(Query::OP_AND_MAYBE, query, Query::OP_OR);
    }
    return Query::MatchNothing;
  }

  bool cut() const { return cut_; }

 private:
  std::vector<Xapian::Query> Parts(const Query& query) {
    std::vector<Xapian::Query> parts;
    parts.reserve(query.parts.size());
    for (const Query& part : query.parts) parts.push_back(Convert(part));
    return parts;
  }

  Xapian::Query Combine(Xapian::Query::op op, const Query& query) {
    const std::vector<Xapian::Query> parts = Parts(query);
    return Xapian::Query(op, parts.begin(), parts.end());
  }

  // The first of the parts, and all the others as one.
  Xapian::Query Combine(Xapian::Query::op op, const Query& query, Xapian::Query::op others) {
    const std::vector<Xapian::Query> parts = Parts(query);
    if (parts.empty()) return Xapian::Query::MatchNothing;
    return Xapian::Query(op, parts.front(), Xapian::Query(others, std::next(parts.begin()), parts.end()));
  }

  Xapian::Query Beginning(const std::string& term) {
    std::vector<Xapian::Query> terms;
    Xapian::TermIterator at = database_.allterms_begin(term);
    for (; at != database_.allterms_end(term) && terms.size() < most_ && left_ > 0; ++at, --left_) {
      terms.emplace_back(*at);
    }
    cut_ = cut_ || at != database_.allterms_end(term);
    return Xapian::Query(Xapian::Query::OP_SYNONYM, terms.begin(), terms.end());
  }

  static Xapian::Query Number(const Query& query) {
    const Xapian::valueno slot = kFirstNumberSlot + query.field;
    return Xapian::Query(Xapian::Query::OP_VALUE_RANGE, slot, Xapian::sortable_serialise(query.low),
                         Xapian::sortable_serialise(query.high));
  }

  const Xapian::Database& database_;
  const size_t most_;
  size_t left_;
  bool cut_ = false;  // a beginning stands for more terms than were taken
};

}  // namespace quarrox::elasticd
