#include "extract/findings.h"

#include <algorithm>
#include <cmath>
#include <utility>

#include <unicode/utf8.h>

namespace platform::extract {
namespace {

constexpr std::string_view kReplacement = "\xef\xbf\xbd";

bool IsControl(UChar32 c) {
  return (c < 0x20 && c != '\n' && c != '\t') || c == 0x7f;
}

// What goes as it is, and stands for itself: most of all texts.
bool IsPlain(uint8_t byte) {
  return (byte >= 0x20 && byte < 0x7f) || byte == '\n' || byte == '\t';
}

// Appends a text as UTF-8 without control characters, up to a length, cut between characters.
void AppendClean(std::string_view text, size_t longest, std::string* out) {
  const auto* const bytes = reinterpret_cast<const uint8_t*>(text.data());
  const auto size = static_cast<int32_t>(std::min(text.size(), longest + U8_MAX_LENGTH));
  for (int32_t at = 0; at < size;) {
    const int32_t start = at;
    while (at < size && IsPlain(bytes[at])) ++at;
    const auto room = static_cast<int32_t>(longest - std::min(longest, out->size()));
    out->append(text.substr(static_cast<size_t>(start), static_cast<size_t>(std::min(at - start, room))));
    if (at - start > room) return;
    if (at > start) continue;
    UChar32 c = 0;
    U8_NEXT(bytes, at, size, c);
    const std::string_view character = c < 0 ? kReplacement
                                       : IsControl(c)
                                           ? std::string_view(" ")
                                           : text.substr(static_cast<size_t>(start), static_cast<size_t>(at - start));
    if (out->size() + character.size() > longest) return;
    out->append(character);
  }
}

std::string Cleaned(std::string_view text) {
  std::string clean;
  AppendClean(text, kLongestField, &clean);
  constexpr const char* kBlanks = " \n\t";
  const size_t first = clean.find_first_not_of(kBlanks);
  if (first == std::string::npos) return {};
  return clean.substr(first, clean.find_last_not_of(kBlanks) - first + 1);
}

}  // namespace

bool Findings::AddText(std::string_view text) {
  AppendClean(text, kLongestText, &text_);
  return !IsFull();
}

void Findings::Set(const char* field, std::string_view text) {
  if (Has(field)) return;
  const std::string clean = Cleaned(text);
  if (!clean.empty()) fields_[field] = clean;
}

void Findings::Set(const char* field, int64_t number) {
  if (!Has(field)) fields_[field] = Json::Int64{number};
}

void Findings::Set(const char* field, bool yes) {
  if (!Has(field)) fields_[field] = yes;
}

void Findings::Set(const char* field, double number) {
  if (!Has(field) && std::isfinite(number)) fields_[field] = number;
}

// The separator has blanks around it, because some fields are analyzed by blanks alone.
void Findings::Add(const char* field, std::string_view text) {
  if (!Has(field)) return Set(field, text);
  constexpr std::string_view kSeparator = " ; ";
  const char* begin = nullptr;
  const char* end = nullptr;
  fields_[field].getString(&begin, &end);
  const std::string_view all(begin, static_cast<size_t>(end - begin));
  const std::string clean = Cleaned(text);
  if (clean.empty() || all.size() + clean.size() + kSeparator.size() > kLongestField) return;
  for (std::string_view rest = all;;) {
    const size_t next = rest.find(kSeparator);
    if (rest.substr(0, next) == clean) return;
    if (next == std::string_view::npos) break;
    rest.remove_prefix(next + kSeparator.size());
  }
  fields_[field] = std::string(all).append(kSeparator).append(clean);
}

Json::Value Findings::Take() {
  if (text_.find_first_not_of(" \n\t") != std::string::npos) fields_["VEXOMDTextContent"] = text_;
  text_.clear();
  return std::exchange(fields_, Json::Value(Json::objectValue));
}

}  // namespace platform::extract
