#include "command.h"

#include <charconv>
#include <cstdint>
#include <iterator>
#include <system_error>

namespace quarrox::ctl {

namespace {

constexpr size_t kAnyNumber = SIZE_MAX / 2;  // of operands; may be added to

bool IsDigit(char c) {
  return '0' <= c && c <= '9';
}

const std::vector<Command> kCommands = {
    {"folder",
     "list",
     "[--group GROUP] [--keyword TEXT] [--sort KEY] [--desc] [--offset N] [--limit N] [--json]",
     "list the indexed folders; KEY is path, name, document, audio, video or photo",
     {"--group=", "--keyword=", "--sort=", "--desc", "--offset=", "--limit=", "--json"},
     0,
     FolderList},
    {"folder", "get", "[--json] PATH", "say all about one indexed folder", {"--json"}, 1, FolderGet},
    {"folder", "groups", "[--json]", "list the groups of the indexed folders", {"--json"}, 0, FolderGroups},
    {"folder",
     "add",
     "[--name NAME] [--types TYPE,...] [--group GROUP] [--owner USER] [--json] PATH...",
     "index folders; TYPE is document, audio, video or photo, without --types all of them, or none alone",
     {"--name=", "--types=", "--group=", "--owner=", "--json"},
     1,
     FolderAdd,
     kAnyNumber},
    {"folder",
     "set",
     "[--name NAME] [--types TYPE,...] [--group GROUP] [--owner USER] [--json] PATH",
     "change an indexed folder; what is not named stays",
     {"--name=", "--types=", "--group=", "--owner=", "--json"},
     1,
     FolderSet},
    {"folder", "delete", "[--json] PATH...", "index folders no longer", {"--json"}, 1, FolderDelete, kAnyNumber},
    {"folder",
     "pause",
     "[--json] PATH [HOURS]",
     "leave the files of a folder alone for HOURS or without end; searches go on",
     {"--json"},
     1,
     FolderPause,
     1},
    {"folder", "resume", "[--json] PATH", "end the pause of a folder", {"--json"}, 1, FolderResume},
    {"folder", "reindex", "[--json] PATH...", "index again what is there", {"--json"}, 1, FolderReindex, kAnyNumber},
    {"folder",
     "summary",
     "[--json]",
     "say how far the index of each folder and group is",
     {"--json"},
     0,
     FolderSummary},
    {"queue",
     "fold",
     "[--summary] [--json] FILE",
     "fold a queue file and print each operation that is left",
     {"--summary", "--json"},
     1,
     QueueFold},
    {"queue", "list", "[--json]", "list the queue of each share: its size and age", {"--json"}, 0, QueueList},
    {"queue", "show", "[--json] SHARE", "print each operation that waits for a share", {"--json"}, 1, QueueShow},
    {"pause", "", "[--json] [HOURS]", "pause indexing for HOURS or without end", {"--json"}, 0, Pause, 1},
    {"resume", "", "[--json]", "end a pause", {"--json"}, 0, Resume},
    {"search",
     "",
     "[--share SHARE] [--name] [--type TYPE,...] [--as USER] [--limit N] [--offset N] [--json] QUERY",
     "find files by words, phrases, name, type, size, date and place, or with --name by parts of their names; best "
     "first",
     {"--share=", "--name", "--type=", "--as=", "--limit=", "--offset=", "--json"},
     1,
     Search},
    {"share", "list", "[--json]", "list the shares and whether they can be indexed", {"--json"}, 0, ShareList},
    {"share", "show", "[--json] NAME", "say all about one share", {"--json"}, 1, ShareShow},
    {"share", "rename", "[--json] FROM TO", "follow a share that bears the new name TO", {"--json"}, 2, ShareRename},
    {"share",
     "migrate",
     "[--json] NAME FROM TO",
     "follow a share whose directory moved; FROM and TO are full paths",
     {"--json"},
     3,
     ShareMigrate},
    {"share", "pause", "[--json] NAME", "stop indexing in a share", {"--json"}, 1, SharePause},
    {"share", "resume", "[--json] NAME", "index in a share again", {"--json"}, 1, ShareResume},
    {"share", "rebuild", "[--json] NAME", "make the index of a share anew", {"--json"}, 1, ShareRebuild},
    {"share",
     "auto-clean",
     "[--json] NAME",
     "remove the index of a share; its folders stay",
     {"--json"},
     1,
     ShareAutoClean},
    {"share",
     "clear-paused",
     "[--json] NAME PATH",
     "remove index and folders of a share that may be gone; PATH is its directory",
     {"--json"},
     2,
     ShareClearPaused},
    {"share",
     "check-recycle",
     "[--json] NAME",
     "follow a share whose recycle bin was switched on or off",
     {"--json"},
     1,
     ShareCheckRecycle},
    {"status",
     "",
     "[--follow [--until-idle] | --failed] [--json]",
     "say of each share what its index holds, what is left to be done and how long it takes",
     {"--follow", "--until-idle", "--failed", "--json"},
     0,
     Status},
    {"metrics",
     "",
     "[--textfile FILE]",
     "print figures for Prometheus, or write them where its node exporter collects text files",
     {"--textfile="},
     0,
     Metrics},
    {"suggest", "rebuild", "[--json]", "make missing term suggestions anew", {"--json"}, 0, SuggestRebuild},
    {"audit",
     "",
     "[--repair] [--wait SECONDS] [--json] [SHARE]",
     "say what disk and index disagree on; --repair queues what mends it, --wait lets pending work end first",
     {"--repair", "--wait=", "--json"},
     0,
     Audit,
     1},
    {"explain",
     "",
     "[--as USER] [--json] PATH",
     "say which share and folder a path belongs to, whether it is indexed or why not, and who may find it",
     {"--as=", "--json"},
     1,
     ExplainPath},
    {"doctor",
     "",
     "[--json]",
     "check this machine: daemons, rights, limits, shares, folders, indexes; each finding with its remedy",
     {"--json"},
     0,
     Doctor},
    {"call",
     "",
     "OPERATION [JSON ...]",
     "call an operation of the library, with a JSON text for each parameter; without operation: list them",
     {"--json"},
     0,
     Call,
     kAnyNumber},
    {"help",
     "",
     "[--man] [--complete] [COMMAND...]",
     "explain all commands, or those that begin with the words behind it",
     {"--man", "--complete"},
     0,
     Help,
     kAnyNumber},
};

}  // namespace

Arguments::Arguments(const std::vector<std::string>& words, const std::set<std::string>& known_options) {
  bool options = true;
  for (auto word = words.begin(); word != words.end(); ++word) {
    if (!options || word->size() < 2 || word->front() != '-' || IsDigit((*word)[1])) {
      operands_.push_back(*word);
      continue;
    }
    options = *word != "--";
    if (!options) continue;
    const size_t equals = word->find('=');
    const std::string option = word->substr(0, equals);
    std::string& value = options_[option];
    if (known_options.count(option + "=") == 0) {
      if (known_options.count(option) == 0) throw UsageError("unknown option " + option);
      if (equals != std::string::npos) throw UsageError("option " + option + " takes no value");
    } else if (equals != std::string::npos) {
      value = word->substr(equals + 1);
    } else {
      if (std::next(word) == words.end()) throw UsageError("option " + option + " needs a value");
      value = *++word;
    }
  }
}

std::string Arguments::Value(const std::string& option, const std::string& otherwise) const {
  const auto found = options_.find(option);
  return found == options_.end() ? otherwise : found->second;
}

size_t Arguments::Number(const std::string& option, size_t otherwise) const {
  const auto found = options_.find(option);
  if (found == options_.end()) return otherwise;
  const std::string& text = found->second;
  size_t number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size()) {
    throw UsageError("option " + option + " needs a number, not '" + text + "'");
  }
  return number;
}

std::string NameOf(const Command& command) {
  return *command.verb == '\0' ? command.noun : std::string(command.noun) + ' ' + command.verb;
}

const std::vector<Command>& Commands() {
  return kCommands;
}

}  // namespace quarrox::ctl
