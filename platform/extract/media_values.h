// Values as media formats write them.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "extract/findings.h"

namespace platform::extract {

// Seconds since the epoch of "2020:02:03 04:05:06", "2020-02-03T04:05:06.7+01:00", "2020-02-03 04:05:06 UTC",
// "2020-02-03" and the like. A time without zone counts as UTC: where it was is not known. Nothing where there is no
// whole date, and for the epoch itself, which stands for a date that nobody set.
std::optional<int64_t> ParseDate(const std::string& text);

// Puts a text that a format gives into a field of the document.
using Setter = void (*)(const char* field, const std::string& text, Findings& findings);

void SetText(const char* field, const std::string& text, Findings& findings);
void AddText(const char* field, const std::string& text, Findings& findings);
void AddContent(const char* field, const std::string& text, Findings& findings);  // whatever the field
void SetDate(const char* field, const std::string& text, Findings& findings);

// The number a text starts with, as 3 of "3/12". Nothing where there is none, or it is not above 0.
void SetLeadingNumber(const char* field, const std::string& text, Findings& findings);

// One to five stars; any other number means that nobody gave any.
void SetStars(double stars, Findings& findings);

// Pixels for each inch, where the number is one.
void SetDpi(const char* field, double dpi, Findings& findings);

// The unsigned number in up to eight bytes.
uint64_t BigEndian(std::string_view bytes);
uint64_t LittleEndian(std::string_view bytes);

// A text without a declared encoding: UTF-8 where it is that, else Latin-1.
std::string AsUtf8(std::string_view text);

}  // namespace platform::extract
