#include "search_line.h"

#include <algorithm>
#include <iterator>
#include <utility>

#include "common/error.h"
#include "common/strings.h"
#include "error_code.h"

namespace quarrox::elasticd {
namespace {

// Each costs a look-up at least.
constexpr size_t kMostConditions = 256;

// These may look at every name, number or directory.
constexpr size_t kMostFields = 32;

// Longer than the names and paths that people type.
constexpr size_t kLongestValue = 4096;

// Each level costs stack, here and where the tree is worked on.
constexpr int kDeepest = 50;

bool IsBlank(char c) {
  return c == ' ' || ('\t' <= c && c <= '\r');
}

bool IsLetter(char c) {
  return ('a' <= c && c <= 'z') || ('A' <= c && c <= 'Z');
}

const SearchElement* FindField(const std::string& name) {
  const auto* found = std::find_if(std::begin(kSearchLanguage), std::end(kSearchLanguage), [&](const auto& element) {
    return element.field != SearchField::kNone && ToLower(name) == element.name;
  });
  return found == std::end(kSearchLanguage) ? nullptr : found;
}

std::string FieldNames() {
  std::string names;
  for (const SearchElement& element : kSearchLanguage) {
    if (element.field != SearchField::kNone) names.append(names.empty() ? "" : ", ").append(element.name);
  }
  return names;
}

struct Token {
  enum Kind { kEnd, kOpen, kClose, kAnd, kOr, kNot, kLeaf };
  Kind kind = kEnd;
  size_t begin = 0;
  LineNode leaf = {};
};

class Lexer {
 public:
  explicit Lexer(std::string_view line) : line_(line) {}

  Token Next() {
    while (at_ < line_.size() && IsBlank(line_[at_])) ++at_;
    Token token{Token::kEnd, at_};
    if (at_ == line_.size()) return token;
    const bool alone = at_ + 1 == line_.size() || IsBlank(line_[at_ + 1]);
    const char c = line_[at_];
    if (c == '(' || c == ')' || (c == '-' && !alone)) {
      token.kind = c == '(' ? Token::kOpen : c == ')' ? Token::kClose : Token::kNot;
      ++at_;
      return token;
    }
    if (++conditions_ > kMostConditions + operators_) {
      FailAt(line_, at_, "there are more than " + std::to_string(kMostConditions) + " words and conditions");
    }
    token.leaf = Leaf();
    const std::string_view written = line_.substr(token.begin, at_ - token.begin);
    token.kind = written == "AND"   ? Token::kAnd
                 : written == "OR"  ? Token::kOr
                 : written == "NOT" ? Token::kNot
                                    : Token::kLeaf;
    if (token.kind != Token::kLeaf) ++operators_;
    return token;
  }

 private:
  LineNode Leaf() {
    LineNode leaf{LineNode::kText};
    leaf.begin = at_;
    if (line_[at_] == '"') {
      ReadQuoted(leaf);
    } else {
      ReadPlain(leaf, true);
    }
    leaf.end = at_;
    const bool looks_far = leaf.kind == LineNode::kField || !leaf.stars.empty();
    if (looks_far && ++fields_ > kMostFields) {
      FailAt(line_, leaf.begin, "there are more than " + std::to_string(kMostFields) + " conditions with fields or *");
    }
    if (looks_far && leaf.text.size() > kLongestValue) FailAt(line_, leaf.begin, "this is too long");
    return leaf;
  }

  void ReadQuoted(LineNode& leaf) {
    const size_t begin = at_++;
    for (; at_ < line_.size() && line_[at_] != '"'; ++at_) {
      if (line_[at_] == '\\' && at_ + 1 < line_.size()) ++at_;
      leaf.text += line_[at_];
    }
    if (at_ == line_.size()) FailAt(line_, begin, "the quote that begins here has no end; for a plain one write \\\"");
    ++at_;
    leaf.quoted = true;
  }

  // A word, or the value of a field, up to a blank or a parenthesis.
  void ReadPlain(LineNode& leaf, bool may_be_field) {
    for (; at_ < line_.size() && !IsBlank(line_[at_]) && line_[at_] != '(' && line_[at_] != ')'; ++at_) {
      const char c = line_[at_];
      if (c == ':' && may_be_field && !leaf.text.empty() && TakeField(leaf)) {
        return line_[at_] == '"' ? ReadQuoted(leaf) : ReadPlain(leaf, false);
      }
      may_be_field = may_be_field && IsLetter(c);
      if (c == '*') leaf.stars.push_back(leaf.text.size());
      if (c == '\\' && at_ + 1 < line_.size()) ++at_;
      leaf.text += line_[at_];
    }
  }

