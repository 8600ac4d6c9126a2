#include "linux/ini_file.h"

#include <algorithm>

#include "common/strings.h"

namespace platform {
namespace {

// One line as its writer sees it: joined with those that its backslashes continue it with. Advances both cursors.
std::string NextLine(std::string_view text, size_t* position, int* line) {
  std::string joined;
  while (*position < text.size()) {
    const size_t end = std::min(text.find('\n', *position), text.size());
    std::string part(text.substr(*position, end - *position));
    *position = end + 1;
    ++*line;
    if (part.ends_with('\r')) part.pop_back();
    const size_t first = part.find_first_not_of(" \t");
    const bool comment = joined.empty() && first != std::string::npos && (part[first] == '#' || part[first] == ';');
    if (comment || !part.ends_with('\\')) return joined + part;
    part.pop_back();
    joined += part;
  }
  return joined;
}

std::string NormalKey(const std::string& written) {
  std::string key;
  for (const char byte : quarrox::Trim(quarrox::ToLower(written))) {
    const bool blank = byte == ' ' || byte == '\t';
    if (!blank || key.back() != ' ') key.push_back(blank ? ' ' : byte);
  }
  return key;
}

// Where the parser stands.
struct Parser {
  IniText result;
  std::string file;
  std::string section;
  bool skipping = false;  // below a head that cannot be read; its parameters belong to no section

  void Tell(int line, const char* problem) {
    result.problems.push_back(file + ":" + std::to_string(line) + ": " + problem);
  }

  void Head(const std::string& text, int line) {
    const size_t end = text.find(']');
    skipping = end == std::string::npos;
    if (skipping) return Tell(line, "a section's head without \"]\", the section is left out; close the bracket");
    section = quarrox::Trim(text.substr(1, end - 1));
    result.entries.push_back({section, "", "", line});
  }

  void Line(const std::string& text, int line) {
    if (text.empty() || text[0] == '#' || text[0] == ';') return;
    if (text.find('\0') != std::string::npos) return Tell(line, "a zero byte, the line is left out; remove it");
    if (text[0] == '[') return Head(text, line);
    if (skipping) return;
    const size_t equals = text.find('=');
    const std::string key = NormalKey(text.substr(0, equals));
    if (equals == std::string::npos || key.empty()) {
      return Tell(line, "neither a section nor \"key = value\", the line is left out; write it as one of them");
    }
    result.entries.push_back({section, key, quarrox::Trim(text.substr(equals + 1)), line});
  }
};

}  // namespace

IniText ParseIni(std::string_view text, const std::string& file) {
  constexpr std::string_view kByteOrderMark = "\xEF\xBB\xBF";
  if (text.starts_with(kByteOrderMark)) text.remove_prefix(kByteOrderMark.size());
  Parser parser{.result = {}, .file = file, .section = {}};
  int line = 0;
  for (size_t position = 0; position < text.size();) {
    const int first = line + 1;
    parser.Line(quarrox::Trim(NextLine(text, &position, &line)), first);
  }
  return std::move(parser.result);
}

bool ParseSwitch(const std::string& value, bool* result) {
  const std::string word = quarrox::ToLower(value);
  const bool yes = word == "yes" || word == "true" || word == "on" || word == "1";
  if (!yes && word != "no" && word != "false" && word != "off" && word != "0") return false;
  *result = yes;
  return true;
}

}  // namespace platform
