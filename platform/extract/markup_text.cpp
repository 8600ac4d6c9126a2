#include "extract/markup_text.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <optional>
#include <utility>

#include "common/strings.h"

namespace platform::extract {
namespace {

// The elements of HTML that may stand within a word.
constexpr auto kInline =
    std::to_array<std::string_view>({"a",    "abbr",   "acronym", "b",   "bdi", "bdo",  "big", "cite", "code", "dfn",
                                     "em",   "font",   "i",       "ins", "kbd", "mark", "q",   "s",    "samp", "small",
                                     "span", "strike", "strong",  "sub", "sup", "tt",   "u",   "var",  "wbr"});
// Not the whole head: what follows it without a tag that ends it may be taken for its part.
constexpr auto kUnseen = std::to_array<std::string_view>({"title", "script", "style", "template"});
constexpr TextRules kHtmlText = {.read = {}, .skipped = kUnseen, .breaks = kInline, .others_break = true};

constexpr auto kHeadFields = std::to_array<FieldRule>({
    {"author", "VEXOMDAuthors", FieldKind::kList},
    {"dc.creator", "VEXOMDAuthors", FieldKind::kList},
    {"dc.title", "VEXOMDTitle", FieldKind::kText},
    {"description", "VEXOMDDescription", FieldKind::kText},
    {"dc.description", "VEXOMDDescription", FieldKind::kText},
    {"keywords", "VEXOMDKeywords", FieldKind::kList},
    {"dc.subject", "VEXOMDKeywords", FieldKind::kList},
    {"generator", "VEXOMDCreator", FieldKind::kText},
    {"dc.identifier", "VEXOMDIdentifier", FieldKind::kText},
    {"date", "VEXOMDContentCreationDate", FieldKind::kDate},
    {"dc.date", "VEXOMDContentCreationDate", FieldKind::kDate},
    {"dcterms.created", "VEXOMDContentCreationDate", FieldKind::kDate},
});

bool IsOneOf(std::string_view name, ElementNames names) {
  return std::find(names.begin(), names.end(), name) != names.end();
}

// Seconds since the epoch of "2020-03-04T05:06:07+01:00" and its shorter forms, of which the least is the year; without
// a zone it is UTC. Nothing where it is no such date.
std::optional<int64_t> ParseIsoDate(const std::string& text) {
  const std::string trimmed = quarrox::Trim(text);
  const size_t year = std::min(trimmed.find_first_not_of("0123456789"), trimmed.size());
  tm date = {};
  date.tm_mday = 1;
  int month = 1;
  int rest = 0;
  sscanf(trimmed.c_str(), "%4d-%2d-%2d%*1[T ]%2d:%2d%n", &date.tm_year, &month, &date.tm_mday, &date.tm_hour,
         &date.tm_min, &rest);
  if (year != 4 || month < 1 || month > 12) return std::nullopt;
  const char* at = trimmed.c_str() + rest;
  int length = 0;
  if (rest > 0 && sscanf(at, ":%2d%n", &date.tm_sec, &length) == 1) at += length;
  at += strspn(at, ".0123456789");
  char sign = 'Z';
  int hours = 0;
  int minutes = 0;
  if (rest > 0) sscanf(at, "%c%2d:%2d", &sign, &hours, &minutes);
  date.tm_year -= 1900;
  date.tm_mon = month - 1;
  const int64_t offset = 3600 * int64_t{hours} + 60 * int64_t{minutes};
  return timegm(&date) + (sign == '-' ? offset : sign == '+' ? -offset : 0);
}

// Nothing where no rule has that name.
void SetField(std::span<const FieldRule> rules, std::string_view name, std::string_view value, Findings& findings) {
  const auto rule = std::find_if(rules.begin(), rules.end(), [&](const FieldRule& each) { return each.name == name; });
  if (rule == rules.end()) return;
  if (rule->kind == FieldKind::kText) findings.Set(rule->field, value);
  if (rule->kind == FieldKind::kList) findings.Add(rule->field, value);
  if (rule->kind == FieldKind::kDate) {
    const std::optional<int64_t> date = ParseIsoDate(std::string(value));
    if (date) findings.Set(rule->field, *date);
  }
}

class HtmlReader : public TextReader {
 public:
  HtmlReader(Findings& findings, std::string* text) : TextReader(kHtmlText, text), findings_(findings) {}

  void Start(std::string_view name, const Attributes& attributes) override {
    if (name == "meta") {
      SetField(kHeadFields, quarrox::ToLower(std::string(attributes["name"])), attributes["content"], findings_);
    }
    in_title_ = name == "title";
    TextReader::Start(name, attributes);
  }

  void End(std::string_view name) override {
    if (in_title_) findings_.Set("VEXOMDTitle", title_);
    in_title_ = false;
    TextReader::End(name);
  }

  void Text(std::string_view text) override {
    if (in_title_ && title_.size() < kLongestField) title_.append(text);
    TextReader::Text(text);
  }

 private:
  Findings& findings_;
  std::string title_;
  bool in_title_ = false;
};

}  // namespace

bool TextReader::Breaks(std::string_view name) const {
  return IsOneOf(name, rules_.breaks) != rules_.others_break;
}

void TextReader::Start(std::string_view name, const Attributes& /*attributes*/) {
  read_ += IsOneOf(name, rules_.read) ? 1 : 0;
  skipped_ += IsOneOf(name, rules_.skipped) ? 1 : 0;
  if (Breaks(name)) gap_ = '\n';
}

void TextReader::End(std::string_view name) {
  read_ -= IsOneOf(name, rules_.read) ? 1 : 0;
  skipped_ -= IsOneOf(name, rules_.skipped) ? 1 : 0;
  if (Breaks(name)) gap_ = '\n';
}

void TextReader::Text(std::string_view text) {
  if (skipped_ > 0 || (read_ == 0 && !rules_.read.empty())) return;
  for (const char c : text) {
    if (c == ' ' || c == '\t' || c == '\r' || c == '\n') {
      if (gap_ == '\0') gap_ = ' ';
      continue;
    }
    if (gap_ != '\0') text_->push_back(std::exchange(gap_, '\0'));
    text_->push_back(c);
  }
}

void FieldReader::Start(std::string_view /*name*/, const Attributes& /*attributes*/) {
  value_.clear();
}

void FieldReader::End(std::string_view name) {
  SetField(rules_, name, value_, findings_);
  value_.clear();
}

void FieldReader::Text(std::string_view text) {
  if (value_.size() < kLongestField) value_.append(text);
}

void ReadHtml(const Pieces& pieces, Findings& findings) {
  std::string text;
  HtmlReader reader(findings, &text);
  ReadMarkup(Markup::kHtml, pieces, reader, [&] {
    const bool wanted = findings.AddText(text);
    text.clear();
    return wanted;
  });
}

std::string HtmlText(const Pieces& pieces, const std::string& encoding) {
  std::string text;
  TextReader reader(kHtmlText, &text);
  ReadMarkup(
      Markup::kHtml, pieces, reader, [&] { return text.size() < kLongestText; }, encoding);
  return text;
}

}  // namespace platform::extract