  // Whether what was read is the name of a field. Addresses and what ends with a colon are words.
  bool TakeField(LineNode& leaf) {
    const std::string_view behind = line_.substr(at_ + 1);
    const SearchElement* element = FindField(leaf.text);
    if (element == nullptr) {
      const bool is_word = behind.empty() || IsBlank(behind.front()) || behind.front() == ':' ||
                           behind.front() == ')' || behind.starts_with("//");
      if (is_word) return false;
      FailAt(line_, leaf.begin,
             "there is no field \"" + Shown(leaf.text) + "\", only " + FieldNames() + "; what is in quotes is words");
    }
    leaf.kind = LineNode::kField;
    leaf.field = element->field;
    leaf.text.clear();
    ++at_;
    if (behind.empty() || IsBlank(behind.front()) || behind.front() == '(' || behind.front() == ')') {
      FailAt(line_, at_, std::string(element->name) + ": lacks its value, as in " + element->written);
    }
    return true;
  }

  const std::string_view line_;
  size_t at_ = 0;
  size_t conditions_ = 0;  // with the operators that are words
  size_t operators_ = 0;
  size_t fields_ = 0;
};

// What stands side by side or has AND between binds closer than OR.
class LineReader {
 public:
  explicit LineReader(std::string_view line) : line_(line), lexer_(line) { Advance(); }

  LineNode Read() {
    LineNode node = Any(0);
    if (token_.kind == Token::kClose) FailAt(line_, token_.begin, "no parenthesis is open here");
    return node;
  }

 private:
  void Advance() { token_ = lexer_.Next(); }

  static LineNode Join(LineNode::Kind kind, std::vector<LineNode> parts) {
    if (parts.size() == 1) return std::move(parts.front());
    LineNode node{kind};
    node.parts = std::move(parts);
    return node;
  }

  LineNode Any(int depth) {
    std::vector<LineNode> parts;
    size_t operator_at = 0;
    for (;;) {
      std::vector<LineNode> all = All(depth);
      const bool more = token_.kind == Token::kOr;
      if (all.empty() && more) FailAt(line_, token_.begin, "OR has nothing before it");
      if (all.empty() && !parts.empty()) FailAt(line_, operator_at, "OR has nothing behind it");
      parts.push_back(Join(LineNode::kAll, std::move(all)));
      if (!more) return Join(LineNode::kAny, std::move(parts));
      operator_at = token_.begin;
      Advance();
    }
  }

  std::vector<LineNode> All(int depth) {
    std::vector<LineNode> parts;
    for (;;) {
      const size_t at = token_.begin;
      const bool joined = token_.kind == Token::kAnd;
      if (joined && parts.empty()) FailAt(line_, at, "AND has nothing before it");
      if (joined) Advance();
      if (token_.kind == Token::kEnd || token_.kind == Token::kOr || token_.kind == Token::kClose) {
        if (joined) FailAt(line_, at, "AND has nothing behind it");
        return parts;
      }
      parts.push_back(Unary(depth));
    }
  }

  LineNode Unary(int depth) {
    const size_t begin = token_.begin;
    bool negated = false;
    for (; token_.kind == Token::kNot; Advance()) negated = !negated;
    if (token_.kind != Token::kLeaf && token_.kind != Token::kOpen)
      FailAt(line_, begin, "nothing follows this operator");
    LineNode node;
    if (token_.kind == Token::kOpen) {
      node = InParentheses(depth);
    } else {
      node = std::move(token_.leaf);
      Advance();
    }
    if (!negated) return node;
    LineNode negation{LineNode::kNot};
    negation.parts.push_back(std::move(node));
    return negation;
  }

  LineNode InParentheses(int depth) {
    const size_t begin = token_.begin;
    if (depth == kDeepest) {
      FailAt(line_, begin, "parentheses are nested more than " + std::to_string(kDeepest) + " deep");
    }
    Advance();
    LineNode node = Any(depth + 1);
    if (token_.kind != Token::kClose) FailAt(line_, begin, "the parenthesis that opens here is not closed");
    if (node.kind == LineNode::kAll && node.parts.empty()) FailAt(line_, begin, "nothing stands in these parentheses");
    Advance();
    return node;
  }

  const std::string_view line_;
  Lexer lexer_;
  Token token_;
};

}  // namespace

LineNode ReadLine(std::string_view line) {
  return LineReader(line).Read();
}

void FailAt(std::string_view line, size_t at, const std::string& reason) {
  const auto column = 1 + std::count_if(line.begin(), line.begin() + static_cast<std::ptrdiff_t>(at),
                                        [](char c) { return (static_cast<unsigned char>(c) & 0xc0) != 0x80; });
  throw Error(kBadQuery, "column " + std::to_string(column) + ": " + reason);
}

std::string Shown(std::string_view text) {
  constexpr size_t kShown = 40;
  return text.size() <= kShown ? std::string(text) : std::string(text.substr(0, kShown)) + "...";
}

}  // namespace quarrox::elasticd
