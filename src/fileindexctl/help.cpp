#include "help.h"

#include <algorithm>
#include <iostream>
#include <numeric>
#include <utility>

#include "output.h"
#include "search.h"

namespace quarrox::ctl {
namespace {

// What each option does, whichever command takes it.
const std::pair<const char*, const char*> kOptionTexts[] = {
    {"--as=", "as this user sees it, whose rights then count"},
    {"--complete", "print what a shell can complete the last of the words to"},
    {"--desc", "the last first"},
    {"--failed", "only what could not be read, file by file, and when it is tried again"},
    {"--follow", "go on and show each change, until Ctrl-C"},
    {"--group=", "the folders' group, which is any name"},
    {"--json", "print one JSON object, or one a line for listings"},
    {"--keyword=", "only folders with this text in their path or name"},
    {"--limit=", "print no more than so many"},
    {"--man", "print the part of the manual page that is about commands"},
    {"--name", "look for a part of a file's name, not for words in it"},
    {"--name=", "the folder's name for people; without it that of its directory"},
    {"--offset=", "pass over so many first"},
    {"--owner=", "the user whom the folder belongs to"},
    {"--repair", "queue what mends the differences, wait for it, and look again"},
    {"--share=", "only in this share"},
    {"--sort=", "what they are sorted by; path without it"},
    {"--summary", "print only the counts"},
    {"--textfile=", "write a file, as a whole, instead"},
    {"--type=", "only files of one of these types or with one of these extensions, with commas between them"},
    {"--types=", "the kinds of files that are indexed, with commas between them"},
    {"--until-idle", "follow only until nothing is left to be done; status 1 where a share waits for over a minute"},
    {"--wait=", "let pending work end first, for so long"},
};

const char* TextOf(const std::string& option) {
  for (const auto& [name, text] : kOptionTexts) {
    if (option == name) return text;
  }
  return "";
}

// "--limit N", as people write it.
std::string AsWritten(const Command& command, const std::string& option) {
  const std::string value = ValueName(command, option);
  return value.empty() ? option : option.substr(0, option.size() - 1) + ' ' + value;
}

void PrintLines(std::ostream& out, const Command& command) {
  out << "  " << NameOf(command) << ' ' << command.synopsis << "\n      " << command.help << '\n';
}

void PrintAll(std::ostream& out) {
  out << "usage: fileindexctl COMMAND [options]\n"
         "       fileindexctl COMMAND --help\n"
         "       fileindexctl --version\n\n";
  for (const Command& command : Commands()) PrintLines(out, command);
  out << "\n--json prints one JSON object, or one a line for listings.\n"
         "Exit status: 0 done, 1 failed, 2 bad usage.\n";
}

void PrintOne(std::ostream& out, const Command& command) {
  out << "usage: fileindexctl " << NameOf(command) << ' ' << command.synopsis << "\n\n" << command.help << "\n\n";
  std::vector<std::vector<std::string>> rows;
  for (const std::string& option : command.options) rows.push_back({"  " + AsWritten(command, option), TextOf(option)});
  if (!rows.empty()) PrintTable(out, rows);
  if (command.run == Search) PrintSearchLanguage(out);
}

// --- the manual page -------------------------------------------------------------------------------------------------

bool IsUpper(char c) {
  return 'A' <= c && c <= 'Z';
}

// A text for roff, which reads some characters as its own, and whose lines are to be short.
std::string Escaped(const std::string& text) {
  constexpr size_t kFull = 62;  // columns, after which no word begins
  std::string result;
  size_t begin = 0;
  for (const char c : text) {
    if (c == ' ' && result.size() - begin > kFull) {
      result += '\n';
      begin = result.size();
      continue;
    }
    if ((c == '.' || c == '\'') && result.size() == begin) result += "\\&";
    if (c == '-' || c == '\\') result += '\\';
    result += c == '\\' ? 'e' : c;
  }
  return result;
}

// A synopsis with options in bold and the names of values in italics.
std::string Dressed(const std::string& synopsis) {
  std::string result;
  for (size_t at = 0; at < synopsis.size();) {
    const bool option = synopsis.compare(at, 2, "--") == 0;
    size_t end = at;
    while (end < synopsis.size() &&
           (option ? std::string(" ]").find(synopsis[end]) == std::string::npos : IsUpper(synopsis[end]))) {
      ++end;
    }
    if (end == at) {
      result += synopsis[at++];
    } else {
      result += (option ? "\\fB" : "\\fI") + Escaped(synopsis.substr(at, end - at)) + "\\fR";
      at = end;
    }
  }
  return result;
}

void PrintManual(std::ostream& out, const Command& command) {
  out << ".TP\n\\fB" << Escaped(NameOf(command)) << "\\fR " << Dressed(command.synopsis) << '\n'
      << Escaped(command.help) << '\n';
  std::vector<std::string> options(command.options.begin(), command.options.end());
  std::erase(options, "--json");  // the page says once what it does
  if (options.empty()) return;
  out << ".RS\n";
  for (const std::string& option : options) {
    out << ".TP\n" << Dressed(AsWritten(command, option)) << '\n' << Escaped(TextOf(option)) << '\n';
  }
  out << ".RE\n";
}

// --- the command that was meant --------------------------------------------------------------------------------------

// How many letters must be put in, left out or exchanged to make one word of another.
size_t Distance(const std::string& from, const std::string& to) {
  std::vector<size_t> row(to.size() + 1);  // from what was read so far to each beginning of `to`
  std::iota(row.begin(), row.end(), size_t{0});
  for (const char c : from) {
    size_t diagonal = row[0]++;
    for (size_t i = 0; i < to.size(); ++i) {
      const size_t exchanged = diagonal + (c == to[i] ? 0 : 1);
      diagonal = row[i + 1];
      row[i + 1] = std::min({exchanged, row[i] + 1, diagonal + 1});
    }
  }
  return row.back();
}

// As many of the words as a name has.
std::string Typed(const std::vector<std::string>& words, const std::string& name) {
  const bool two = words.size() > 1 && name.find(' ') != std::string::npos;
  return two ? words[0] + ' ' + words[1] : words[0];
}

}  // namespace

std::string ValueName(const Command& command, const std::string& option) {
  if (!option.ends_with('=')) return "";
  const std::string synopsis = command.synopsis;
  const size_t at = synopsis.find(option.substr(0, option.size() - 1) + ' ');
  if (at == std::string::npos) return "";
  const size_t begin = at + option.size();
  return synopsis.substr(begin, synopsis.find_first_of(" ]", begin) - begin);
}

const Command* FindCommand(const std::vector<std::string>& words) {
  const auto found = std::find_if(Commands().begin(), Commands().end(), [&](const Command& command) {
    return !words.empty() && words[0] == command.noun &&
           (*command.verb == '\0' || (words.size() > 1 && words[1] == command.verb));
  });
  return found == Commands().end() ? nullptr : &*found;
}

UsageError NoSuchCommand(const std::vector<std::string>& words) {
  std::string verbs;
  std::string nearest;
  size_t distance = 3;  // what is further off was not meant
  for (const Command& command : Commands()) {
    if (words[0] == command.noun) verbs.append(verbs.empty() ? "" : ", ").append(command.verb);
    const std::string name = words.size() == 1 ? command.noun : NameOf(command);
    const size_t candidate = Distance(Typed(words, name), name);
    if (candidate == 0 || candidate >= distance) continue;
    distance = candidate;
    nearest = name;
  }
  if (words.size() == 1 && !verbs.empty())
    return UsageError("behind " + words[0] + " one of these is missing: " + verbs);
  const std::string typed = "unknown command '" + Visible(words[0] + (words.size() > 1 ? ' ' + words[1] : "")) + "'";
  return UsageError(nearest.empty() ? typed : typed + "; did you mean '" + nearest + "'?");
}

void PrintHelp(std::ostream& out, const std::vector<std::string>& words) {
  if (words.empty()) return PrintAll(out);
  if (const Command* command = FindCommand(words)) return PrintOne(out, *command);
  bool found = false;
  for (const Command& command : Commands()) {
    if (words.size() > 1 || words[0] != command.noun) continue;
    PrintLines(out, command);
    found = true;
  }
  if (!found) throw NoSuchCommand(words);
}

int Help(const Arguments& arguments) {
  if (arguments.Has("--complete")) {
    PrintCandidates(std::cout, arguments.operands());
  } else if (arguments.Has("--man")) {
    for (const Command& command : Commands()) PrintManual(std::cout, command);
  } else {
    PrintHelp(std::cout, arguments.operands());
  }
  return kDone;
}

}  // namespace quarrox::ctl
