#include "vexo/unicode.h"

#include <cstdint>
#include <cstring>
#include <limits>

#include <unicode/stringoptions.h>
#include <unicode/unistr.h>
#include <unicode/ustring.h>
#include <unicode/utf8.h>

#include "linux/utf8.h"

namespace platform {

namespace {

bool IsUtf8Run(std::string_view run) {
  UErrorCode status = U_ZERO_ERROR;
  int32_t length = 0;
  // Only counts; that there is no room for the result is then no failure.
  u_strFromUTF8(nullptr, 0, &length, run.data(), static_cast<int32_t>(run.size()), &status);
  return status == U_BUFFER_OVERFLOW_ERROR || U_SUCCESS(status);
}

// From there on to the first byte that is no ASCII.
size_t SkipAscii(std::string_view text, size_t at) {
  constexpr uint64_t kHighBits = 0x8080808080808080;
  for (uint64_t block; at + sizeof(block) <= text.size(); at += sizeof(block)) {
    memcpy(&block, text.data() + at, sizeof(block));
    if ((block & kHighBits) != 0) break;
  }
  while (at < text.size() && U8_IS_SINGLE(text[at])) ++at;
  return at;
}

}  // namespace

// Most texts are ASCII, and no character reaches from what is not into what is.
bool IsUtf8(std::string_view text) {
  if (text.size() > static_cast<size_t>(std::numeric_limits<int32_t>::max())) return false;
  for (size_t at = SkipAscii(text, 0); at < text.size();) {
    size_t end = at;
    while (end < text.size() && !U8_IS_SINGLE(text[end])) ++end;
    if (!IsUtf8Run(text.substr(at, end - at))) return false;
    at = SkipAscii(text, end);
  }
  return true;
}

}  // namespace platform

// Bytes that are no UTF-8 fold to one replacement character. Of texts that fold alike, those that are UTF-8 are equal
// and come first, and the others follow in the order of their bytes; any other rule would not be transitive.
int VLIBCUnicodeUTF8StrCaseCmp(const char* a, const char* b) {
  const icu::UnicodeString first = icu::UnicodeString::fromUTF8(a);
  const int folded = first.caseCompare(icu::UnicodeString::fromUTF8(b), U_FOLD_CASE_DEFAULT);
  if (folded != 0) return folded;
  const bool a_valid = platform::IsUtf8(a);
  const bool b_valid = platform::IsUtf8(b);
  if (a_valid || b_valid) return static_cast<int>(b_valid) - static_cast<int>(a_valid);
  return strcmp(a, b);
}
