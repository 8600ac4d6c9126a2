#include "extract/decoder.h"

#include <algorithm>
#include <cctype>
#include <new>
#include <vector>

#include <uchardet/uchardet.h>
#include <unicode/ucnv.h>
#include <unicode/unistr.h>
#include <unicode/utf8.h>

#include "common/strings.h"

namespace platform::extract {
namespace {

// As far as a declaration may stand from the beginning, as browsers look for it. In bytes.
constexpr size_t kDeclarationWithin = 4096;

struct Alias {
  std::string_view declared;
  const char* meant;
};
constexpr Alias kAliases[] = {{"gb2312", "gb18030"},
                              {"gbk", "gb18030"},
                              {"iso-8859-1", "windows-1252"},
                              {"us-ascii", "windows-1252"},
                              {"uhc", "windows-949"}};

std::string Meant(const std::string& encoding) {
  std::string name = quarrox::ToLower(encoding);
  for (const Alias& alias : kAliases) {
    if (alias.declared == name) return alias.meant;
  }
  return name;
}

bool IsOfName(char c) {
  return isalnum(static_cast<unsigned char>(c)) != 0 || c == '-' || c == '_' || c == ':' || c == '.';
}

// The first encoding that is named; of something else, perhaps, where it cannot be UTF-8 and that is what is named.
std::string Declared(std::string_view head, bool may_be_utf8) {
  const std::string text = quarrox::ToLower(std::string(head.substr(0, kDeclarationWithin)));
  for (const std::string_view key : {"charset", "encoding"}) {
    for (size_t at = text.find(key); at != std::string::npos; at = text.find(key, at)) {
      at = text.find_first_not_of(" \t\r\n", at + key.size());
      if (at == std::string::npos) break;
      if (text[at] != '=') continue;
      at = text.find_first_not_of(" \t\r\n\"'", at + 1);
      if (at == std::string::npos) break;
      const auto start = text.begin() + static_cast<std::ptrdiff_t>(at);
      std::string name(start, std::find_if_not(start, text.end(), IsOfName));
      if (name.starts_with("utf-16")) name = "utf-8";  // it could not be read if it were true
      if (!name.empty() && (may_be_utf8 || name != "utf-8")) return name;
    }
  }
  return {};
}

bool IsAscii(std::string_view text) {
  return std::none_of(text.begin(), text.end(), [](char c) { return static_cast<signed char>(c) < 0; });
}

// The last character may be cut.
bool IsUtf8(std::string_view text) {
  const auto size = static_cast<int32_t>(text.size());
  for (int32_t at = 0; at < size;) {
    UChar32 c = 0;
    U8_NEXT(reinterpret_cast<const uint8_t*>(text.data()), at, size, c);
    if (c < 0 && size - at >= U8_MAX_LENGTH) return false;
  }
  return true;
}

std::string Detected(std::string_view head) {
  const uchardet_t detector = uchardet_new();
  uchardet_handle_data(detector, head.data(), head.size());
  uchardet_data_end(detector);
  std::string name = uchardet_get_charset(detector);
  uchardet_delete(detector);
  return name;
}

}  // namespace

std::string GuessEncoding(std::string_view head) {
  head = head.substr(0, kPiece);
  UErrorCode status = U_ZERO_ERROR;
  const char* const mark =
      ucnv_detectUnicodeSignature(head.data(), static_cast<int32_t>(head.size()), nullptr, &status);
  if (mark != nullptr) return mark;
  const bool is_ascii = IsAscii(head);
  if (!is_ascii && IsUtf8(head)) return "utf-8";  // whatever is declared somewhere
  std::string declared = Declared(head, is_ascii);
  if (!declared.empty()) return declared;
  return is_ascii ? "utf-8" : Detected(head);
}

Decoder::Decoder(const std::string& encoding) {
  constexpr std::string_view kLikeAscii[] = {"utf-8", "windows-125", "iso-8859-", "koi8-", "gb18030", "euc-", "big5"};
  const std::string meant = Meant(encoding);
  is_like_ascii_ = std::any_of(std::begin(kLikeAscii), std::end(kLikeAscii),
                               [&](std::string_view like) { return meant.starts_with(like); });
  UErrorCode status = U_ZERO_ERROR;
  converter_ = encoding.empty() ? nullptr : ucnv_open(meant.c_str(), &status);
  if (converter_ != nullptr) return;
  status = U_ZERO_ERROR;
  converter_ = ucnv_open("windows-1252", &status);
  if (converter_ == nullptr) throw std::bad_alloc();
}

// Whether the last piece ended inside a character.
bool Decoder::IsInside() const {
  UErrorCode status = U_ZERO_ERROR;
  return ucnv_toUCountPending(converter_, &status) != 0 || U_FAILURE(status);
}

Decoder::~Decoder() {
  ucnv_close(converter_);
}

std::string Decoder::Decode(std::string_view piece) {
  // Most of what is read is: converting it would cost as much as parsing it.
  if (is_like_ascii_ && IsAscii(piece) && !IsInside()) {
    begun_ = begun_ || !piece.empty();
    return std::string(piece);
  }
  // No encoding has more units of UTF-16 for its bytes than this, with what is left of the piece before.
  std::vector<UChar> units(2 * piece.size() + 64);
  UChar* to = units.data();
  const char* from = piece.data();
  UErrorCode status = U_ZERO_ERROR;
  ucnv_toUnicode(converter_, &to, units.data() + units.size(), &from, from + piece.size(), nullptr,
                 static_cast<UBool>(piece.empty()), &status);
  const UChar* const start = units.data() + (!begun_ && to != units.data() && units[0] == 0xfeff ? 1 : 0);
  begun_ = begun_ || to != units.data();
  std::string text;
  icu::UnicodeString(false, start, static_cast<int32_t>(to - start)).toUTF8String(text);
  return text;
}

void AddPlainText(const Pieces& pieces, const std::string& encoding, Findings& findings) {
  std::string_view piece = pieces();
  Decoder decoder(encoding.empty() ? GuessEncoding(piece) : encoding);
  while (!piece.empty() && findings.AddText(decoder.Decode(piece))) piece = pieces();
}

}  // namespace platform::extract
