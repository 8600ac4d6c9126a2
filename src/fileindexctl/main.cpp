// fileindexctl: looks at the full-text index of shared folders and works on it.
#include <algorithm>
#include <cstdio>
#include <exception>
#include <iostream>
#include <map>
#include <string>
#include <vector>

#include "command.h"
#include "common/error.h"
#include "common/json.h"
#include "output.h"

namespace {

using quarrox::ctl::Arguments;
using quarrox::ctl::Command;
using quarrox::ctl::Commands;
using quarrox::ctl::NameOf;

void PrintHelp(std::ostream& out) {
  out << "usage: fileindexctl COMMAND [options]\n\n";
  for (const Command& command : Commands()) {
    out << "  " << NameOf(command) << ' ' << command.synopsis << "\n      " << command.help << '\n';
  }
  out << "\n--json prints one JSON object, or one a line for listings.\n"
         "Exit status: 0 done, 1 failed, 2 bad usage.\n";
}

int Usage(const std::string& what) {
  std::cerr << "fileindexctl: " << what << "\ntry: fileindexctl --help\n";
  return quarrox::ctl::kUsage;
}

// What a person may make of an error's number; empty where the reason says all.
const char* MeaningOf(int code) {
  static const std::map<int, const char*> meanings = {
      {quarrox::kErrShareEnum, "the shares cannot be listed"},
      {quarrox::kErrNoSuchShare, "there is no such share"},
      {quarrox::kErrNoSuchFolder, "there is no such folder"},
  };
  const auto meaning = meanings.find(code);
  return meaning == meanings.end() ? "" : meaning->second;
}

int Fail(int code, const std::string& reason, bool json) {
  if (json) {
    Json::Value failure;
    failure["success"] = false;
    failure["error"]["code"] = code;
    failure["error"]["msg"] = reason;
    std::cout << quarrox::toString(failure) << '\n';
  } else {
    std::cerr << "fileindexctl: error " << code;
    for (const std::string& text : {std::string(MeaningOf(code)), reason}) {
      if (!text.empty()) std::cerr << ": " << quarrox::ctl::Visible(text);
    }
    std::cerr << '\n';
  }
  return quarrox::ctl::kFailed;
}

int Run(const Command& command, const std::vector<std::string>& words) {
  try {
    const Arguments arguments(words, command.options);
    const size_t operands = arguments.operands().size();
    if (operands < command.operands || operands > command.operands + command.optional_operands) {
      return Usage("usage: fileindexctl " + NameOf(command) + ' ' + command.synopsis);
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
  if (words.empty()) return Usage("a command is missing");
  const auto command = std::find_if(Commands().begin(), Commands().end(), [&](const Command& candidate) {
    return words[0] == candidate.noun && (*candidate.verb == '\0' || (words.size() > 1 && words[1] == candidate.verb));
  });
  if (command == Commands().end()) {
    return Usage("unknown command '" + words[0] + (words.size() > 1 ? " " + words[1] : "") + "'");
  }
  const long own_words = *command->verb == '\0' ? 1 : 2;
  try {
    return Run(*command, {words.begin() + own_words, words.end()});
  } catch (const std::exception& error) {
    std::cerr << "fileindexctl: " << error.what() << '\n';
    return quarrox::ctl::kFailed;
  }
}
