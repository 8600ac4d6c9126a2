#include "snippet.h"

#include <algorithm>

#include "analysis.h"
#include "analysis_unicode.h"

namespace quarrox::elasticd {
namespace {

// What fits on two lines of a terminal, in bytes.
constexpr size_t kLength = 150;

// What stands before the first word, at most.
constexpr size_t kBefore = 40;

// How far texts are looked at: a page of hits is shown at once.
constexpr size_t kScanned = size_t{1} << 18;

// So many places are enough to choose from.
constexpr size_t kMostFound = 500;

constexpr char kEllipsis[] = "\xe2\x80\xa6";

bool IsAsciiWord(unsigned char c) {
  return ('0' <= c && c <= '9') || ('a' <= (c | 0x20) && (c | 0x20) <= 'z');
}

bool IsWordByte(unsigned char c) {
  return c >= 0x80 || IsAsciiWord(c);
}

bool IsBlank(unsigned char c) {
  return c <= ' ';
}

size_t ToCharacter(std::string_view text, size_t at) {
  while (at > 0 && at < text.size() && (static_cast<unsigned char>(text[at]) & 0xc0) == 0x80) --at;
  return at;
}

// Copies a piece with its white space folded, and with marks on what was found.
class Copy {
 public:
  explicit Copy(std::string_view text) : text_(text) {}

  void UpTo(size_t end) {
    for (; at_ < end; ++at_) {
      const bool blank = IsBlank(static_cast<unsigned char>(text_[at_]));
      if (!blank) {
        snippet_.text += text_[at_];
      } else if (!snippet_.text.empty() && snippet_.text.back() != ' ') {
        snippet_.text += ' ';
      }
    }
  }

  void Mark(size_t begin, size_t end) {
    UpTo(begin);
    const size_t offset = snippet_.text.size();
    UpTo(end);
    snippet_.marks.emplace_back(offset, snippet_.text.size() - offset);
  }

  void Begin(size_t begin) {
    at_ = begin;
    if (begin > 0) snippet_.text = kEllipsis;
  }

  Snippet End(size_t end) {
    UpTo(end);
    while (!snippet_.text.empty() && snippet_.text.back() == ' ') snippet_.text.pop_back();
    if (end < text_.size()) snippet_.text += kEllipsis;
    return std::move(snippet_);
  }

