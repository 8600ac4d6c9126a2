#include "extract/file_type.h"

#include <unistd.h>

#include <algorithm>
#include <stdexcept>
#include <string_view>

#include "linux/content_extract_text.h"

namespace platform::extract {
namespace {

// How much of a file is looked at; in bytes.
constexpr size_t kLooked = size_t{256} << 10;

// So much of a text has control characters where it is none; in bytes.
constexpr size_t kLookedPlain = size_t{4} << 10;

constexpr const char* kUnknown = "application/octet-stream";

// Checks that cost time and tell nothing that is read in a way of its own.
constexpr int kFlags = MAGIC_MIME_TYPE | MAGIC_NO_CHECK_COMPRESS | MAGIC_NO_CHECK_ELF | MAGIC_NO_CHECK_TOKENS |
                       MAGIC_NO_CHECK_CSV | MAGIC_NO_CHECK_JSON;

// What the first bytes say of a container that was written in another order than the usual one, of a stream without a
// head, of a document whose kind stands far behind.
constexpr std::string_view kVague[] = {kUnknown,
                                       "application/zip",
                                       "application/java-archive",
                                       "application/x-ole-storage",
                                       "application/CDFV2",
                                       "application/vnd.ms-office"};

// Text with a structure that the first bytes tell.
constexpr std::string_view kClearTexts[] = {"text/html", "text/xml", "text/rtf"};

struct Guess {
  std::string_view extension;
  const char* type;
};

constexpr Guess kContainers[] = {
    {"docx", "application/vnd.openxmlformats-officedocument.wordprocessingml.document"},
    {"dotx", "application/vnd.openxmlformats-officedocument.wordprocessingml.template"},
    {"docm", "application/vnd.ms-word.document.macroEnabled.12"},
    {"xlsx", "application/vnd.openxmlformats-officedocument.spreadsheetml.sheet"},
    {"xltx", "application/vnd.openxmlformats-officedocument.spreadsheetml.template"},
    {"xlsm", "application/vnd.ms-excel.sheet.macroEnabled.12"},
    {"pptx", "application/vnd.openxmlformats-officedocument.presentationml.presentation"},
    {"ppsx", "application/vnd.openxmlformats-officedocument.presentationml.slideshow"},
    {"potx", "application/vnd.openxmlformats-officedocument.presentationml.template"},
    {"pptm", "application/vnd.ms-powerpoint.presentation.macroEnabled.12"},
    {"odt", "application/vnd.oasis.opendocument.text"},
    {"ott", "application/vnd.oasis.opendocument.text-template"},
    {"ods", "application/vnd.oasis.opendocument.spreadsheet"},
    {"ots", "application/vnd.oasis.opendocument.spreadsheet-template"},
    {"odp", "application/vnd.oasis.opendocument.presentation"},
    {"otp", "application/vnd.oasis.opendocument.presentation-template"},
    {"odg", "application/vnd.oasis.opendocument.graphics"},
    {"epub", "application/epub+zip"},
    {"doc", "application/msword"},
    {"dot", "application/msword"},
    {"xls", "application/vnd.ms-excel"},
    {"ppt", "application/vnd.ms-powerpoint"},
    {"pps", "application/vnd.ms-powerpoint"},
    {"pdf", "application/pdf"},
    {"mp3", "audio/mpeg"},
    {"flac", "audio/flac"},
    {"ogg", "audio/ogg"},
    {"aac", "audio/x-hx-aac-adts"},
    {"wma", "video/x-ms-asf"},
    {"mp4", "video/mp4"},
    {"m4v", "video/mp4"},
    {"mov", "video/quicktime"},
    {"mpg", "video/mpeg"},
    {"mpeg", "video/mpeg"},
    {"ts", "video/MP2T"},
    {"m2ts", "video/MP2T"},
    {"mts", "video/MP2T"},
    {"mkv", "video/x-matroska"},
};

constexpr Guess kTexts[] = {
    {"eml", "message/rfc822"}, {"mht", "message/rfc822"}, {"mhtml", "message/rfc822"}, {"mbox", "application/mbox"},
    {"htm", "text/html"},      {"html", "text/html"},     {"xhtml", "text/html"},      {"shtml", "text/html"},
    {"xml", "text/xml"},       {"svg", "text/xml"},       {"rss", "text/xml"},         {"atom", "text/xml"},
};

template <size_t kSize>
bool IsIn(const std::string_view (&list)[kSize], std::string_view text) {
  return std::find(std::begin(list), std::end(list), text) != std::end(list);
}

// Most files are: no control characters but for blanks and escapes. Other characters may be of any encoding.
bool IsPlain(const std::string& head) {
  return std::none_of(head.begin(), head.end(), [](char c) {
    return (c >= 0 && c < 0x20 && !(c >= '\b' && c <= '\r') && c != '\x1b') || c == 0x7f;
  });
}

template <size_t kSize>
std::string Better(const Guess (&guesses)[kSize], const std::string& extension, const std::string& type) {
  const auto guess = std::find_if(std::begin(guesses), std::end(guesses),
                                  [&](const Guess& other) { return other.extension == extension; });
  return guess == std::end(guesses) ? type : guess->type;
}

}  // namespace

FileTypes::FileTypes() : cookie_(magic_open(kFlags)) {
  if (cookie_ != nullptr && magic_load(cookie_, nullptr) == 0 &&
      magic_setparam(cookie_, MAGIC_PARAM_BYTES_MAX, &kLooked) == 0) {
    return;
  }
  if (cookie_ != nullptr) magic_close(cookie_);
  throw std::runtime_error("there is no table of file types");
}

// The table takes ten times as long as all else that plain text takes.
std::string FileTypes::Of(const Source& source) const {
  const std::string head = ReadHead(source, kLookedPlain);
  std::string as_text = Better(kTexts, source.extension, "text/plain");
  if (IsPlain(head) && (as_text != "text/plain" || !BeginsParsed(head))) return as_text;
  const char* const found = lseek(source.fd, 0, SEEK_SET) == 0 ? magic_descriptor(cookie_, source.fd) : nullptr;
  std::string type = found == nullptr ? kUnknown : found;
  if (IsIn(kVague, type)) return Better(kContainers, source.extension, type);
  if (type.starts_with("text/") && !IsIn(kClearTexts, type)) return Better(kTexts, source.extension, type);
  if (type.ends_with("+xml")) return "text/xml";
  return type;
}

}  // namespace platform::extract
