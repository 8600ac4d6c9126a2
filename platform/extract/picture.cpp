// The one source that knows Exiv2.
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include <exiv2/exiv2.hpp>
#include <unicode/unistr.h>

#include "extract/media.h"
#include "extract/media_values.h"

namespace platform::extract {
namespace {

// Values that one picture may have: who writes more has nothing to say.
constexpr size_t kMostValues = 1000;

struct Key {
  const char* key;  // Exiv2's
  const char* field;
  void (*set)(const char* field, const Exiv2::Value& value, Findings& findings);
};

// The default language's text, or the first of any.
std::string TextOf(const Exiv2::Value& value) {
  const auto* const languages = dynamic_cast<const Exiv2::LangAltValue*>(&value);
  if (languages == nullptr) return AsUtf8(value.toString());
  const auto found = languages->value_.find("x-default");
  if (found != languages->value_.end()) return found->second;
  return languages->value_.empty() ? "" : languages->value_.begin()->second;
}

void SetFirst(const char* field, const Exiv2::Value& value, Findings& findings) {
  findings.Set(field, TextOf(value));
}

void AddTexts(const char* field, const Exiv2::Value& value, Findings& findings) {
  const auto* const list = dynamic_cast<const Exiv2::XmpArrayValue*>(&value);
  if (list == nullptr) return findings.Add(field, TextOf(value));
  const auto count = std::min(static_cast<size_t>(list->count()), kMostValues);
  for (size_t i = 0; i < count; ++i) findings.Add(field, list->toString(static_cast<long>(i)));
}

std::string FromUtf16(std::string_view bytes, Exiv2::ByteOrder order) {
  bytes = bytes.substr(0, kLongestField);
  const size_t high = order == Exiv2::bigEndian ? 0 : 1;
  icu::UnicodeString wide;
  for (; bytes.size() >= 2; bytes.remove_prefix(2)) {
    const auto first = static_cast<unsigned char>(bytes[high]);
    wide.append(static_cast<char16_t>(first << 8 | static_cast<unsigned char>(bytes[1 - high])));
  }
  std::string text;
  return wide.toUTF8String(text);
}

// What Windows adds: UTF-16 as bytes.
void AddWideText(const char* field, const Exiv2::Value& value, Findings& findings) {
  std::string bytes(static_cast<size_t>(value.size()), '\0');
  value.copy(reinterpret_cast<Exiv2::byte*>(bytes.data()), Exiv2::littleEndian);
  findings.Add(field, FromUtf16(bytes, Exiv2::littleEndian));
}

// Not by Exiv2's own conversion, for which the C library loads its tables.
void AddUserComment(const char* field, const Exiv2::Value& value, Findings& findings) {
  constexpr size_t kCharset = 8;
  const auto* const comment = dynamic_cast<const Exiv2::CommentValue*>(&value);
  if (comment == nullptr || comment->value_.size() <= kCharset) return;
  const std::string_view text = std::string_view(comment->value_).substr(kCharset);
  const bool is_wide = comment->charsetId() == Exiv2::CommentValue::unicode;
  findings.Add(field, is_wide ? FromUtf16(text, comment->byteOrder_) : AsUtf8(text));
}

void SetDateText(const char* field, const Exiv2::Value& value, Findings& findings) {
  SetDate(field, value.toString(), findings);
}

void SetNumber(const char* field, const Exiv2::Value& value, Findings& findings) {
  SetLeadingNumber(field, value.toString(), findings);
}

void SetRating(const char* /*field*/, const Exiv2::Value& value, Findings& findings) {
  if (value.count() > 0) SetStars(value.toFloat(), findings);
}

// 0 where there is no such number.
double Number(const Exiv2::Value& value) {
  const Exiv2::Rational number = value.count() > 0 ? value.toRational() : Exiv2::Rational(0, 1);
  return number.second == 0 ? 0 : static_cast<double>(number.first) / number.second;
}

// As cameras show it: "1/125", "0.4", "30".
void SetSeconds(const char* field, double seconds, Findings& findings) {
  constexpr double kLongest = 1e6;
  if (!(seconds > 1 / kLongest && seconds < kLongest)) return;
  const double part = 1 / seconds;
  const bool is_part = part > 4 || (part > 1.5 && std::fabs(part - std::round(part)) < 0.02);
  char text[32];
  if (is_part) {
    snprintf(text, sizeof(text), "1/%.0f", part);
  } else {
    snprintf(text, sizeof(text), "%g", std::round(seconds * 10) / 10);
  }
  findings.Set(field, text);
}

// As cameras show it: "f/2.8", "f/11".
void SetFNumber(const char* field, double number, Findings& findings) {
  if (!(number > 0.1 && number < 1000)) return;
  char text[32];
  snprintf(text, sizeof(text), "f/%g", std::round(number * 10) / 10);
  findings.Set(field, text);
}

void SetExposureTime(const char* field, const Exiv2::Value& value, Findings& findings) {
  SetSeconds(field, Number(value), findings);
}

void SetAperture(const char* field, const Exiv2::Value& value, Findings& findings) {
  SetFNumber(field, Number(value), findings);
}

// APEX: logarithms, where 0 is a second and f/1.
void SetShutterSpeed(const char* field, const Exiv2::Value& value, Findings& findings) {
  if (value.count() > 0) SetSeconds(field, std::exp2(-Number(value)), findings);
}

void SetApertureValue(const char* field, const Exiv2::Value& value, Findings& findings) {
  if (value.count() > 0) SetFNumber(field, std::exp2(Number(value) / 2), findings);
}

// The first of several that belong to one field wins, or they are added.
constexpr Key kKeys[] = {
    {"Exif.Image.Make", "VEXOMDAcquisitionMake", SetFirst},
    {"Xmp.tiff.Make", "VEXOMDAcquisitionMake", SetFirst},
    {"Exif.Image.Model", "VEXOMDAcquisitionModel", SetFirst},
    {"Exif.Image.UniqueCameraModel", "VEXOMDAcquisitionModel", SetFirst},
    {"Xmp.tiff.Model", "VEXOMDAcquisitionModel", SetFirst},
    {"Exif.Photo.ExposureTime", "VEXOMDExposureTimeString", SetExposureTime},
    {"Exif.Image.ExposureTime", "VEXOMDExposureTimeString", SetExposureTime},
    {"Xmp.exif.ExposureTime", "VEXOMDExposureTimeString", SetExposureTime},
    {"Exif.Photo.ShutterSpeedValue", "VEXOMDExposureTimeString", SetShutterSpeed},
    {"Exif.Photo.FNumber", "VEXOMDAperture", SetAperture},
    {"Exif.Image.FNumber", "VEXOMDAperture", SetAperture},
    {"Xmp.exif.FNumber", "VEXOMDAperture", SetAperture},
    {"Exif.Photo.ApertureValue", "VEXOMDAperture", SetApertureValue},
    {"Exif.Photo.ISOSpeedRatings", "VEXOMDISOSpeed", SetNumber},
    {"Exif.Image.ISOSpeedRatings", "VEXOMDISOSpeed", SetNumber},
    {"Exif.Photo.RecommendedExposureIndex", "VEXOMDISOSpeed", SetNumber},
    {"Xmp.exif.ISOSpeedRatings", "VEXOMDISOSpeed", SetNumber},
    {"Xmp.exif.DateTimeOriginal", "VEXOMDContentCreationDate", SetDateText},
    {"Xmp.photoshop.DateCreated", "VEXOMDContentCreationDate", SetDateText},
    {"Xmp.xmp.CreateDate", "VEXOMDContentCreationDate", SetDateText},
    {"Iptc.Application2.DateCreated", "VEXOMDContentCreationDate", SetDateText},
    {"Xmp.dc.title", "VEXOMDTitle", SetFirst},
    {"Exif.Image.XPTitle", "VEXOMDTitle", AddWideText},
    {"Iptc.Application2.ObjectName", "VEXOMDTitle", SetFirst},
    {"Iptc.Application2.Headline", "VEXOMDTitle", SetFirst},
    {"Xmp.dc.creator", "VEXOMDAuthors", AddTexts},
    {"Exif.Image.Artist", "VEXOMDAuthors", AddTexts},
    {"Exif.Image.XPAuthor", "VEXOMDAuthors", AddWideText},
    {"Iptc.Application2.Byline", "VEXOMDAuthors", AddTexts},
    {"Xmp.dc.description", "VEXOMDDescription", AddTexts},
    {"Exif.Image.ImageDescription", "VEXOMDDescription", AddTexts},
    {"Exif.Image.XPSubject", "VEXOMDDescription", AddWideText},
    {"Iptc.Application2.Caption", "VEXOMDDescription", AddTexts},
    {"Exif.Photo.UserComment", "VEXOMDComment", AddUserComment},
    {"Exif.Image.XPComment", "VEXOMDComment", AddWideText},
    {"Xmp.exif.UserComment", "VEXOMDComment", AddTexts},
    {"Xmp.dc.subject", "VEXOMDKeywords", AddTexts},
    {"Iptc.Application2.Keywords", "VEXOMDKeywords", AddTexts},
    {"Exif.Image.XPKeywords", "VEXOMDKeywords", AddWideText},
    {"Xmp.xmp.Rating", "VEXOMDStarRating", SetRating},
    {"Exif.Image.Rating", "VEXOMDStarRating", SetRating},
    {"Xmp.xmp.CreatorTool", "VEXOMDCreator", AddTexts},
    {"Exif.Image.Software", "VEXOMDCreator", AddTexts},
    {"Iptc.Application2.Program", "VEXOMDCreator", AddTexts},
    {"Exif.Photo.ImageUniqueID", "VEXOMDIdentifier", SetFirst},
    {"Xmp.dc.identifier", "VEXOMDIdentifier", SetFirst},
    {"Exif.Image.DateTime", "VEXOMDContentCreationDate", SetDateText},
};

// Values with the number of their key, so that each list is gone through once.
using Hits = std::vector<std::pair<size_t, const Exiv2::Value*>>;

template <typename List>
void Collect(const List& list, Hits& hits) {
  static const auto numbers = [] {
    std::unordered_map<std::string_view, size_t> result;
    for (size_t i = 0; i < std::size(kKeys); ++i) result.emplace(kKeys[i].key, i);
    return result;
  }();
  for (const auto& datum : list) {
    if (hits.size() == kMostValues) return;
    const auto found = numbers.find(datum.key());
    if (found != numbers.end()) hits.emplace_back(found->second, &datum.value());
  }
}

const Exiv2::Value* Find(const Exiv2::ExifData& exif, const char* key) {
  const auto found = exif.findKey(Exiv2::ExifKey(key));
  return found == exif.end() ? nullptr : &found->value();
}

// A camera's clock knows no zone, unless it writes that, too.
void SetDateTaken(const Exiv2::ExifData& exif, Findings& findings) {
  constexpr std::pair<const char*, const char*> kDates[] = {
      {"Exif.Photo.DateTimeOriginal", "Exif.Photo.OffsetTimeOriginal"},
      {"Exif.Photo.DateTimeDigitized", "Exif.Photo.OffsetTimeDigitized"},
  };
  for (const auto& [date_key, offset_key] : kDates) {
    const Exiv2::Value* const date = Find(exif, date_key);
    if (date == nullptr) continue;
    const Exiv2::Value* const offset = Find(exif, offset_key);
    SetDate("VEXOMDContentCreationDate", date->toString() + (offset == nullptr ? "" : offset->toString()), findings);
  }
}

void SetResolution(const Exiv2::ExifData& exif, Findings& findings) {
  constexpr int kNone = 1;
  constexpr int kCentimetre = 3;
  constexpr double kCentimetresInInch = 2.54;
  const Exiv2::Value* const unit = Find(exif, "Exif.Image.ResolutionUnit");
  const long number = unit == nullptr || unit->count() == 0 ? 0 : unit->toLong();
  if (number == kNone) return;
  const double factor = number == kCentimetre ? kCentimetresInInch : 1;
  const Exiv2::Value* const x = Find(exif, "Exif.Image.XResolution");
  const Exiv2::Value* const y = Find(exif, "Exif.Image.YResolution");
  if (x != nullptr) SetDpi("VEXOMDResolutionWidthDPI", Number(*x) * factor, findings);
  if (y != nullptr) SetDpi("VEXOMDResolutionHeightDPI", Number(*y) * factor, findings);
}

// Once, before the first picture.
void Prepare() {
  static const bool prepared = [] {
    Exiv2::LogMsg::setLevel(Exiv2::LogMsg::mute);
    Exiv2::enableBMFF(true);  // HEIF, AVIF, JPEG XL
    return Exiv2::XmpParser::initialize();
  }();
  (void)prepared;
}

}  // namespace

void ExtractPicture(const Source& source, Findings& findings) {
  Prepare();
  ReadPictureHeader(source, findings);
  const Mapping mapping(source);
  const std::string_view bytes = mapping.bytes();
  const auto image =
      Exiv2::ImageFactory::open(reinterpret_cast<const Exiv2::byte*>(bytes.data()), static_cast<long>(bytes.size()));
  image->readMetadata();
  const Exiv2::ExifData& exif = image->exifData();
  SetDateTaken(exif, findings);
  SetResolution(exif, findings);
  Hits hits;
  Collect(exif, hits);
  Collect(image->iptcData(), hits);
  Collect(image->xmpData(), hits);
  std::stable_sort(hits.begin(), hits.end(), [](const auto& a, const auto& b) { return a.first < b.first; });
  for (const auto& [number, value] : hits) kKeys[number].set(kKeys[number].field, *value, findings);
  if (source.type == "image/jpeg") findings.Add("VEXOMDComment", AsUtf8(image->comment()));
}

}  // namespace platform::extract
