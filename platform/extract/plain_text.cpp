#include "extract/plain_text.h"

#include <algorithm>
#include <memory>
#include <string>
#include <string_view>

#include <uchardet/uchardet.h>
#include <unicode/ucnv.h>
#include <unicode/unistr.h>

#include "linux/utf8.h"

namespace platform::extract {
namespace {

// How much of a text tells its encoding; in bytes.
constexpr size_t kLooked = size_t{64} << 10;

// What Western text is in where nothing speaks against it.
constexpr const char* kUsual = "windows-1252";

// Begins the multi-byte characters of seven-bit encodings, which else look like ASCII.
constexpr std::string_view kEscape = "\x1b$";

constexpr std::string_view kTexts[] = {"application/json", "application/javascript", "application/xml",
                                       "application/x-ndjson", "application/x-wine-extension-ini"};

struct Mark {
  std::string_view bytes;
  const char* encoding;
};

// The longer ones first: one begins as another.
constexpr Mark kMarks[] = {{{"\xff\xfe\0\0", 4}, "UTF-32LE"},
                           {{"\0\0\xfe\xff", 4}, "UTF-32BE"},
                           {"\xef\xbb\xbf", "UTF-8"},
                           {"\xff\xfe", "UTF-16LE"},
                           {"\xfe\xff", "UTF-16BE"}};

bool IsText(const std::string& type) {
  return type.starts_with("text/") || std::find(std::begin(kTexts), std::end(kTexts), type) != std::end(kTexts);
}

// Where what is not plain ASCII begins: a byte with its high bit, or an escape, which changes what follows.
size_t FirstTelling(std::string_view text) {
  const auto* const found =
      std::find_if(text.begin(), text.end(), [](char c) { return static_cast<signed char>(c) < 0 || c == '\x1b'; });
  return static_cast<size_t>(found - text.begin());
}

// By the first bytes that tell something, from the beginning of their line.
std::string EncodingOf(std::string_view text) {
  const size_t telling = FirstTelling(text);
  const size_t before = text.substr(0, telling).rfind('\n');
  const bool is_near = before != std::string_view::npos && telling - before < kLooked / 2;
  const std::string_view looked = text.substr(is_near ? before : telling < kLooked / 2 ? 0 : telling, kLooked);
  const std::unique_ptr<uchardet, void (*)(uchardet_t)> detector(uchardet_new(), uchardet_delete);
  if (uchardet_handle_data(detector.get(), looked.data(), looked.size()) != 0) return kUsual;
  uchardet_data_end(detector.get());
  const std::string encoding = uchardet_get_charset(detector.get());
  if (encoding == "UHC") return "windows-949";  // the converters know it by the other name
  return encoding.empty() || encoding == "ASCII" ? kUsual : encoding;
}

// Up to four bytes at the end may be part of a character that was cut.
std::string_view WithoutCut(std::string_view text) {
  const size_t least = text.size() - std::min<size_t>(text.size(), 4);
  while (text.size() > least && static_cast<signed char>(text.back()) < 0) text.remove_suffix(1);
  return text;
}

std::string AsUtf8(std::string_view text, const std::string& encoding) {
  UErrorCode status = U_ZERO_ERROR;
  std::unique_ptr<UConverter, void (*)(UConverter*)> converter(ucnv_open(encoding.c_str(), &status), ucnv_close);
  if (U_FAILURE(status)) {
    status = U_ZERO_ERROR;
    converter.reset(ucnv_open(kUsual, &status));
  }
  const icu::UnicodeString decoded(text.data(), static_cast<int32_t>(text.size()), converter.get(), status);
  std::string utf8;
  if (U_SUCCESS(status)) decoded.toUTF8String(utf8);
  return utf8;
}

}  // namespace

void ReadText(const Source& source, Findings& findings) {
  std::string head = ReadHead(source, kLooked);
  const auto mark = std::find_if(std::begin(kMarks), std::end(kMarks),
                                 [&](const Mark& other) { return head.starts_with(other.bytes); });
  const bool is_marked = mark != std::end(kMarks);
  if (!is_marked && head.find('\0') != std::string::npos) return;
  if (head.size() == kLooked) head = ReadHead(source, kLongestText);
  const std::string_view text = head.size() < kLongestText || is_marked ? head : WithoutCut(head);
  if (is_marked) {
    findings.AddText(AsUtf8(text.substr(mark->bytes.size()), mark->encoding));
    return;
  }
  if (text.find('\0') != std::string_view::npos) return;
  const bool is_escaped = text.find(kEscape) != std::string_view::npos;
  if (!is_escaped && IsUtf8(text)) {
    findings.AddText(text);
  } else if (is_escaped || IsText(source.type)) {
    findings.AddText(AsUtf8(text, EncodingOf(text)));
  }
}

}  // namespace platform::extract
