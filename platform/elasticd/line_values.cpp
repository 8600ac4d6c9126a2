#include "line_values.h"

#include <array>
#include <charconv>
#include <chrono>
#include <cmath>
#include <ctime>
#include <limits>
#include <string>

#include "common/strings.h"

namespace quarrox::elasticd {
namespace {

constexpr double kInfinity = std::numeric_limits<double>::infinity();

// What one value stands for: from `begin` up to, but not including, `end`. What is greater than it begins at `after`.
struct Span {
  double begin;
  double end;
  double after;
};

constexpr bool IsDigit(char c) {
  return '0' <= c && c <= '9';
}

// Digits alone; nothing else and not too many.
std::optional<int> ParseDigits(std::string_view text) {
  constexpr size_t kMost = 6;
  int number = 0;
  if (text.empty() || text.size() > kMost || !IsDigit(text.front())) return std::nullopt;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return number;
}

std::optional<Span> ParseSize(std::string_view text) {
  double number = 0;
  if (text.empty() || !IsDigit(text.front())) return std::nullopt;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number, std::chars_format::fixed);
  if (error != std::errc() || !std::isfinite(number)) return std::nullopt;
  const std::string_view digits = text.substr(0, static_cast<size_t>(end - text.data()));
  std::string unit = ToLower(std::string(text.substr(digits.size())));
  if (unit.ends_with("ib")) unit.resize(unit.size() - 2);
  if (unit.size() == 2 && unit.back() == 'b') unit.pop_back();
  constexpr std::string_view kUnits = "bkmgt";  // each 1024 of the one before it
  if (unit.size() > 1 || kUnits.find(unit) == std::string_view::npos) return std::nullopt;
  const double scale = unit.empty() ? 1 : std::pow(1024, kUnits.find(unit));
  const size_t dot = digits.find('.');
  const double places = dot == std::string_view::npos ? 0 : static_cast<double>(digits.size() - dot - 1);
  const double begin = std::ceil(number * scale);
  return Span{begin, std::max(begin + 1, std::ceil((number + std::pow(10, -places)) * scale)), begin + 1};
}

// Days and months may be out of their ranges, so that the calendar counts on.
double TimeOf(int year, int month, int day) {
  tm parts = {};
  parts.tm_year = year - 1900;
  parts.tm_mon = month - 1;
  parts.tm_mday = day;
  parts.tm_isdst = -1;
  return static_cast<double>(mktime(&parts));
}

// YYYY, YYYY-MM or YYYY-MM-DD.
std::optional<Span> ParseCalendar(std::string_view text) {
  std::array<int, 3> parts = {0, 1, 1};
  size_t count = 0;
  for (size_t begin = 0; begin <= text.size(); ++count) {
    const size_t end = std::min(text.find('-', begin), text.size());
    const std::optional<int> part = ParseDigits(text.substr(begin, end - begin));
    if (count == parts.size() || !part) return std::nullopt;
    parts[count] = *part;
    begin = end + 1;
  }
  const auto [year, month, day] = parts;
  const std::chrono::year_month_day date{std::chrono::year(year), std::chrono::month(static_cast<unsigned int>(month)),
                                         std::chrono::day(static_cast<unsigned int>(day))};
  if (year < 1000 || year > 9999 || month > 12 || day > 31 || !date.ok()) return std::nullopt;
  const double end = TimeOf(year + (count == 1 ? 1 : 0), month + (count == 2 ? 1 : 0), day + (count == 3 ? 1 : 0));
  return Span{TimeOf(year, month, day), end, end};
}

// 7d: everything from then on.
std::optional<Span> ParseAge(std::string_view text, const tm& today, int64_t now) {
  if (text.size() < 2) return std::nullopt;
  const std::optional<int> count = ParseDigits(text.substr(0, text.size() - 1));
  if (!count) return std::nullopt;
  tm parts = today;
  parts.tm_isdst = -1;
  switch (text.back()) {
    case 'h':
      return Span{static_cast<double>(now) - 3600.0 * *count, kInfinity,
                  static_cast<double>(now) - 3600.0 * *count + 1};
    case 'd':
      parts.tm_mday -= *count;
      break;
    case 'w':
      parts.tm_mday -= 7 * *count;
      break;
    case 'm':
      parts.tm_mon -= *count;
      break;
    case 'y':
      parts.tm_year -= *count;
      break;
    default:
      return std::nullopt;
  }
  const auto begin = static_cast<double>(mktime(&parts));
  return Span{begin, kInfinity, begin + 1};
}

std::optional<Span> ParseDate(std::string_view text, int64_t now) {
  const time_t time = now;
  tm today = {};
  if (localtime_r(&time, &today) == nullptr) return std::nullopt;
  const std::string word = ToLower(std::string(text));
  if (word == "today" || word == "yesterday") {
    const int day = today.tm_mday - (word == "today" ? 0 : 1);
    const double end = TimeOf(today.tm_year + 1900, today.tm_mon + 1, day + 1);
    return Span{TimeOf(today.tm_year + 1900, today.tm_mon + 1, day), end, end};
  }
  if (const std::optional<Span> date = ParseCalendar(word)) return date;
  return ParseAge(word, today, now);
}

// VALUE, <VALUE, <=VALUE, >VALUE, >=VALUE, =VALUE, FROM..TO, FROM.. or ..TO.
template <typename Parse>
std::optional<NumberBounds> ParseBounds(std::string_view text, Parse parse) {
  const size_t dots = text.find("..");
  if (dots != std::string_view::npos) {
    const std::string_view from = text.substr(0, dots);
    const std::string_view to = text.substr(dots + 2);
    const std::optional<Span> first = from.empty() ? Span{-kInfinity, 0, 0} : parse(from);
    const std::optional<Span> last = to.empty() ? Span{0, 0, kInfinity} : parse(to);
    if (!first || !last || (from.empty() && to.empty())) return std::nullopt;
    return NumberBounds{first->begin, last->after - 1};
  }
  const size_t length = std::min(text.find_first_not_of("<>="), text.size());
  const std::string_view compared = text.substr(0, length);
  const std::optional<Span> value = parse(text.substr(length));
  if (!value) return std::nullopt;
  if (compared.empty() || compared == "=") return NumberBounds{value->begin, value->end - 1};
  if (compared == "<") return NumberBounds{-kInfinity, value->begin - 1};
  if (compared == "<=") return NumberBounds{-kInfinity, value->after - 1};
  if (compared == ">") return NumberBounds{value->after, kInfinity};
  if (compared == ">=") return NumberBounds{value->begin, kInfinity};
  return std::nullopt;
}

}  // namespace

std::optional<NumberBounds> ParseSizes(std::string_view text) {
  return ParseBounds(text, ParseSize);
}

std::optional<NumberBounds> ParseDates(std::string_view text, int64_t now) {
  return ParseBounds(text, [now](std::string_view date) { return ParseDate(date, now); });
}

}  // namespace quarrox::elasticd
