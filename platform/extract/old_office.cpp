// Word, Excel and PowerPoint before 2007: the programs of catdoc make text of them.
#include <algorithm>
#include <array>
#include <span>
#include <string>

#include "extract/decoder.h"
#include "extract/documents.h"
#include "extract/filter.h"
#include "extract/ole_file.h"

namespace platform::extract {
namespace {

// All options are given: what /etc/catdocrc sets may be out of reach. Bytes are in Word's own code page.
constexpr auto kCatdoc = std::to_array<const char*>({"/usr/bin/catdoc", "-w", "-s", "cp1252", "-d", "utf-8"});
constexpr auto kXls2csv =
    std::to_array<const char*>({"/usr/bin/xls2csv", "-q0", "-c\t", "-s", "cp1252", "-d", "utf-8", kInputName});
constexpr auto kCatppt = std::to_array<const char*>({"/usr/bin/catppt", "-s", "cp1252", "-d", "utf-8", kInputName});

// By the stream that an OLE file has.
struct Reader {
  const char* stream;
  Input input;
  std::span<const char* const> command;
};
constexpr auto kReaders = std::to_array<Reader>({
    {"WordDocument", Input::kFile, kCatdoc},
    {"Workbook", Input::kCopy, kXls2csv},
    {"Book", Input::kCopy, kXls2csv},
    {"PowerPoint Document", Input::kCopy, kCatppt},
});

// The properties of "\5SummaryInformation" by their numbers.
struct Property {
  uint64_t number;
  const char* field;
};
constexpr auto kProperties = std::to_array<Property>({
    {2, "VEXOMDTitle"},
    {3, "VEXOMDDescription"},
    {4, "VEXOMDAuthors"},
    {5, "VEXOMDKeywords"},
    {6, "VEXOMDComment"},
    {12, "VEXOMDContentCreationDate"},
    {18, "VEXOMDCreator"},
});
constexpr uint64_t kCodePage = 1;
constexpr uint64_t kUtf8Page = 65001, kUtf16Page = 1200;
constexpr size_t kLongestSummary = 1 << 20;

enum Type : uint64_t { kByteText = 30, kWideText = 31, kFileTime = 64 };

// From 1601 in tenths of microseconds.
constexpr uint64_t kTicks = 10'000'000;
constexpr int64_t kEpoch = 11'644'473'600;

std::string EncodingOf(uint64_t page) {
  if (page == kUtf8Page) return "utf-8";
  return page == kUtf16Page ? "utf-16le" : "windows-" + std::to_string(page);
}

// A text ends at its first zero.
std::string TextAt(std::string_view section, uint64_t at, uint64_t size, const std::string& encoding) {
  if (at > section.size() || size > section.size() - at) return {};
  Decoder decoder(encoding);
  std::string text = decoder.Decode(section.substr(at, size));
  return text.substr(0, text.find('\0'));
}

void SetProperty(const char* field, std::string_view section, uint64_t at, uint64_t page, Findings& findings) {
  const uint64_t type = LittleEndian(section, at, 4);
  if (type == kFileTime) {
    const uint64_t time = LittleEndian(section, at + 4, 8);
    if (time != 0) findings.Set(field, static_cast<int64_t>(time / kTicks) - kEpoch);
  } else if (type == kByteText) {
    findings.Set(field, TextAt(section, at + 8, LittleEndian(section, at + 4, 4), EncodingOf(page)));
  } else if (type == kWideText) {
    findings.Set(field, TextAt(section, at + 8, 2 * LittleEndian(section, at + 4, 4), EncodingOf(kUtf16Page)));
  }
}

void SetProperties(std::string_view summary, Findings& findings) {
  if (summary.empty()) return;
  const std::string_view section = summary.substr(std::min<size_t>(LittleEndian(summary, 44, 4), summary.size()));
  const uint64_t count = LittleEndian(section, 4, 4);
  uint64_t page = 1252;
  for (uint64_t at = 8; at < 8 + 8 * count && at + 8 <= section.size(); at += 8) {
    const uint64_t number = LittleEndian(section, at, 4);
    const uint64_t place = LittleEndian(section, at + 4, 4);
    if (number == kCodePage) page = LittleEndian(section, place + 4, 2);
    for (const Property& property : kProperties) {
      if (property.number == number) SetProperty(property.field, section, place, page, findings);
    }
  }
}

// Word has a flag for it, Excel a record after the first one.
bool IsEncrypted(const OleFile& file) {
  if (file.Has("EncryptedPackage") || file.Has("EncryptedSummary")) return true;
  const std::string word = file.Read("WordDocument", 12);
  if (!word.empty() && (LittleEndian(word, 10, 2) & 0x100U) != 0) return true;
  constexpr uint64_t kFilePass = 0x2f;
  const std::string book = file.Read("Workbook", kPiece);
  return !book.empty() && LittleEndian(book, 4 + LittleEndian(book, 2, 2), 2) == kFilePass;
}

}  // namespace

void ExtractOldOffice(const Source& source, Findings& findings) {
  const Mapping mapping(source);
  const OleFile file(mapping.bytes());
  try {
    SetProperties(file.Read("\5SummaryInformation", kLongestSummary), findings);
  } catch (const std::runtime_error&) {  // the text may be whole
  }
  if (IsEncrypted(file)) return findings.Set("VEXOMDIsEncrypted", true);
  for (const Reader& reader : kReaders) {
    if (!file.Has(reader.stream)) continue;
    Filter filter(source, reader.input, reader.command);
    AddPlainText([&filter] { return filter.Piece(); }, "utf-8", findings);
    return;
  }
}

}  // namespace platform::extract
