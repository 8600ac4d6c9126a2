// fileindexctl: looks at the full-text index of shared folders and works on it.
#include <algorithm>
#include <cstdio>
#include <exception>
#include <iostream>
#include <string>
#include <vector>

#include "command.h"
#include "common/error.h"
#include "common/json.h"

namespace {

using quarrox::ctl::Arguments;
using quarrox::ctl::Command;
using quarrox::ctl::Commands;

void PrintHelp(std::ostream& out) {
  out << "usage: fileindexctl NOUN VERB [options]\n\n";
  for (const Command& command : Commands()) {
    out << "  " << command.noun << ' ' << command.verb << ' ' << command.synopsis << "\n      " << command.help << '\n';
  }
  out << "\n--json prints one JSON object, or one a line for listings.\n"
         "Exit status: 0 done, 1 failed, 2 bad usage.\n";
}

int Usage(const std::string& what) {
  std::cerr << "fileindexctl: " << what << "\ntry: fileindexctl --help\n";
  return quarrox::ctl::kUsage;
}

int Fail(int code, const std::string& reason, bool json) {
  if (json) {
    Json::Value failure;
    failure["success"] = false;
    failure["error"]["code"] = code;
    failure["error"]["msg"] = reason;
    std::cout << quarrox::toString(failure) << '\n';
  } else {
    std::cerr << "fileindexctl: error " << code << (reason.empty() ? "" : ": " + reason) << '\n';
  }
  return quarrox::ctl::kFailed;
}

int Run(const Command& command, const std::vector<std::string>& words) {
  try {
    const Arguments arguments(words, command.options);
    if (arguments.operands().size() != command.operands) {
      return Usage(std::string("usage: fileindexctl ") + command.noun + ' ' + command.verb + ' ' + command.synopsis);
    }
    try {
      const int status = command.run(arguments);
      std::cout.flush();
      if (!std::cout) return Fail(quarrox::kErrSystem, "the output cannot be written", false);
      return status;
    } catch (const quarrox::Error& error) {
      return Fail(error.code, error.what(), arguments.Has("--json"));
    }
  } catch (const quarrox::ctl::UsageError& error) {
    return Usage(error.what());
  }
}

}  // namespace

int main(int argc, char** argv) {
  std::ios::sync_with_stdio(false);
  const std::vector<std::string> words(argv + 1, argv + argc);
  if (!words.empty() && (words[0] == "--help" || words[0] == "-h" || words[0] == "help")) {
    PrintHelp(std::cout);
    return quarrox::ctl::kDone;
  }
  if (words.size() < 2) return Usage("NOUN and VERB are missing");
  const auto command = std::find_if(Commands().begin(), Commands().end(), [&](const Command& candidate) {
    return words[0] == candidate.noun && words[1] == candidate.verb;
  });
  if (command == Commands().end()) return Usage("unknown command '" + words[0] + " " + words[1] + "'");
  try {
    return Run(*command, {words.begin() + 2, words.end()});
  } catch (const std::exception& error) {
    std::cerr << "fileindexctl: " << error.what() << '\n';
    return quarrox::ctl::kFailed;
  }
}