 private:
  const std::string_view text_;
  size_t at_ = 0;
  Snippet snippet_;
};

}  // namespace

void SnippetWords::Add(const TextPiece& piece, bool beginning) {
  const std::string& word = piece.text;
  if (beginning && !piece.ideographs) {
    if (std::find(beginnings_.begin(), beginnings_.end(), word) != beginnings_.end()) return;
    beginnings_.push_back(word);
  } else {
    const auto is_same = [&](const TextPiece& other) {
      return other.text == word && other.ideographs == piece.ideographs;
    };
    if (std::any_of(words_.begin(), words_.end(), is_same)) return;
    words_.push_back(piece);
  }
  const auto first = static_cast<unsigned char>(word.front());
  firsts_[first] = true;
  if ('a' <= first && first <= 'z') firsts_[first - 0x20] = true;
}

void SnippetWords::TakeWord(const std::string& folded, size_t begin, size_t end, std::vector<Found>& found) const {
  for (size_t i = 0; i < words_.size(); ++i) {
    if (words_[i].text == folded) return found.push_back({begin, end, i});
  }
  for (size_t i = 0; i < beginnings_.size(); ++i) {
    if (folded.starts_with(beginnings_[i])) return found.push_back({begin, end, words_.size() + i});
  }
}

// Signs are folded one by one, so that each knows where it stood.
void SnippetWords::TakeSigns(std::string_view text, size_t begin, size_t end, std::vector<Found>& found) const {
  std::string folded;
  std::vector<size_t> places;  // of each byte of `folded`
  for (size_t at = begin; at < end;) {
    const size_t length = DecodeAt(text, at).length;
    folded += FoldWord(text.substr(at, length));
    places.resize(folded.size(), at);
    at += length;
  }
  for (size_t i = 0; i < words_.size(); ++i) {
    if (!words_[i].ideographs) continue;
    const std::string& word = words_[i].text;
    size_t left = kMostFound;
    for (size_t at = folded.find(word); at != std::string::npos && left-- > 0;
         at = folded.find(word, at + word.size())) {
      const size_t last = places[at + word.size() - 1];
      found.push_back({places[at], last + DecodeAt(text, last).length, i});
    }
  }
}

// A run that is not ASCII: by characters, ideographs apart from the others.
void SnippetWords::TakeForeign(std::string_view text, size_t begin, size_t end, std::vector<Found>& found) const {
  size_t word = begin;
  bool ideographs = false;
  const auto take = [&](size_t behind) {
    if (behind == word) return;
    if (ideographs) {
      TakeSigns(text, word, behind, found);
    } else if (behind - word <= 2 * kLongestWord) {
      TakeWord(FoldWord(text.substr(word, behind - word)), word, behind, found);
    }
  };
  for (size_t at = begin; at < end;) {
    const CodePoint c = DecodeAt(text, at);
    const bool inside = c.value >= 0 && IsWordCharacter(c.value);
    const bool ideograph = inside && IsIdeograph(c.value);
    if (!inside || ideograph != ideographs) {
      take(at);
      word = inside ? at : at + c.length;
      ideographs = ideograph;
    }
    at += c.length;
  }
  take(end);
}

void SnippetWords::TakeRun(std::string_view text, size_t begin, size_t end, std::vector<Found>& found) const {
  const std::string_view run = text.substr(begin, end - begin);
  if (std::any_of(run.begin(), run.end(), [](char c) { return (c & 0x80) != 0; })) {
    TakeForeign(text, begin, end, found);
  } else if (firsts_[static_cast<unsigned char>(run.front())] && run.size() <= kLongestWord) {
    TakeWord(FoldWord(run), begin, end, found);
  }
}

std::vector<SnippetWords::Found> SnippetWords::FindAll(std::string_view text) const {
  std::vector<Found> found;
  const size_t end = std::min(text.size(), kScanned);
  for (size_t at = 0; at < end && found.size() < kMostFound;) {
    if (!IsWordByte(static_cast<unsigned char>(text[at]))) {
      ++at;
      continue;
    }
    size_t behind = at;
    while (behind < end && IsWordByte(static_cast<unsigned char>(text[behind]))) ++behind;
    TakeRun(text, at, behind, found);
    at = behind;
  }
  std::stable_sort(found.begin(), found.end(), [](const Found& a, const Found& b) { return a.begin < b.begin; });
  return found;
}

Snippet SnippetWords::Find(std::string_view text) const {
  const std::vector<Found> found = FindAll(text);
  if (found.empty()) return {};
  size_t best = 0;
  size_t most = 0;
  for (size_t i = 0; i < found.size(); ++i) {
    std::unordered_set<size_t> different;
    for (size_t j = i; j < found.size() && found[j].end - found[i].begin <= kLength - kBefore; ++j) {
      different.insert(found[j].word);
    }
    if (different.size() <= most) continue;
    most = different.size();
    best = i;
  }
  const size_t first = found[best].begin;
  size_t begin = text.size() <= kLength ? 0 : ToCharacter(text, first - std::min(first, kBefore));
  if (begin > 0) {
    while (begin < first && !IsBlank(static_cast<unsigned char>(text[begin]))) ++begin;
    while (begin < first && IsBlank(static_cast<unsigned char>(text[begin]))) ++begin;
  }
  size_t end = ToCharacter(text, std::min(text.size(), std::max(begin + kLength, found[best].end)));
  const size_t last_blank = end < text.size() ? text.substr(0, end).find_last_of(" \t\n") : end;
  if (last_blank != std::string_view::npos && last_blank > found[best].end) end = last_blank;

  Copy copy(text);
  copy.Begin(begin);
  size_t marked = begin;
  for (const Found& each : found) {
    if (each.begin < marked || each.end > end) continue;
    copy.Mark(each.begin, each.end);
    marked = each.end;
  }
  return copy.End(end);
}

}  // namespace quarrox::elasticd
