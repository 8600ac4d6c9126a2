#include "linux/content_extract_text.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <string_view>
#include <system_error>

#include <unicode/utf8.h>

#include "linux/utf8.h"

namespace platform {
namespace {

constexpr std::string_view kByteOrderMark = "\xef\xbb\xbf";

// One byte past the longest text tells that there is more.
constexpr size_t kLongestRead = kByteOrderMark.size() + kLongestText + 1;

// Begins the multi-byte characters of seven-bit encodings, which else look like ASCII.
constexpr std::string_view kEscape = "\x1b$";

// Most files are shorter; what a file begins with tells whether it is text. In bytes.
constexpr size_t kFirstRead = size_t{64} << 10;

// Finds out that it was the end; in bytes.
constexpr size_t kLastRead = 4096;

// Formats that are text and are parsed: by their extensions, and by their first bytes.
constexpr std::string_view kParsedExtensions[] = {
    "htm",  "html", "xhtml", "xht", "shtml", "xml", "svg",  "rss", "atom",  "fodt", "fods",
    "fodp", "fodg", "opf",   "rdf", "rtf",   "eml", "mbox", "mht", "mhtml", "pdf",  "mobileconfig"};
constexpr std::string_view kParsedBeginnings[] = {"<",         "%PDF",         "{\\rtf",       "From ",
                                                  "Received:", "Return-Path:", "Delivered-To:"};

bool IsParsed(const std::string& extension) {
  return std::find(std::begin(kParsedExtensions), std::end(kParsedExtensions), extension) !=
         std::end(kParsedExtensions);
}

// Reads up to kLongestRead bytes; false at the first zero byte. `size` is how many there seem to be.
bool ReadWithoutZeros(int fd, size_t size, std::string* text) {
  size_t done = 0;
  for (size_t more = std::min(size + 1, kFirstRead); done < kLongestRead;) {
    const size_t wanted = std::min(more, kLongestRead - done);
    text->resize(done + wanted);
    const ssize_t n = read(fd, text->data() + done, wanted);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) throw std::system_error(errno, std::generic_category());
    text->resize(done + static_cast<size_t>(n));
    if (n == 0) return true;
    if (text->find('\0', done) != std::string::npos) return false;
    done = text->size();
    more = static_cast<size_t>(n) < wanted ? kLastRead : done;
  }
  return true;
}

void Cut(std::string* text) {
  if (text->size() <= kLongestText) return;
  size_t end = kLongestText;
  while (end > kLongestText - U8_MAX_LENGTH && U8_IS_TRAIL((*text)[end])) --end;
  text->resize(end);
}

}  // namespace

bool BeginsParsed(std::string_view text) {
  text.remove_prefix(std::min(text.find_first_not_of(" \t\r\n"), text.size()));
  return std::any_of(std::begin(kParsedBeginnings), std::end(kParsedBeginnings),
                     [&](std::string_view beginning) { return text.starts_with(beginning); });
}

std::optional<std::string> ReadPlainText(int fd, size_t size, const std::string& extension) {
  std::string text;
  if (IsParsed(extension) || !ReadWithoutZeros(fd, size, &text)) return std::nullopt;
  if (text.compare(0, kByteOrderMark.size(), kByteOrderMark) == 0) text.erase(0, kByteOrderMark.size());
  Cut(&text);
  const bool is_escaped = text.find(kEscape) != std::string::npos;
  if (is_escaped || BeginsParsed(text) || !IsUtf8(text)) return std::nullopt;
  return text;
}

}  // namespace platform
