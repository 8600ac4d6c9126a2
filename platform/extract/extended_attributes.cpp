#include "extract/extended_attributes.h"

#include <sys/xattr.h>

#include <algorithm>
#include <charconv>
#include <cstdlib>
#include <string>
#include <string_view>
#include <system_error>

#include "extract/media_values.h"

namespace platform::extract {
namespace {

// Empty where there is none, or it is longer than any field may be.
std::string Attribute(const Source& source, const char* name) {
  std::string value(kLongestField, '\0');
  const ssize_t size = fgetxattr(source.fd, name, value.data(), value.size());
  value.resize(size < 0 ? 0 : static_cast<size_t>(size));
  return value;
}

void AddTags(std::string_view tags, Findings& findings) {
  while (!tags.empty()) {
    const std::string_view tag = tags.substr(0, tags.find(','));
    findings.Add("_VEXOMDUserTags", tag);
    tags.remove_prefix(std::min(tags.size(), tag.size() + 1));
  }
}

// The colour, 1 to 7, is three bits of the Finder's flags.
void SetLabel(std::string_view finder_info, Findings& findings) {
  constexpr size_t kFlags = 8;
  constexpr unsigned int kColour = 0x0e;
  if (finder_info.size() < kFlags + 2) return;
  const auto label = static_cast<int>((BigEndian(finder_info.substr(kFlags, 2)) & kColour) >> 1);
  if (label > 0) findings.Set("VEXOMDFinderLabel", label);
}

// The entry of an AppleDouble header with a certain number.
std::string_view AppleDoubleEntry(std::string_view header, uint64_t wanted) {
  constexpr size_t kMagic = 0x00051607;
  constexpr size_t kEntries = 26;
  constexpr size_t kEntry = 12;
  if (header.size() < kEntries || BigEndian(header.substr(0, 4)) != kMagic) return {};
  for (std::string_view entries = header.substr(kEntries); entries.size() >= kEntry; entries.remove_prefix(kEntry)) {
    const uint64_t offset = BigEndian(entries.substr(4, 4));
    if (BigEndian(entries.substr(0, 4)) != wanted || offset > header.size()) continue;
    return header.substr(offset, BigEndian(entries.substr(8, 4)));
  }
  return {};
}

void SetFinderLabel(const Source& source, Findings& findings) {
  constexpr uint64_t kFinderInfo = 9;
  constexpr size_t kStreamHeader = 16;
  SetLabel(Attribute(source, "user.com.apple.FinderInfo"), findings);
  SetLabel(AppleDoubleEntry(Attribute(source, "user.org.netatalk.Metadata"), kFinderInfo), findings);
  const std::string stream = Attribute(source, "user.DosStream.AFP_AfpInfo:$DATA");
  if (stream.starts_with("AFP"))
    SetLabel(std::string_view(stream).substr(std::min(stream.size(), kStreamHeader)), findings);
}

// Seconds since the epoch, or a date as people write it.
void SetTime(const char* field, const std::string& text, Findings& findings) {
  int64_t seconds = 0;
  const char* const end = text.data() + text.size();
  if (const auto read = std::from_chars(text.data(), end, seconds); read.ec == std::errc() && read.ptr == end) {
    findings.Set(field, seconds);
  } else {
    SetDate(field, text, findings);
  }
}

// Fields that nothing on a Linux machine has a place for. Whoever brings files from elsewhere can note them so.
struct Noted {
  const char* attribute;
  Setter set;
};
constexpr Noted kNoted[] = {{"user.VEXOMDDateAdded", SetTime},
                            {"user.VEXOMDFinderOpenDate", SetTime},
                            {"user.VEXOMDGroupId", SetText},
                            {"user.VEXOMDSpotlightBoost", SetText}};

}  // namespace

void ReadExtendedAttributes(const Source& source, Findings& findings) {
  // Most files have none at all.
  if (flistxattr(source.fd, nullptr, 0) <= 0) return;
  AddTags(Attribute(source, "user.xdg.tags"), findings);
  findings.Set("VEXOMDComment", Attribute(source, "user.xdg.comment"));
  SetStars(strtod(Attribute(source, "user.baloo.rating").c_str(), nullptr) / 2, findings);  // half stars
  SetFinderLabel(source, findings);
  constexpr size_t kPrefix = sizeof("user.") - 1;
  for (const Noted& noted : kNoted) noted.set(noted.attribute + kPrefix, Attribute(source, noted.attribute), findings);
}

}  // namespace platform::extract
