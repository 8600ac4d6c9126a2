// What libraries for tags leave out: resolutions and texts in the headers of the formats themselves.
#include <strings.h>

#include <algorithm>
#include <string>
#include <string_view>

#include "extract/media.h"
#include "extract/media_values.h"

namespace platform::extract {
namespace {

constexpr size_t kHead = size_t{64} << 10;

constexpr double kInch = 0.0254;  // in metres

// Pixels for each unit, and how many units make an inch.
void SetResolution(uint64_t width, uint64_t height, double units, Findings& findings) {
  SetDpi("VEXOMDResolutionWidthDPI", static_cast<double>(width) * units, findings);
  SetDpi("VEXOMDResolutionHeightDPI", static_cast<double>(height) * units, findings);
}

// The segment that JFIF begins with: where it stands is fixed. Units of 0 are a ratio only.
void ReadJfif(std::string_view head, Findings& findings) {
  if (head.size() < 18 || head.substr(6, 5) != std::string_view("JFIF\0", 5)) return;
  const char unit = head[13];
  const double units = unit == 1 ? 1 : unit == 2 ? 100 * kInch : 0;
  SetResolution(BigEndian(head.substr(14, 2)), BigEndian(head.substr(16, 2)), units, findings);
}

void ReadBmp(std::string_view head, Findings& findings) {
  constexpr size_t kPlace = 38;  // pixels for a metre
  if (head.size() < kPlace + 8 || LittleEndian(head.substr(14, 4)) < 40) return;
  SetResolution(LittleEndian(head.substr(kPlace, 4)), LittleEndian(head.substr(kPlace + 4, 4)), kInch, findings);
}

struct Text {
  const char* keyword;
  const char* field;
};

constexpr Text kTexts[] = {
    {"Title", "VEXOMDTitle"},
    {"Author", "VEXOMDAuthors"},
    {"Description", "VEXOMDDescription"},
    {"Comment", "VEXOMDComment"},
    {"Software", "VEXOMDCreator"},
    {"Source", "VEXOMDAcquisitionModel"},  // "device used to create the image"
};

// Not all writers keep to the case of the words, nor to Latin-1.
void SetPngText(const std::string& keyword, std::string_view bytes, Findings& findings) {
  const std::string text = AsUtf8(bytes);
  if (strcasecmp(keyword.c_str(), "Creation Time") == 0) SetDate("VEXOMDContentCreationDate", text, findings);
  for (const Text& known : kTexts) {
    if (strcasecmp(keyword.c_str(), known.keyword) == 0) findings.Add(known.field, text);
  }
}

// What stands before the next zero byte, which goes too; all of it where there is none.
std::string_view TakeString(std::string_view& bytes) {
  const std::string_view string = bytes.substr(0, bytes.find('\0'));
  bytes.remove_prefix(std::min(bytes.size(), string.size() + 1));
  return string;
}

void ReadPngChunk(std::string_view type, std::string_view bytes, Findings& findings) {
  if (type == "pHYs" && bytes.size() >= 9 && bytes[8] == 1) {  // for a metre
    SetResolution(BigEndian(bytes.substr(0, 4)), BigEndian(bytes.substr(4, 4)), kInch, findings);
  } else if (type == "tEXt") {
    const std::string keyword(TakeString(bytes));
    SetPngText(keyword, bytes, findings);
  } else if (type == "iTXt") {
    const std::string keyword(TakeString(bytes));
    if (bytes.size() < 2 || bytes[0] != 0) return;  // it is compressed
    bytes.remove_prefix(2);
    TakeString(bytes);  // language
    TakeString(bytes);  // keyword in that language
    SetPngText(keyword, bytes, findings);
  }
}

void ReadPng(const Source& source, Findings& findings) {
  constexpr size_t kSignature = 8;
  constexpr size_t kLengthAndType = 8;
  constexpr size_t kChecksum = 4;
  constexpr int kMostChunks = 4096;
  uint64_t at = kSignature;
  for (int i = 0; i < kMostChunks; ++i) {
    char header[kLengthAndType];
    if (ReadAt(source, at, header, sizeof(header)) < sizeof(header)) return;
    const uint64_t length = BigEndian(std::string_view(header, 4));
    const std::string_view type(header + 4, 4);
    if (length <= kLongestField && (type == "pHYs" || type == "tEXt" || type == "iTXt")) {
      std::string bytes(length, '\0');
      bytes.resize(ReadAt(source, at + kLengthAndType, bytes.data(), bytes.size()));
      ReadPngChunk(type, bytes, findings);
    }
    at += kLengthAndType + length + kChecksum;
  }
}

// The blocks before the first picture, of which comments are one kind.
void ReadGif(std::string_view head, Findings& findings) {
  constexpr size_t kScreen = 13;
  constexpr char kExtension = '\x21';
  constexpr char kComment = '\xfe';
  if (head.size() < kScreen) return;
  const auto flags = static_cast<unsigned char>(head[10]);
  const size_t colours = (flags & 0x80) != 0 ? size_t{3} << ((flags & 7) + 1) : 0;
  head.remove_prefix(std::min(head.size(), kScreen + colours));
  while (head.size() > 2 && head[0] == kExtension) {
    const bool is_comment = head[1] == kComment;
    head.remove_prefix(2);
    std::string text;
    while (!head.empty() && head[0] != 0) {
      const auto size = static_cast<unsigned char>(head[0]);
      text += head.substr(1, size);
      head.remove_prefix(std::min<size_t>(head.size(), 1 + size));
    }
    head.remove_prefix(std::min<size_t>(head.size(), 1));
    if (is_comment) findings.Add("VEXOMDComment", AsUtf8(text));
  }
}

}  // namespace

void ReadPictureHeader(const Source& source, Findings& findings) {
  if (source.type == "image/png") return ReadPng(source, findings);
  const std::string head = ReadHead(source, kHead);
  if (head.starts_with("\xff\xd8")) return ReadJfif(head, findings);
  if (head.starts_with("BM")) return ReadBmp(head, findings);
  if (head.starts_with("GIF8")) return ReadGif(head, findings);
}

}  // namespace platform::extract
