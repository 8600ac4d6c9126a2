#include "output.h"

#include <algorithm>
#include <cstdio>
#include <ctime>
#include <ostream>

#include "fileindex/status_mgr.h"

namespace quarrox::ctl {
namespace {

// The columns that a text takes: its characters, as far as it is UTF-8.
size_t Width(const std::string& text) {
  return static_cast<size_t>(
      std::count_if(text.begin(), text.end(), [](char c) { return (static_cast<unsigned char>(c) & 0xc0) != 0x80; }));
}

}  // namespace

std::string Visible(const std::string& text) {
  static constexpr char kHex[] = "0123456789abcdef";
  std::string result;
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    if (c == '\n') {
      result += "\\n";
    } else if (byte < 0x20 || byte == 0x7f) {
      result.append("\\x").append(1, kHex[byte >> 4]).append(1, kHex[byte & 15]);
    } else {
      result += c;
    }
  }
  return result;
}

std::string SizeText(uint64_t bytes) {
  if (bytes < 1024) return std::to_string(bytes) + " B";
  double size = static_cast<double>(bytes) / 1024;
  const char* unit = "KMGTPE";
  while (size >= 1024) {
    size /= 1024;
    ++unit;
  }
  char text[32];
  snprintf(text, sizeof(text), "%.1f %ciB", size, *unit);
  return text;
}

std::string Duration(int64_t seconds) {
  if (seconds >= 2 * 86400) return std::to_string(seconds / 86400) + " days";
  if (seconds >= 2 * 3600) return std::to_string(seconds / 3600) + " hours";
  if (seconds >= 2 * 60) return std::to_string(seconds / 60) + " min";
  return std::to_string(seconds) + " s";
}

std::string LocalTime(int64_t time) {
  const time_t seconds = time;
  tm local = {};
  char text[64] = "";
  if (localtime_r(&seconds, &local) != nullptr) strftime(text, sizeof(text), "%F %T %Z", &local);
  return text;
}

// A time that has passed says that indexing runs again.
std::string DescribePause(int64_t resume_time) {
  if (resume_time == fileindex::kPausedWithoutEnd) return "paused without end";
  return resume_time <= time(nullptr) ? "running" : "paused until " + LocalTime(resume_time);
}

void PrintTable(std::ostream& out, const std::vector<std::vector<std::string>>& rows) {
  std::vector<size_t> widths(rows.front().size());
  for (const auto& row : rows) {
    for (size_t i = 0; i < row.size(); ++i) widths[i] = std::max(widths[i], Width(row[i]));
  }
  for (const auto& row : rows) {
    for (size_t i = 0; i + 1 < row.size(); ++i) out << row[i] << std::string(widths[i] - Width(row[i]) + 2, ' ');
    out << row.back() << '\n';
  }
}

}  // namespace quarrox::ctl
