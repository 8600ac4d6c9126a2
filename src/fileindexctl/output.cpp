#include "output.h"

#include <algorithm>
#include <cstdio>
#include <ctime>
#include <ostream>
#include <string_view>

#include "fileindex/status_mgr.h"

namespace quarrox::ctl {
namespace {

// The columns that a text takes: its characters, as far as it is UTF-8.
size_t Width(const std::string& text) {
  return static_cast<size_t>(
      std::count_if(text.begin(), text.end(), [](char c) { return (static_cast<unsigned char>(c) & 0xc0) != 0x80; }));
}

// How many bytes at the beginning of a text are a character that a terminal obeys: controls, in UTF-8 those of C1 too,
// and what turns the direction of writing.
size_t HarmfulAt(std::string_view text) {
  const auto byte = [&](size_t i) { return i < text.size() ? static_cast<unsigned char>(text[i]) : 0U; };
  const auto is_from = [&](size_t i, unsigned int first, unsigned int last) {
    return first <= byte(i) && byte(i) <= last;
  };
  if (byte(0) < 0x20 || byte(0) == 0x7f) return 1;
  if (byte(0) == 0xc2 && is_from(1, 0x80, 0x9f)) return 2;
  const bool is_turn = (byte(1) == 0x80 && is_from(2, 0xaa, 0xae)) || (byte(1) == 0x81 && is_from(2, 0xa6, 0xa9));
  return byte(0) == 0xe2 && is_turn ? 3 : 0;
}

bool IsPlain(char c) {
  return ('a' <= c && c <= 'z') || ('A' <= c && c <= 'Z') || ('0' <= c && c <= '9') ||
         std::string("/._-+=:,@%").find(c) != std::string::npos;
}

// A word with what a terminal obeys, as bash, zsh and ksh read it: on its way to a person's eyes nothing of it is lost.
std::string WithEscapes(const std::string& word) {
  std::string quoted = "$'";
  for (const char c : word) {
    char code[8];
    const auto byte = static_cast<unsigned char>(c);
    if (byte >= 0x20 && byte < 0x7f && c != '\'' && c != '\\') {
      quoted += c;
    } else {
      snprintf(code, sizeof(code), "\\%03o", byte);
      quoted += code;
    }
  }
  return quoted + '\'';
}

}  // namespace

std::string ShellLine(const std::vector<std::string>& words) {
  std::string line;
  for (const std::string& word : words) {
    if (!line.empty()) line += ' ';
    if (!word.empty() && std::all_of(word.begin(), word.end(), IsPlain)) {
      line += word;
      continue;
    }
    if (Visible(word) != word) {
      line += WithEscapes(word);
      continue;
    }
    line += '\'';
    for (const char c : word) c == '\'' ? line += "'\\''" : line += c;
    line += '\'';
  }
  return line;
}

std::string ShareCommand(const std::string& verb, const std::string& share, const std::string& operand) {
  std::vector<std::string> words = {"fileindexctl", "share", verb};
  if (share.starts_with('-')) words.emplace_back("--");
  words.push_back(share);
  if (!operand.empty()) words.push_back(operand);
  return ShellLine(words);
}

std::string Visible(const std::string& text) {
  static constexpr char kHex[] = "0123456789abcdef";
  std::string result;
  size_t escaped = 0;  // bytes that are still to be
  for (size_t i = 0; i < text.size(); ++i) {
    const char c = text[i];
    const auto byte = static_cast<unsigned char>(c);
    if (escaped == 0) escaped = HarmfulAt(std::string_view(text).substr(i));
    if (c == '\n') {
      result += "\\n";
      escaped = 0;
    } else if (escaped > 0) {
      --escaped;
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
