#include "command.h"

#include <algorithm>

namespace quarrox::ctl {

Arguments::Arguments(const std::vector<std::string>& words, const std::set<std::string>& known_options) {
  bool options = true;
  for (const std::string& word : words) {
    if (options && word == "--") {
      options = false;
    } else if (options && word.size() > 1 && word.front() == '-') {
      if (known_options.count(word) == 0) throw UsageError("unknown option " + word);
      options_.insert(word);
    } else {
      operands_.push_back(word);
    }
  }
}

std::string NameOf(const Command& command) {
  return *command.verb == '\0' ? command.noun : std::string(command.noun) + ' ' + command.verb;
}

const std::vector<Command>& Commands() {
  static const std::vector<Command> commands = {
      {"queue",
       "fold",
       "[--summary] [--json] FILE",
       "fold a queue file and print each operation that is left",
       {"--summary", "--json"},
       1,
       QueueFold},
      {"share", "list", "[--json]", "list the shares and whether they can be indexed", {"--json"}, 0, ShareList},
      {"share", "show", "[--json] NAME", "say all about one share", {"--json"}, 1, ShareShow},
      {"explain",
       "",
       "[--json] PATH",
       "say which share a path belongs to, and whether it is indexed or why not",
       {"--json"},
       1,
       ExplainPath},
  };
  return commands;
}

}  // namespace quarrox::ctl
