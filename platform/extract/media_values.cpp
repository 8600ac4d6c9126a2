#include "extract/media_values.h"

#include <cctype>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <limits>

#include "linux/utf8.h"

namespace platform::extract {
namespace {

constexpr int kMinute = 60;
constexpr int kHour = 60 * kMinute;

// Seconds east of Greenwich, by what follows a time: ".25+01:00", "+0100", "Z", nothing.
int ZoneOffset(const char* text) {
  if (*text == '.') ++text;
  while (isdigit(static_cast<unsigned char>(*text)) != 0) ++text;
  int hours = 0;
  int minutes = 0;
  if ((*text != '+' && *text != '-') || sscanf(text + 1, "%2d%*[:]%2d", &hours, &minutes) < 1) return 0;
  if (minutes == 0) sscanf(text + 1, "%*2d%2d", &minutes);
  return (*text == '-' ? -1 : 1) * (hours * kHour + minutes * kMinute);
}

bool IsIn(int value, int least, int most) {
  return value >= least && value <= most;
}

std::string Latin1AsUtf8(std::string_view text) {
  text = text.substr(0, kLongestField);
  std::string result;
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    if (byte < 0x80) {
      result += c;
    } else {
      result += static_cast<char>(0xc0 | (byte >> 6));
      result += static_cast<char>(0x80 | (byte & 0x3f));
    }
  }
  return result;
}

}  // namespace

std::optional<int64_t> ParseDate(const std::string& text) {
  const char* start = text.c_str();
  if (text.starts_with("UTC ")) start += 4;
  tm time = {};
  int length = 0;
  if (sscanf(start, "%4d%*1[-:/.]%2d%*1[-:/.]%2d%n", &time.tm_year, &time.tm_mon, &time.tm_mday, &length) != 3 ||
      !IsIn(time.tm_year, 1000, 9999) || !IsIn(time.tm_mon, 1, 12) || !IsIn(time.tm_mday, 1, 31)) {
    return std::nullopt;
  }
  start += length;
  int offset = 0;
  length = 0;
  if (sscanf(start, "%*1[ T]%2d:%2d:%2d%n", &time.tm_hour, &time.tm_min, &time.tm_sec, &length) == 3) {
    offset = ZoneOffset(start + length);
  }
  if (!IsIn(time.tm_hour, 0, 23) || !IsIn(time.tm_min, 0, 59) || !IsIn(time.tm_sec, 0, 60)) return std::nullopt;
  time.tm_year -= 1900;
  time.tm_mon -= 1;
  const int64_t seconds = timegm(&time);
  if (seconds == 0) return std::nullopt;
  return seconds - offset;
}

void SetText(const char* field, const std::string& text, Findings& findings) {
  findings.Set(field, text);
}

void AddText(const char* field, const std::string& text, Findings& findings) {
  findings.Add(field, text);
}

void AddContent(const char* /*field*/, const std::string& text, Findings& findings) {
  findings.AddText(text + "\n");
}

void SetDate(const char* field, const std::string& text, Findings& findings) {
  if (const std::optional<int64_t> seconds = ParseDate(text)) findings.Set(field, *seconds);
}

void SetLeadingNumber(const char* field, const std::string& text, Findings& findings) {
  const double number = strtod(text.c_str(), nullptr);
  if (number >= 1 && number <= std::numeric_limits<int32_t>::max()) findings.Set(field, int64_t{std::llround(number)});
}

void SetStars(double stars, Findings& findings) {
  if (stars >= 1 && stars <= 5) findings.Set("VEXOMDStarRating", std::to_string(std::lround(stars)));
}

void SetDpi(const char* field, double dpi, Findings& findings) {
  constexpr double kMost = 1e6;
  if (dpi >= 0.5 && dpi < kMost) findings.Set(field, int64_t{std::lround(dpi)});
}

uint64_t BigEndian(std::string_view bytes) {
  uint64_t number = 0;
  for (const char c : bytes) number = number << 8 | static_cast<unsigned char>(c);
  return number;
}

uint64_t LittleEndian(std::string_view bytes) {
  return BigEndian(std::string(bytes.rbegin(), bytes.rend()));
}

std::string AsUtf8(std::string_view text) {
  return IsUtf8(text) ? std::string(text) : Latin1AsUtf8(text);
}

}  // namespace platform::extract
