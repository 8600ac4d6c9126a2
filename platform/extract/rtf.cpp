#include <algorithm>
#include <array>
#include <cctype>
#include <cstdlib>
#include <ctime>
#include <map>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include <unicode/utf8.h>

#include "extract/decoder.h"
#include "extract/documents.h"
#include "extract/pieces.h"

namespace platform::extract {
namespace {

constexpr size_t kDeepest = 10'000;
constexpr size_t kLongestWord = 64;
constexpr const char* kCreated = "VEXOMDContentCreationDate";

// A group that begins with one of these words is another place than the one that it is in.
struct Destination {
  const char* field;       // null: nothing of it is kept
  std::string_view words;  // each between blanks
};
constexpr Destination kBody = {"VEXOMDTextContent", ""};
constexpr Destination kDestinations[] = {
    {"VEXOMDTitle", " title "},
    {"VEXOMDAuthors", " author "},
    {"VEXOMDDescription", " subject "},
    {"VEXOMDKeywords", " keywords "},
    {"VEXOMDComment", " doccomm "},
    {kCreated, " creatim "},
    {kBody.field, " annotation footer footerf footerl footerr footnote header headerf headerl headerr shptxt "},
    {nullptr, " * colortbl fldinst fonttbl info nonshppict objdata pict pntext stylesheet tc xe "},
};

// What words of the text stand for.
struct Symbol {
  std::string_view text;
  std::string_view words;
};
constexpr Symbol kSymbols[] = {
    {"\n", " par line row nestrow sect page column \n \r "},
    {"\t", " tab cell nestcell "},
    {" ", " emspace enspace ~ "},
    {"-", " _ "},
    {"\\", " \\ "},
    {"{", " { "},
    {"}", " } "},
    {"\u2013", " endash "},
    {"\u2014", " emdash "},
    {"\u2018", " lquote "},
    {"\u2019", " rquote "},
    {"\u201c", " ldblquote "},
    {"\u201d", " rdblquote "},
    {"\u2022", " bullet "},
};

// The code pages of fonts, by what \fcharset says of them.
struct Charset {
  int number;
  int page;
};
constexpr Charset kCharsets[] = {
    {128, 932},  {129, 949},  {134, 936},  {136, 950},  {161, 1253}, {162, 1254}, {163, 1258},
    {177, 1255}, {178, 1256}, {186, 1257}, {204, 1251}, {222, 874},  {238, 1250},
};

template <typename Row, size_t size>
const Row* Find(const Row (&table)[size], const std::string& word) {
  for (const Row& row : table) {
    if (row.words.find(" " + word + " ") != std::string_view::npos) return &row;
  }
  return nullptr;
}

class RtfReader {
 public:
  RtfReader(const Pieces& pieces, Findings& findings) : pieces_(pieces), findings_(findings) {}

  void Read() {
    for (int c = Next(); c >= 0 && !findings_.IsFull(); c = Next()) {
      if (c == '{') {
        Open();
      } else if (c == '}') {
        Close();
      } else if (c == '\\') {
        Control();
      } else if (c != '\r' && c != '\n') {
        Byte(static_cast<char>(c));
      }
    }
    Flush();
    findings_.AddText(text_);
    if (groups_.size() > 1 && !findings_.IsFull()) throw std::runtime_error("RTF cut short");
  }

 private:
  struct Group {
    const Destination* destination = &kBody;
    bool is_its_first = false;  // of the groups there
    int fallbacks = 1;          // how many characters stand after one in Unicode, for who does not know that
    int page = 0;               // of the font; 0: the document's
  };

  int Next();
  void Open();
  void Close();
  void Control();
  void Word(const std::string& word, bool has_number, int number);
  void Break(const Destination& destination);
  void Byte(char c);
  void Unit(int number);
  void Append(std::string_view text);
  void Flush();

