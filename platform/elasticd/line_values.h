// Sizes and dates as people write them, with comparisons and ranges: ">10M", "1k..2M", "2024-05", "7d". Any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

namespace quarrox::elasticd {

// Whole numbers from `low` to `high`, both included; `high` may be below `low`.
struct NumberBounds {
  double low = 0;
  double high = 0;
};

// In bytes. A size stands for all that round down to it as it is written: 10M for what is below 11M.
std::optional<NumberBounds> ParseSizes(std::string_view text);

// In seconds since the epoch, where `now` is one. A date stands for all of its year, month or day in local time, and a
// number of days for what is no older.
std::optional<NumberBounds> ParseDates(std::string_view text, int64_t now);

}  // namespace quarrox::elasticd
