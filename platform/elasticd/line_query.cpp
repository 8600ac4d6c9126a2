#include "line_query.h"

#include <algorithm>
#include <memory>
#include <set>
#include <utility>

#include "analysis.h"
#include "analysis_pieces.h"
#include "analysis_unicode.h"
#include "common/strings.h"
#include "fields.h"
#include "line_values.h"
#include "phrase.h"

namespace quarrox::elasticd {
namespace {

// The library's own names for what a file is.
constexpr char kExtensionField[] = "VEXOMDExtension";
constexpr char kIsDirectoryField[] = "VEXOMDIsDir";
constexpr char kSizeField[] = "VEXOMDFSSize";
constexpr char kDateField[] = "VEXOMDFSContentChangeDate";

// Each costs a look-up at least.
constexpr size_t kMostWords = 256;

// Each document that is looked at for a phrase costs some 30 us, and another look for so many bytes of its text.
constexpr size_t kMostLooks = 50000;
constexpr size_t kBytesOfLook = 4096;

// Each looks at the names of all directories.
constexpr size_t kMostPaths = 8;

// What people call directories.
constexpr char kFolderType[] = "folder";

Query Join(Query::Kind kind, std::vector<Query> parts) {
  if (parts.size() == 1) return std::move(parts.front());
  return Query::Of(kind, std::move(parts));
}

Query Without(Query wanted, Query unwanted) {
  return Query::Of(Query::kAndNot, {std::move(wanted), std::move(unwanted)});
}

Query Filter(Query query) {
  return Query::Of(Query::kFilter, {std::move(query)});
}

bool SaysNothing(const Query& query) {
  return query.kind == Query::kAnd && query.parts.empty();
}

Query NothingSaid() {
  return Query{Query::kAnd};
}

bool HasWordCharacter(std::string_view text) {
  for (size_t at = 0; at < text.size();) {
    const CodePoint c = DecodeAt(text, at);
    if (c.value >= 0 && IsWordCharacter(c.value)) return true;
    at += c.length;
  }
  return false;
}

size_t CountCodePoints(std::string_view text) {
  size_t count = 0;
  for (size_t at = 0; at < text.size(); ++count) at += DecodeAt(text, at).length;
  return count;
}

std::vector<std::string> SplitList(const std::string& text, char between) {
  std::vector<std::string> parts;
  for (size_t begin = 0; begin <= text.size();) {
    const size_t end = std::min(text.find(between, begin), text.size());
    parts.push_back(text.substr(begin, end - begin));
    begin = end + 1;
  }
  return parts;
}

bool EndsWithStar(const LineNode& node) {
  return node.stars.size() == 1 && node.stars.front() + 1 == node.text.size();
}

Query InDirectories(std::unordered_set<DirectoryId> directories) {
  Query query{Query::kPlace};
  query.directories = std::make_shared<const std::unordered_set<DirectoryId>>(std::move(directories));
  return query;
}

Query Rated(std::function<double(std::string_view)> rate) {
  Query query{Query::kName};
  query.rate = std::move(rate);
  query.most = kWholeName;
  return query;
}

// The components of a path as patterns, without empty ones.
std::vector<NamePattern> ComponentPatterns(const LineNode& node) {
  std::vector<NamePattern> patterns;
  for (size_t begin = 0; begin < node.text.size();) {
    const size_t end = std::min(node.text.find('/', begin), node.text.size());
    std::vector<size_t> stars;
    for (const size_t star : node.stars) {
      if (star >= begin && star < end) stars.push_back(star - begin);
    }
    if (end > begin) patterns.emplace_back(std::string_view(node.text).substr(begin, end - begin), stars);
    begin = end + 1;
  }
  return patterns;
}

}  // namespace

std::shared_ptr<size_t> LineBudget::MostLooks() {
  return std::make_shared<size_t>(kMostLooks);
}

bool LineBudget::TakePath() {
  return ++paths <= kMostPaths;
}

LineQuery::LineQuery(const Mapping& mapping, const Store& store, const Places& places, LineSettings settings,
                     LineBudget& budget)
    : mapping_(mapping),
      store_(store),
      places_(places),
      settings_(std::move(settings)),
      prefixes_(PrefixesOfAll(mapping)),
      budget_(budget),
      left_(budget.looks) {}

Query LineQuery::Make(std::string_view line) {
  line_ = line;
  words_.clear();
  Query query = Of(ReadLine(line), true);
  return SaysNothing(query) ? Query{Query::kNothing} : query;
}

Query LineQuery::Of(const LineNode& node, bool wanted) {
  switch (node.kind) {
    case LineNode::kAll:
      return All(node.parts, wanted);
    case LineNode::kAny:
      return Any(node.parts, wanted);
    case LineNode::kField:
      return ByField(node);
    default:
      return All({node}, wanted);
  }
}

// Names in which all the words of a group stand come first.
Query LineQuery::All(const std::vector<LineNode>& nodes, bool wanted) {
  std::vector<Query> parts;
  std::vector<Query> unwanted;
  std::vector<NameWord> words;
  for (const LineNode& node : nodes) {
    if (node.kind == LineNode::kNot) {
      unwanted.push_back(Of(node.parts.front(), !wanted));
      if (SaysNothing(unwanted.back())) unwanted.pop_back();
      continue;
    }
    const size_t known = words_.size();
    parts.push_back(node.kind == LineNode::kText ? Text(node, wanted) : Of(node, wanted));
    if (SaysNothing(parts.back())) parts.pop_back();
    if (node.kind != LineNode::kText) continue;
    for (size_t i = known; i < words_.size(); ++i) {
      for (std::string& word : WordsOf(words_[i].pieces)) words.push_back({std::move(word)});
      words.back().beginning = words_[i].beginning;
    }
  }
  if (parts.empty() && unwanted.empty()) return NothingSaid();
  Query query = parts.empty() ? Query{Query::kEverything} : Join(Query::kAnd, std::move(parts));
  if (wanted && !words.empty()) query = Query::Of(Query::kAndPerhaps, {std::move(query), NamedSo(words)});
  return unwanted.empty() ? query : Without(std::move(query), Join(Query::kOr, std::move(unwanted)));
}

Query LineQuery::Any(const std::vector<LineNode>& nodes, bool wanted) {
  std::vector<Query> parts;
  for (const LineNode& node : nodes) {
    parts.push_back(Of(node, wanted));
    if (SaysNothing(parts.back())) parts.pop_back();
  }
  return parts.empty() ? NothingSaid() : Join(Query::kOr, std::move(parts));
}

// The words of a name stand under the prefix of what is looked for in no particular field, so that few names are rated.
Query LineQuery::NamedSo(const std::vector<NameWord>& words) const {
  std::vector<Query> terms;
  for (const NameWord& word : words) {
    terms.push_back(Query{word.beginning ? Query::kBeginning : Query::kTerm, std::string(kAllPrefix) + word.text});
  }
  const auto rate = [words](std::string_view name) { return RateWords(words, name); };
  return Query::Of(Query::kAnd, {Filter(Join(Query::kAnd, std::move(terms))), Rated(rate)});
}

Query LineQuery::Text(const LineNode& node, bool wanted) {
  const bool beginning = EndsWithStar(node);
  if (node.text == "*" && beginning) return Query{Query::kEverything};
  if (!node.stars.empty() && !beginning) return ByName(node);
  const std::string_view text = std::string_view(node.text).substr(0, node.text.size() - (beginning ? 1 : 0));
  LineWord found{PiecesOf(text), beginning, node.begin, node.end};
  // What has a letter and still no word is longer than any word that is indexed.
  if (found.pieces.empty()) return HasWordCharacter(text) ? Query{Query::kNothing} : NothingSaid();
  budget_.words += WordsOf(found.pieces).size();
  if (budget_.words > kMostWords)
    FailAt(line_, node.begin, "there are more than " + std::to_string(kMostWords) + " words");
  Query query = Words(found.pieces, beginning);
  if (wanted) words_.push_back(std::move(found));
  return query;
}

Query LineQuery::Word(const std::string& word, bool beginning) const {
  std::vector<Query> terms;
  for (const std::string& prefix : prefixes_) {
    terms.push_back(Query{beginning ? Query::kBeginning : Query::kTerm, prefix + word});
  }
  return Join(Query::kSame, std::move(terms));
}

// A beginning stands anywhere, also behind words that stand in order.
Query LineQuery::Words(const std::vector<TextPiece>& pieces, bool beginning) const {
  if (!beginning || pieces.back().ideographs) return InOrder(pieces);
  Query last = Word(pieces.back().text, true);
  if (pieces.size() == 1) return last;
  return Query::Of(Query::kAnd, {InOrder({pieces.begin(), std::prev(pieces.end())}), std::move(last)});
}

// The index finds where all of them are, and only that is looked at. Of ideographs, pairs are in the index.
Query LineQuery::InOrder(const std::vector<TextPiece>& pieces) const {
  std::vector<Query> parts;
  for (const TextPiece& piece : pieces) {
    for (const WordTerms& word : QueryWordsInAll(mapping_, piece.text)) {
      for (const auto& group : word.groups) {
        std::vector<Query> terms;
        for (const std::string& term : group) terms.push_back(Query::Term(term));
        parts.push_back(Join(Query::kSame, std::move(terms)));
      }
    }
  }
  if (parts.size() == 1) return std::move(parts.front());
  Query check{Query::kCheck};
  check.check = [phrase = std::make_shared<Phrase>(WordsOf(pieces)), left = left_, this](DocumentId id) {
    if (*left == 0) return false;
    --*left;
    bool stands = false;
    ForEachText(store_, mapping_, id, [&](std::string_view text) {
      *left -= std::min(*left, text.size() / kBytesOfLook);
      return !(stands = phrase->StandsIn(text));
    });
    return stands;
  };
  parts.push_back(std::move(check));
  return Query::Of(Query::kAnd, std::move(parts));
}

// The pieces of three letters leave few names to be looked at; for shorter pieces, all are.
Query LineQuery::ByName(const LineNode& node) const {
  const auto pattern = std::make_shared<const NamePattern>(node.text, node.stars);
  std::vector<Query> parts;
  for (const Field& field : mapping_.fields()) {
    if (!field.ngram) continue;
    for (const std::string& piece : pattern->pieces()) {
      if (CountCodePoints(piece) < kNgram) continue;
      for (const WordTerms& word : QueryWords(field, piece)) {
        if (word.last_is_prefix) continue;
        for (const auto& group : word.groups) parts.push_back(Query::Term(group.front()));
      }
    }
  }
  if (node.stars.empty()) {
    parts.push_back(Rated([pattern](std::string_view name) { return RatePart(pattern->pieces().front(), name); }));
  } else {
    parts.push_back(Rated([pattern](std::string_view name) { return pattern->Fits(FoldWord(name)) ? kNamePart : -1; }));
  }
  return Join(Query::kAnd, std::move(parts));
}

Query LineQuery::ByExtensions(const std::vector<std::string>& extensions) const {
  const std::string prefix = PrefixOf(mapping_.Get(kExtensionField));
  std::string kept;
  std::vector<Query> terms;
  for (const std::string& extension : extensions) {
    const std::string_view word = FitKeyword(extension, kLongestTerm - prefix.size(), kept);
    terms.push_back(Query::Term(std::string(prefix).append(word)));
  }
  return Filter(Join(Query::kOr, std::move(terms)));
}

Query LineQuery::InNumbers(const char* field, double low, double high) const {
  const Field* known = mapping_.Find(field);
  if (known == nullptr || !known->IsNumber() || low > high) return Query{Query::kNothing};
  Query query{Query::kNumber};
  query.field = known->number;
  query.low = low;
  query.high = high;
  return query;
}

Query LineQuery::ByType(const LineNode& node) const {
  const Query directories = InNumbers(kIsDirectoryField, 1, 1);
  std::vector<Query> parts;
  const std::vector<std::string> listed = SplitList(FoldWord(node.text), ',');
  for (const std::string& name : std::set<std::string>(listed.begin(), listed.end())) {
    if (name == kFolderType) {
      parts.push_back(directories);
      continue;
    }
    const auto type = settings_.types.find(name);
    if (type == settings_.types.end()) {
      std::string names;
      for (const auto& known : settings_.types) names += known.first + ", ";
      FailAt(line_, node.begin, "there is no type \"" + Shown(name) + "\", only " + names + kFolderType);
    }
    parts.push_back(Without(ByExtensions(type->second), directories));
  }
  return Join(Query::kOr, std::move(parts));
}

Query LineQuery::BySize(const LineNode& node) const {
  const std::optional<NumberBounds> bounds = ParseSizes(node.text);
  if (!bounds) Refuse(node, "size; write 10M, >1k or 1k..2M");
  return Without(InNumbers(kSizeField, bounds->low, bounds->high), InNumbers(kIsDirectoryField, 1, 1));
}

Query LineQuery::ByDate(const LineNode& node) const {
  const std::optional<NumberBounds> bounds = ParseDates(node.text, settings_.now);
  if (!bounds) Refuse(node, "date; write 2024, 2024-05, >=2024-05-01, 2023..2024, today, yesterday or 7d");
  return InNumbers(kDateField, bounds->low, bounds->high);
}

Query LineQuery::ByPath(const LineNode& node) {
  if (!budget_.TakePath()) FailAt(line_, node.begin, "over " + std::to_string(kMostPaths) + " paths");
  const bool from_root = node.text.starts_with('/');
  const std::vector<NamePattern> patterns = ComponentPatterns(node);
  if (patterns.empty()) return from_root ? Query{Query::kEverything} : Query{Query::kNothing};
  if (from_root && node.stars.empty()) {
    const std::string path = node.text.substr(0, node.text.find_last_not_of('/') + 1);
    if (const DirectoryId top = places_.FindDirectory(path); top != 0) return InDirectories(places_.Tree(top));
    if (const DocumentId document = places_.Find(path); document != 0) {
      Query query{Query::kDocument};
      query.document = document;
      return query;
    }
  }
  return InDirectories(places_.TreesThatFit(patterns.size(), from_root, [&](size_t component, const std::string& name) {
    return patterns[component].Fits(FoldWord(name));
  }));
}

void LineQuery::Refuse(const LineNode& node, const char* wanted) const {
  FailAt(line_, node.begin, "\"" + Shown(node.text) + "\" is no " + wanted);
}

Query LineQuery::ByField(const LineNode& node) {
  switch (node.field) {
    case SearchField::kName:
      return ByName(node);
    case SearchField::kExtension: {
      std::vector<std::string> extensions = SplitList(ToLower(node.text), ',');
      for (std::string& extension : extensions) extension.erase(0, extension.starts_with('.') ? 1 : 0);
      if (extensions.size() > 1) std::erase(extensions, "");  // behind a comma, where a blank followed it
      if (extensions.empty()) Refuse(node, "list of extensions; write ext:pdf,docx");
      return ByExtensions(extensions);
    }
    case SearchField::kType:
      return ByType(node);
    case SearchField::kSize:
      return BySize(node);
    case SearchField::kDate:
      return ByDate(node);
    case SearchField::kPath:
      return ByPath(node);
    case SearchField::kNone:
      break;
  }
  return Query{Query::kNothing};
}

}  // namespace quarrox::elasticd
