// Texts in the syntax of smb.conf: sections in brackets, "key = value" lines, comments.
#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace platform {

// A section's head (key and value empty) or one of its parameters. Keys are lower case with single blanks.
struct IniEntry {
  std::string section;  // as written; empty before the first head
  std::string key;
  std::string value;
  int line = 0;  // where it starts, from 1
};

struct IniText {
  std::vector<IniEntry> entries;      // in the order of the text
  std::vector<std::string> problems;  // "FILE:LINE: what, what to do" for each line that was left out
};

// Reads a text. A line that is none of the three is left out and told, and so is all of a section whose head cannot be
// read; the rest goes on. `file` names the text in problems. A comment begins with "#" or ";" as a line's first
// character that is no blank, nowhere else. A backslash at the end of a line that is no comment joins the next line to
// it.
IniText ParseIni(std::string_view text, const std::string& file);

// The switch words of smb.conf: yes, true, on, 1 and no, false, off, 0, in any case. False where it is none of them.
bool ParseSwitch(const std::string& value, bool* result);

}  // namespace platform
