// The text of a document of XML or HTML, and the fields that its elements stand for.
#pragma once

#include <span>
#include <string>
#include <string_view>

#include "extract/findings.h"
#include "extract/markup.h"

namespace platform::extract {

using ElementNames = std::span<const std::string_view>;

// What of a document is text.
struct TextRules {
  ElementNames read;          // text stands only in these; everywhere, where there are none
  ElementNames skipped;       // nothing in these is
  ElementNames breaks;        // at these a word ends
  bool others_break = false;  // at all but these
};

// Appends the text to a string, with one blank or line end for any number of them.
class TextReader : public MarkupHandler {
 public:
  TextReader(const TextRules& rules, std::string* text) : rules_(rules), text_(text) {}
  void Start(std::string_view name, const Attributes& attributes) override;
  void End(std::string_view name) override;
  void Text(std::string_view text) override;

 private:
  bool Breaks(std::string_view name) const;

  const TextRules& rules_;
  std::string* const text_;
  int read_ = 0;  // how many open elements are read, or skipped
  int skipped_ = 0;
  char gap_ = '\0';  // what comes before the next character
};

// What a field holds.
enum class FieldKind { kText, kList, kDate };

// An element, or a name that is told in an attribute, and its field.
struct FieldRule {
  std::string_view name;
  const char* field;
  FieldKind kind;
};

// Sets the fields that the rules have for elements.
class FieldReader : public MarkupHandler {
 public:
  FieldReader(std::span<const FieldRule> rules, Findings& findings) : rules_(rules), findings_(findings) {}
  void Start(std::string_view name, const Attributes& attributes) override;
  void End(std::string_view name) override;
  void Text(std::string_view text) override;

 private:
  std::span<const FieldRule> rules_;
  Findings& findings_;
  std::string value_;
};

// Adds the text of a page, and sets what its head tells. Throws what ReadMarkup throws.
void ReadHtml(const Pieces& pieces, Findings& findings);

// The text of a page without its head, at most kLongestText bytes and a piece. Throws what ReadMarkup throws.
std::string HtmlText(const Pieces& pieces, const std::string& encoding = {});

}  // namespace platform::extract
