#include "analysis_unicode.h"

#include <algorithm>
#include <array>

#include <unicode/normalizer2.h>
#include <unicode/uchar.h>
#include <unicode/unistr.h>
#include <unicode/uscript.h>
#include <unicode/utf16.h>
#include <unicode/utf8.h>

#include "analysis.h"
#include "common/error.h"

namespace quarrox::elasticd {
namespace {

// What readers of pieces may read of them at least.
constexpr size_t kReadable = 16;

void Check(UErrorCode status, const char* what) {
  if (U_FAILURE(status)) {
    throw Error(kErrSystem, std::string(what) + ": " + u_errorName(status) + "; are the data of ICU installed?");
  }
}

struct Forms {
  const icu::Normalizer2* folded;
  const icu::Normalizer2* decomposed;
  const icu::Normalizer2* composed;
};

const Forms& TheForms() {
  static const Forms forms = [] {
    UErrorCode status = U_ZERO_ERROR;
    const Forms made{icu::Normalizer2::getNFKCCasefoldInstance(status), icu::Normalizer2::getNFDInstance(status),
                     icu::Normalizer2::getNFCInstance(status)};
    Check(status, "normalization");
    return made;
  }();
  return forms;
}

// How much of a word is folded at once. Putting marks into their canonical order costs the square of how many there
// are, so that much and no more, cut where characters do not join.
size_t FirstChunk(std::string_view utf8) {
  constexpr size_t kEnough = 1024;
  constexpr size_t kMost = 4096;
  size_t at = std::min(kEnough, utf8.size());
  while (at < utf8.size() && U8_IS_TRAIL(static_cast<uint8_t>(utf8[at]))) ++at;
  while (at < utf8.size() && at < kMost) {
    const CodePoint c = DecodeAt(utf8, at);
    if (TheForms().folded->hasBoundaryBefore(c.value)) break;
    at += c.length;
  }
  return at;
}

void AppendFolded(icu::UnicodeString& to, std::string_view utf8) {
  const Forms& forms = TheForms();
  UErrorCode status = U_ZERO_ERROR;
  const auto source = icu::UnicodeString::fromUTF8(icu::StringPiece(utf8.data(), static_cast<int32_t>(utf8.size())));
  const icu::UnicodeString apart = forms.decomposed->normalize(forms.folded->normalize(source, status), status);
  icu::UnicodeString plain;
  for (int32_t i = 0; i < apart.length(); i = apart.moveIndex32(i, 1)) {
    const UChar32 c = apart.char32At(i);
    if (u_charType(c) != U_NON_SPACING_MARK) plain.append(c);
  }
  to.append(forms.composed->normalize(plain, status));
  Check(status, "normalization");
}

// Compatibility forms and case folded, then without accents. The text must be well-formed.
icu::UnicodeString Fold(std::string_view utf8) {
  icu::UnicodeString folded;
  while (!utf8.empty()) {
    const size_t chunk = FirstChunk(utf8);
    AppendFolded(folded, utf8.substr(0, chunk));
    utf8.remove_prefix(chunk);
  }
  return folded;
}

void AppendUtf8(std::string& to, UChar32 c) {
  char bytes[U8_MAX_LENGTH];
  size_t length = 0;
  U8_APPEND_UNSAFE(bytes, length, c);
  to.append(bytes, length);
}

// What a code point becomes in whatever word it stands, where that does not depend on its neighbours.
struct Alone {
  enum Kind : uint8_t { kNoWord, kFolds, kNeedsNeighbours };
  Kind kind = kNoWord;
  uint8_t length = 0;
  char bytes[6] = {};
};

Alone FoldAlone(UChar32 c) {
  Alone alone;  // of no word
  if (!IsWordCharacter(c)) return alone;
  std::string source;
  AppendUtf8(source, c);
  const icu::UnicodeString folded = Fold(source);
  std::string bytes;
  folded.toUTF8String(bytes);
  alone.kind = bytes.size() <= sizeof(alone.bytes) ? Alone::kFolds : Alone::kNeedsNeighbours;
  for (int32_t i = 0; i < folded.length(); i = folded.moveIndex32(i, 1)) {
    if (!IsWordCharacter(folded.char32At(i))) alone.kind = Alone::kNeedsNeighbours;
  }
  if (alone.kind != Alone::kFolds) return alone;
  alone.length = static_cast<uint8_t>(bytes.copy(alone.bytes, sizeof(alone.bytes)));
  return alone;
}

// Latin, Greek, Cyrillic and Armenian letters join with nothing but the marks that folding drops, so the words of these
// languages are folded letter by letter.
constexpr UChar32 kEndOfAlone = 0x590;

const std::array<Alone, kEndOfAlone>& AloneTable() {
  static const std::array<Alone, kEndOfAlone> table = [] {
    std::array<Alone, kEndOfAlone> made;
    for (UChar32 c = 0; c < kEndOfAlone; ++c) made[static_cast<size_t>(c)] = FoldAlone(c);
    return made;
  }();
  return table;
}

// Stays as it is in whatever word it stands. A Hangul syllable does unless a single jamo follows, and that does not.
bool StaysAsItIs(UChar32 c) {
  if (c >= 0xac00 && c <= 0xd7a3) return true;
  const Forms& forms = TheForms();
  return forms.folded->isInert(c) && forms.decomposed->isInert(c) && u_charType(c) != U_NON_SPACING_MARK;
}

bool IsAscii(std::string_view text) {
  return std::none_of(text.begin(), text.end(), [](char c) { return (c & 0x80) != 0; });
}

// The length of what is well-formed UTF-8 at the beginning of `text`.
size_t WellFormed(std::string_view text) {
  size_t at = 0;
  while (at < text.size()) {
    const CodePoint c = DecodeAt(text, at);
    if (c.value < 0) break;
    at += c.length;
  }
  return at;
}

}  // namespace

CodePoint DecodeAt(std::string_view text, size_t at) {
  const auto* bytes = reinterpret_cast<const uint8_t*>(text.data()) + at;
  const auto size = static_cast<int32_t>(std::min<size_t>(text.size() - at, U8_MAX_LENGTH));
  int32_t length = 0;
  UChar32 value = 0;
  U8_NEXT(bytes, length, size, value);
  return value < 0 ? CodePoint{-1, 1} : CodePoint{value, static_cast<size_t>(length)};
}

bool IsWordCharacter(int32_t code_point) {
  return (U_GET_GC_MASK(code_point) & (U_GC_L_MASK | U_GC_N_MASK | U_GC_M_MASK)) != 0;
}

bool IsIdeograph(int32_t code_point) {
  if (code_point < 0x2e80) return false;                           // before all of these scripts
  if (code_point >= 0x4e00 && code_point <= 0x9fff) return true;   // nearly all that occur
  if (code_point >= 0xac00 && code_point <= 0xd7a3) return false;  // Hangul syllables
  return uscript_hasScript(code_point, USCRIPT_HAN) || uscript_hasScript(code_point, USCRIPT_HIRAGANA) ||
         uscript_hasScript(code_point, USCRIPT_KATAKANA);
}

const std::vector<UnicodeSplitter::Piece>& UnicodeSplitter::Split(std::string_view run) {
  bytes_.clear();
  begin_ = 0;
  places_.clear();
  for (size_t at = 0; at < run.size();) at = SplitSegment(run, at);

  bytes_.append(kReadable, '\0');
  pieces_.clear();
  for (const Place& place : places_) {
    pieces_.push_back({std::string_view(bytes_).substr(place.offset, place.length), place.ideographs});
  }
  return pieces_;
}

// Splits what goes up to the next character that is no part of words, and returns where to go on behind that.
size_t UnicodeSplitter::SplitSegment(std::string_view run, size_t begin) {
  static const std::array<Alone, kEndOfAlone>& table = AloneTable();
  const size_t bytes = bytes_.size();
  const size_t places = places_.size();
  bool alone = true;  // up to now each character could be folded by itself
  size_t at = begin;
  size_t behind = 0;  // what ended the segment
  while (at < run.size() && behind == 0) {
    const CodePoint c = DecodeAt(run, at);
    if (c.value >= 0 && c.value < kEndOfAlone) {
      const Alone& folded = table[static_cast<size_t>(c.value)];
      if (folded.kind == Alone::kNoWord) behind = c.length;
      if (folded.kind == Alone::kNeedsNeighbours) alone = false;
      if (alone && ideographs_ && folded.length > 0) EndPiece();
      if (alone) bytes_.append(folded.bytes, folded.length);
    } else if (c.value < 0 || !IsWordCharacter(c.value)) {
      behind = c.length;
    } else {
      alone = alone && StaysAsItIs(c.value);
      if (alone) Take(c.value);
    }
    if (behind == 0) at += c.length;
  }
  if (!alone) {
    bytes_.resize(bytes);
    begin_ = bytes;
    ideographs_ = false;
    places_.resize(places);
    FoldSegment(run.substr(begin, at - begin));
  }
  EndPiece();
  return at + behind;
}

// Folding may bring forth what is no part of words, such as the stroke of a fraction.
void UnicodeSplitter::FoldSegment(std::string_view segment) {
  const icu::UnicodeString folded = Fold(segment);
  for (int32_t i = 0; i < folded.length(); i = folded.moveIndex32(i, 1)) {
    const UChar32 c = folded.char32At(i);
    if (IsWordCharacter(c)) {
      Take(c);
    } else {
      EndPiece();
    }
  }
}

// Adds a folded character of a word to the piece, or begins another one with it.
void UnicodeSplitter::Take(int32_t code_point) {
  const bool ideograph = IsIdeograph(code_point);
  if (ideograph != ideographs_) EndPiece();
  ideographs_ = ideograph;
  AppendUtf8(bytes_, code_point);
}

void UnicodeSplitter::EndPiece() {
  const size_t length = bytes_.size() - begin_;
  if (length > 0 && (ideographs_ || length <= kLongestWord)) places_.push_back({begin_, length, ideographs_});
  begin_ = bytes_.size();
  ideographs_ = false;
}

std::string FoldWord(std::string_view word) {
  std::string folded;
  if (IsAscii(word)) {
    folded = word;
    for (char& c : folded) c = c >= 'A' && c <= 'Z' ? static_cast<char>(c | 0x20) : c;
    return folded;
  }
  while (!word.empty()) {
    const size_t well_formed = WellFormed(word);
    if (well_formed > 0) Fold(word.substr(0, well_formed)).toUTF8String(folded);
    word.remove_prefix(well_formed);
    if (word.empty()) break;
    folded += word.front();
    word.remove_prefix(1);
  }
  return folded;
}

}  // namespace quarrox::elasticd
