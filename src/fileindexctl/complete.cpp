#include <algorithm>
#include <iterator>
#include <ostream>
#include <set>
#include <sstream>

#include "common/sdk/share.h"
#include "common/strings.h"
#include "fileindex/folder_mgr.h"
#include "help.h"

namespace quarrox::ctl {
namespace {

using Words = std::vector<std::string>;

// What fits in one place of a command line.
struct Candidates {
  const char* files = "none";
  Words words = {};
};

Candidates ShareNames() {
  const std::set<std::string> shares = sdk::SDKShare::Enum();
  return {.words = {shares.begin(), shares.end()}};
}

// A share path, or the full path of a directory.
Candidates NewFolders() {
  Candidates found = ShareNames();
  for (std::string& word : found.words) word.insert(0, 1, '/');
  found.files = "directories";
  return found;
}

Candidates IndexedFolders() {
  Candidates found;
  for (const auto& folder : fileindex::FolderMgr().GetFolders()) found.words.push_back(folder->GetPath());
  return found;
}

Candidates Groups() {
  const auto groups = fileindex::FolderMgr().GetGroups();
  return {.words = {groups.begin(), groups.end()}};
}

Candidates SortKeys() {
  return {.words = {"path", "name", "document", "audio", "video", "photo"}};
}

Candidates Types() {
  return {.words = {"document", "audio", "video", "photo", "none"}};
}

Candidates Files() {
  return {.files = "files"};
}

Candidates Directories() {
  return {.files = "directories"};
}

// What a value's name in a synopsis stands for. The first row that fits decides.
struct Value {
  const char* name;
  const char* within;  // how the command begins
  Candidates (*find)();
};

constexpr Value kValues[] = {
    {"SHARE", "", ShareNames},
    {"NAME", "share ", ShareNames},
    {"FROM", "share rename", ShareNames},
    {"TO", "share rename", ShareNames},
    {"FROM", "", Directories},
    {"TO", "", Directories},
    {"PATH", "folder add", NewFolders},
    {"PATH", "folder ", IndexedFolders},
    {"PATH", "share ", Directories},
    {"PATH", "", Files},
    {"FILE", "", Files},
    {"GROUP", "", Groups},
    {"KEY", "", SortKeys},
    {"TYPE", "", Types},
};

Candidates ForValue(const Command& command, const std::string& name) {
  const auto* known = std::find_if(std::begin(kValues), std::end(kValues), [&](const Value& value) {
    return name == value.name && NameOf(command).starts_with(value.within);
  });
  return known == std::end(kValues) ? Candidates() : known->find();
}

// The names of the operands in a synopsis, without brackets and dots: {"PATH"} of "[--limit N] [PATH...]".
Words OperandNames(const std::string& synopsis) {
  Words names;
  std::istringstream in(synopsis);
  bool option = false;
  for (std::string word; in >> word;) {
    option = option || word.starts_with("[--");
    const size_t begin = word.find_first_not_of('[');
    if (!option) names.push_back(word.substr(begin, word.find_first_of(".],", begin) - begin));
    option = option && !word.ends_with(']');
  }
  return names;
}

Candidates Options(const Command& command) {
  Candidates found{.words = {"--help"}};
  for (const std::string& option : command.options) {
    found.words.push_back(option.substr(0, option.size() - (option.ends_with('=') ? 1 : 0)));
  }
  return found;
}

Candidates Operand(const Command& command, size_t index) {
  const Words names = OperandNames(command.synopsis);
  if (names.empty() || index >= command.operands + command.optional_operands) return {};
  return ForValue(command, names[std::min(index, names.size() - 1)]);
}

// What an option's value can be; "TYPE,..." is a list of them.
Candidates OptionValue(const Command& command, const std::string& option) {
  const std::string name = ValueName(command, option + "=");
  return ForValue(command, name.substr(0, name.find(',')));
}

bool TakesValue(const Command& command, const std::string& option) {
  return command.options.count(option + "=") != 0;
}

// The words that follow a command's own; the last of them is being typed.
Candidates Behind(const Command& command, const Words& words) {
  const std::string& last = words.back();
  bool options = true;
  size_t operands = 0;
  for (size_t i = 0; i + 1 < words.size(); ++i) {
    if (!options || !words[i].starts_with('-')) {
      ++operands;
    } else if (TakesValue(command, words[i]) && ++i + 1 == words.size()) {
      return OptionValue(command, words[i - 1]);
    }
    options = options && words[i] != "--";
  }
  const size_t equals = last.find('=');
  if (!options || !last.starts_with('-')) return Operand(command, operands);
  if (equals == std::string::npos) return Options(command);
  Candidates found = OptionValue(command, last.substr(0, equals));
  for (std::string& word : found.words) word.insert(0, last, 0, equals + 1);
  return found;
}

// The first word, or the second one behind a noun.
Candidates CommandWords(const Words& words) {
  Candidates found{.words = {"--help"}};
  if (words.size() == 1) found.words.emplace_back("--version");
  for (const Command& command : Commands()) {
    if (words.size() > 1 && words[0] != command.noun) continue;
    const char* word = words.size() > 1 ? command.verb : command.noun;
    if (found.words.back() != word) found.words.emplace_back(word);
  }
  return found;
}

Candidates ForLast(const Words& words) {
  const Command* command = words.size() > 1 ? FindCommand(words) : nullptr;
  const size_t own = command != nullptr && *command->verb != '\0' ? 2 : 1;
  if (command == nullptr || words.size() == own) return words.size() <= 2 ? CommandWords(words) : Candidates();
  return Behind(*command, {words.begin() + static_cast<ptrdiff_t>(own), words.end()});
}

}  // namespace

void PrintCandidates(std::ostream& out, Words words) {
  if (words.size() > 1 && words[0] == "help") words.erase(words.begin());
  if (words.empty()) words.emplace_back();
  const Candidates found = ForLast(words);
  out << found.files << '\n';
  for (const std::string& word : found.words) {
    // A shell takes every line for a word.
    if (StringStartWith(word, words.back()) && word.find('\n') == std::string::npos) out << word << '\n';
  }
}

}  // namespace quarrox::ctl
