#include "analysis_pieces.h"

#include <algorithm>
#include <cinttypes>
#include <cstdio>

#define XXH_INLINE_ALL
#include <xxhash.h>

#include <unicode/uchar.h>

#include "analysis.h"
#include "analysis_unicode.h"
#include "analysis_words.h"

namespace quarrox::elasticd {
namespace {

constexpr size_t kHashDigits = 32;

std::string HexDigits(XXH128_hash_t hash) {
  char digits[kHashDigits + 1];
  snprintf(digits, sizeof(digits), "%016" PRIx64 "%016" PRIx64, uint64_t{hash.high64}, uint64_t{hash.low64});
  return digits;
}

// What FitKeyword makes of a value that does not fit.
std::string Shorten(std::string_view value, size_t room, XXH128_hash_t hash) {
  return std::string(value.substr(0, room - std::min(room, kHashDigits))) + HexDigits(hash);
}

// Both kinds of pieces are words for the analyzers that need more than plain words.
struct VisitAll {
  const Visitor& visit;
  void Word(std::string_view word) const { visit(word); }
  void Ideographs(std::string_view signs) const { visit(signs); }
};

void SplitWhiteSpace(std::string_view text, bool escaped, const Visitor& visit) {
  std::string word;
  bool any = false;
  for (size_t at = 0; at < text.size();) {
    if (escaped && text[at] == '\\' && at + 1 < text.size()) {
      word += text[at + 1];
      any = true;
      at += 2;
      continue;
    }
    const CodePoint c = DecodeAt(text, at);
    if (c.value >= 0 && u_isUWhiteSpace(c.value)) {
      if (any) visit(word);
      word.clear();
      any = false;
    } else {
      word.append(text, at, c.length);
      any = true;
    }
    at += c.length;
  }
  if (any) visit(word);
}

std::string_view WithoutSlashesAtEnd(std::string_view path) {
  while (path.size() > 1 && path.back() == '/') path.remove_suffix(1);
  return path;
}

}  // namespace

bool HoldsPlainWords(const Field& field) {
  return field.analyzer == Analyzer::kStandard && !field.ngram && !field.list_ancestor && !field.IsNumber();
}

void ForEachWord(const Field& field, std::string_view value, const Visitor& visit) {
  const Visitor folding = [&](std::string_view word) { visit(FoldWord(word)); };
  const Visitor& wanted = field.to_lower ? folding : visit;
  switch (field.analyzer) {
    case Analyzer::kKeyword:
      return wanted(value);
    case Analyzer::kWhiteSpace:
      return SplitWhiteSpace(value, false, wanted);
    case Analyzer::kWhiteSpaceEscaped:
      return SplitWhiteSpace(value, true, wanted);
    case Analyzer::kStandard: {
      WordSplitter splitter;
      VisitAll sink{visit};
      return splitter.Split(value, sink);
    }
  }
}

void ForEachDirectory(std::string_view path, size_t room, const Visitor& visit) {
  path = WithoutSlashesAtEnd(path);
  if (path.empty()) return;
  if (path.front() == '/' && path.size() > 1) visit("/");
  // The hash goes along with the path, so that a deep one is not hashed once a level.
  XXH3_state_t state;
  XXH3_128bits_reset(&state);
  size_t hashed = 0;
  const auto visit_until = [&](size_t end) {
    const std::string_view directory = path.substr(0, end);
    XXH3_128bits_update(&state, path.data() + hashed, end - hashed);
    hashed = end;
    if (directory.size() <= room) {
      visit(directory);
    } else {
      visit(Shorten(directory, room, XXH3_128bits_digest(&state)));
    }
  };
  for (size_t at = 1; at < path.size(); ++at) {
    if (path[at] == '/' && path[at - 1] != '/') visit_until(at);
  }
  visit_until(path.size());
}

std::string WholeDirectory(std::string_view path, size_t room) {
  std::string kept;
  return std::string(FitKeyword(WithoutSlashesAtEnd(path), room, kept));
}

std::string_view FitKeyword(std::string_view value, size_t room, std::string& kept) {
  if (value.size() <= room) return value;
  kept = Shorten(value, room, XXH3_128bits(value.data(), value.size()));
  return kept;
}

void ForEachNgram(std::string_view word, const Visitor& visit) {
  size_t end = 0;
  size_t held = 0;  // so many code points from `begin` to `end`
  for (size_t begin = 0; begin < word.size(); begin += DecodeAt(word, begin).length) {
    for (; held < kNgram && end < word.size(); ++held) end += DecodeAt(word, end).length;
    visit(word.substr(begin, end - begin));
    --held;
  }
}

}  // namespace quarrox::elasticd