  const Pieces& pieces_;
  Findings& findings_;
  std::string_view piece_;
  std::vector<Group> groups_ = std::vector<Group>(1);
  std::map<int, int> pages_;  // of the fonts
  int font_ = 0;
  int page_ = 1252;
  int skipped_ = 0;    // fallbacks that are still to come
  int high_ = 0;       // the first half of a pair
  std::string bytes_;  // text that is not decoded
  std::string text_;   // of the body
  std::string value_;  // of a field
  tm created_ = {};
};

int RtfReader::Next() {
  if (piece_.empty()) piece_ = pieces_();
  if (piece_.empty()) return -1;
  const auto c = static_cast<unsigned char>(piece_.front());
  piece_.remove_prefix(1);
  return c;
}

void RtfReader::Open() {
  Flush();
  if (groups_.size() > kDeepest) throw std::runtime_error("groups are nested too deeply");
  groups_.push_back(groups_.back());
  groups_.back().is_its_first = false;
  skipped_ = 0;
}

void RtfReader::Close() {
  Flush();
  skipped_ = 0;
  if (groups_.size() == 1) return;
  const Group closed = groups_.back();
  groups_.pop_back();
  const char* const field = closed.destination->field;
  if (!closed.is_its_first || field == nullptr) return;
  if (field == kCreated) {
    if (created_.tm_year > 0) findings_.Set(kCreated, int64_t{timegm(&created_)});
  } else if (field != kBody.field) {
    findings_.Set(field, value_);
  }
  Break(*closed.destination);
  value_.clear();
}

// No word goes on from one text of the body to another.
void RtfReader::Break(const Destination& destination) {
  if (destination.field == kBody.field) text_.push_back('\n');
}

// A word of letters may have a number, and a blank that belongs to it; any other word is one character.
void RtfReader::Control() {
  int c = Next();
  if (c < 0) return;
  std::string word(1, static_cast<char>(c));
  if (isalpha(c) == 0) {
    if (c != '\'') return Word(word, false, 0);
    const char digits[] = {static_cast<char>(Next()), static_cast<char>(Next()), '\0'};
    return Byte(static_cast<char>(strtol(digits, nullptr, 16)));
  }
  std::string number;
  for (c = Next(); isalpha(c) != 0 && word.size() < kLongestWord; c = Next()) word.push_back(static_cast<char>(c));
  for (; (isdigit(c) != 0 || c == '-') && number.size() < 11; c = Next()) number.push_back(static_cast<char>(c));
  if (c >= 0 && c != ' ') piece_ = std::string_view(piece_.data() - 1, piece_.size() + 1);
  Word(word, !number.empty(), static_cast<int>(strtol(number.c_str(), nullptr, 10)));
}

void RtfReader::Word(const std::string& word, bool has_number, int number) {
  Group& group = groups_.back();
  if (word == "u" && has_number) return Unit(number);
  Flush();
  if (const Destination* const destination = Find(kDestinations, word); destination != nullptr) {
    group.destination = destination;
    group.is_its_first = true;
    Break(*destination);
  } else if (const Symbol* const symbol = Find(kSymbols, word); symbol != nullptr) {
    Append(symbol->text);
  } else if (word == "uc") {
    group.fallbacks = number;
  } else if (word == "ansicpg") {
    page_ = number;
  } else if (word == "f") {
    font_ = number;
    const auto page = pages_.find(number);
    group.page = page == pages_.end() ? 0 : page->second;
  } else if (word == "fcharset") {
    for (const Charset& charset : kCharsets) {
      if (charset.number == number && pages_.size() < kDeepest) pages_[font_] = charset.page;
    }
  } else if (word == "bin") {
    for (int i = 0; i < number && Next() >= 0; ++i) {
    }
  } else if (group.destination->field == kCreated) {
    constexpr std::string_view kParts[] = {"yr", "mo", "dy", "hr", "min"};
    int* const parts[] = {&created_.tm_year, &created_.tm_mon, &created_.tm_mday, &created_.tm_hour, &created_.tm_min};
    const int starts[] = {1900, 1, 0, 0, 0};
    for (size_t i = 0; i < std::size(kParts); ++i) {
      if (word == kParts[i]) *parts[i] = std::clamp(number, 0, 9999) - starts[i];
    }
  }
}

void RtfReader::Byte(char c) {
  if (skipped_ > 0) {
    --skipped_;
  } else if (groups_.back().destination->field != nullptr) {
    bytes_.push_back(c);
    if (bytes_.size() >= kPiece) Flush();
  }
}

// A unit of UTF-16, as a number that may have a sign.
void RtfReader::Unit(int number) {
  Flush();
  const int unit = number & 0xffff;
  skipped_ = groups_.back().fallbacks;
  if (U16_IS_LEAD(unit)) {
    high_ = unit;
    return;
  }
  const UChar32 c = U16_IS_TRAIL(unit) && high_ != 0 ? U16_GET_SUPPLEMENTARY(high_, unit) : unit;
  high_ = 0;
  if (U_IS_SURROGATE(c)) return;
  uint8_t utf8[U8_MAX_LENGTH];
  size_t size = 0;
  U8_APPEND_UNSAFE(utf8, size, static_cast<uint32_t>(c));
  Append({reinterpret_cast<const char*>(utf8), size});
}

void RtfReader::Append(std::string_view text) {
  const char* const field = groups_.back().destination->field;
  if (field == kBody.field) {
    text_.append(text);
    if (text_.size() < kPiece) return;
    findings_.AddText(text_);
    text_.clear();
  } else if (field != nullptr && value_.size() < kLongestField) {
    value_.append(text);
  }
}

void RtfReader::Flush() {
  if (bytes_.empty()) return;
  if (std::all_of(bytes_.begin(), bytes_.end(), [](char c) { return static_cast<unsigned char>(c) < 0x80; })) {
    Append(bytes_);
  } else {
    Decoder decoder("windows-" + std::to_string(groups_.back().page == 0 ? page_ : groups_.back().page));
    Append(decoder.Decode(bytes_));
  }
  bytes_.clear();
}

}  // namespace

void ExtractRtf(const Source& source, Findings& findings) {
  const Pieces pieces = FilePieces(source);
  RtfReader(pieces, findings).Read();
}

}  // namespace platform::extract
