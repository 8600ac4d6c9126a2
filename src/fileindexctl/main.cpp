// fileindexctl: looks at the full-text index of shared folders and works on it.
#include <unistd.h>

#include <exception>
#include <iostream>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "command.h"
#include "common/error.h"
#include "common/json.h"
#include "help.h"
#include "output.h"

namespace {

using quarrox::ctl::Arguments;
using quarrox::ctl::Command;
using quarrox::ctl::NameOf;

int Usage(const std::string& what) {
  std::cerr << "fileindexctl: " << what << "\ntry: fileindexctl --help\n";
  return quarrox::ctl::kUsage;
}

// What a person may make of an error's number; empty where the reason says all.
const char* MeaningOf(int code) {
  static const std::map<int, const char*> meanings = {
      {quarrox::kErrJsonLoad, "a file of the system is damaged; 'fileindexctl doctor' says what to do"},
      {quarrox::kErrShareEnum, "the shares cannot be listed"},
      {quarrox::kErrNoSuchShare, "there is no such share"},
      {quarrox::kErrFolderExists, "the folder is indexed already"},
      {quarrox::kErrNoSuchFolder, "there is no such folder"},
      {quarrox::kErrPathNotIndexable, "the folder cannot be indexed; 'fileindexctl explain' says why"},
      {quarrox::kErrNoSpace, "there is no room for an index"},
  };
  const auto meaning = meanings.find(code);
  return meaning == meanings.end() ? "" : meaning->second;
}

bool IsOfTheSystem(int code) {
  return (quarrox::kErrSystem <= code && code <= quarrox::kErrLockFile) || code == quarrox::kErrEngineReceive;
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
    // The system's files and sockets are root's; what is missing then reads like a fault of the system.
    if (geteuid() != 0 && IsOfTheSystem(code)) std::cerr << " (run it as root?)";
    std::cerr << '\n';
  }
  return quarrox::ctl::kFailed;
}

int Run(const Command& command, const std::vector<std::string>& words) {
  std::set<std::string> options = command.options;
  options.insert({"--help", "-h"});
  const Arguments arguments(words, options);
  if (arguments.Has("--help") || arguments.Has("-h")) {
    quarrox::ctl::PrintHelp(std::cout, {command.noun, command.verb});
    return quarrox::ctl::kDone;
  }
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
}

bool IsHelp(const std::string& word) {
  return word == "--help" || word == "-h";
}

int RunWords(const std::vector<std::string>& words) {
  if (words.empty()) return Usage("a command is missing");
  if (words[0] == "--version") {
    std::cout << "fileindexctl " FILEINDEX_VERSION "\n";
    return quarrox::ctl::kDone;
  }
  const Command* command = quarrox::ctl::FindCommand(words);
  if (command != nullptr) return Run(*command, {words.begin() + (*command->verb == '\0' ? 1 : 2), words.end()});
  const bool all = IsHelp(words[0]);
  if (!all && (words.size() == 1 || !IsHelp(words[1]))) throw quarrox::ctl::NoSuchCommand(words);
  quarrox::ctl::PrintHelp(std::cout, {words.begin(), words.begin() + (all ? 0 : 1)});
  return quarrox::ctl::kDone;
}

}  // namespace

int main(int argc, char** argv) {
  std::ios::sync_with_stdio(false);
  try {
    return RunWords({argv + 1, argv + argc});
  } catch (const quarrox::ctl::UsageError& error) {
    return Usage(error.what());
  } catch (const std::exception& error) {
    std::cerr << "fileindexctl: " << error.what() << '\n';
    return quarrox::ctl::kFailed;
  }
}
