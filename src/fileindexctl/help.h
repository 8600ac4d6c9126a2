// What fileindexctl says of its own commands; all of it comes from the one table, Commands().
#pragma once

#include <iosfwd>
#include <string>
#include <vector>

#include "command.h"

namespace quarrox::ctl {

// The command that some words begin with; null where there is none.
const Command* FindCommand(const std::vector<std::string>& words);

// Why some words begin with no command: what is missing behind a noun, or else the command that is spelled most alike.
UsageError NoSuchCommand(const std::vector<std::string>& words);

// Without words the whole help, with those of a noun that noun's commands, with those of a command all about it.
// Throws NoSuchCommand.
void PrintHelp(std::ostream& out, const std::vector<std::string>& words);

// The value that an option takes, as the command's synopsis names it: "N" for "--limit="; empty where it takes none.
std::string ValueName(const Command& command, const std::string& option);

// What can stand in the place of the last of some words, for a shell's completion. The first line says which names of
// files fit as well: "files", "directories" or "none"; then follows a candidate a line.
void PrintCandidates(std::ostream& out, std::vector<std::string> words);

}  // namespace quarrox::ctl
