// What the commands print: tables for people, one JSON object a line for programs.
#pragma once

#include <cstdint>
#include <iosfwd>
#include <string>
#include <vector>

namespace quarrox::fileindex {
class Folder;
}

namespace quarrox::ctl {

// The kinds of files that a folder indexes, with commas between them; "none" where there are none.
std::string TypesOf(const fileindex::Folder& folder);

// A text that stays on one line and cannot drive the terminal: control bytes come out as \n, \x1b and so on.
std::string Visible(const std::string& text);

// A command for the shell, each word quoted where it has to be.
std::string ShellLine(const std::vector<std::string>& words);

// "fileindexctl share VERB SHARE [OPERAND]".
std::string ShareCommand(const std::string& verb, const std::string& share, const std::string& operand = "");

// A number of bytes: "17 B", "4.2 MiB".
std::string SizeText(uint64_t bytes);

// In the largest unit that fits: "3 days", "12 s".
std::string Duration(int64_t seconds);

// The state of pausing, by what StatusMgr says of it: "paused until 2026-11-21 11:52:35 UTC", "running".
std::string DescribePause(int64_t resume_time);

// "2026-11-21 11:52:35 UTC", in the machine's time zone.
std::string LocalTime(int64_t time);

// Rows of equally many texts, the first of which is the heading. Columns are as wide as their widest text.
void PrintTable(std::ostream& out, const std::vector<std::vector<std::string>>& rows);

}  // namespace quarrox::ctl
