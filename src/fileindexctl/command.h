// What all commands of fileindexctl share: the table, the words behind a command, the exit status.
#pragma once

#include <cstddef>
#include <map>
#include <set>
#include <stdexcept>
#include <string>
#include <vector>

namespace quarrox::ctl {

// The exit statuses.
constexpr int kDone = 0;
constexpr int kFailed = 1;
constexpr int kUsage = 2;

// Bad usage: what is wrong, for people.
class UsageError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// The words behind a command, options apart from the rest. "--" ends the options; "-1" is a number.
//
// A known option that takes a value has "=" at its end, "--limit="; people write "--limit=9" or "--limit 9". Of an
// option that is given twice the last value counts.
class Arguments {
 public:
  // Throws UsageError for an option that is not known, lacks its value, or takes none.
  Arguments(const std::vector<std::string>& words, const std::set<std::string>& known_options);

  // Options are named without "=" here.
  bool Has(const std::string& option) const { return options_.count(option) != 0; }
  std::string Value(const std::string& option, const std::string& otherwise) const;
  // Throws UsageError where the value is no decimal number, or too large.
  size_t Number(const std::string& option, size_t otherwise) const;
  const std::vector<std::string>& operands() const { return operands_; }

 private:
  std::map<std::string, std::string> options_;  // with their values
  std::vector<std::string> operands_;
};

struct Command {
  const char* noun;
  const char* verb;               // empty for a command of one word
  const char* synopsis;           // what follows
  const char* help;               // one line
  std::set<std::string> options;  // as Arguments knows them; help.cpp says what each does
  size_t operands;                // how many it takes
  int (*run)(const Arguments& arguments);
  size_t optional_operands = 0;  // how many more it takes
};

// The words that name a command.
std::string NameOf(const Command& command);

// Every command, in the order of the help.
const std::vector<Command>& Commands();

int Audit(const Arguments& arguments);
int Call(const Arguments& arguments);
int Doctor(const Arguments& arguments);
int FolderAdd(const Arguments& arguments);
int FolderDelete(const Arguments& arguments);
int FolderGet(const Arguments& arguments);
int FolderGroups(const Arguments& arguments);
int FolderList(const Arguments& arguments);
int FolderPause(const Arguments& arguments);
int FolderReindex(const Arguments& arguments);
int FolderResume(const Arguments& arguments);
int FolderSet(const Arguments& arguments);
int FolderSummary(const Arguments& arguments);
int Help(const Arguments& arguments);
int Pause(const Arguments& arguments);
int QueueFold(const Arguments& arguments);
int QueueList(const Arguments& arguments);
int QueueShow(const Arguments& arguments);
int Resume(const Arguments& arguments);
int Search(const Arguments& arguments);
int ShareAutoClean(const Arguments& arguments);
int ShareCheckRecycle(const Arguments& arguments);
int ShareClearPaused(const Arguments& arguments);
int ShareList(const Arguments& arguments);
int ShareMigrate(const Arguments& arguments);
int SharePause(const Arguments& arguments);
int ShareRebuild(const Arguments& arguments);
int ShareRename(const Arguments& arguments);
int ShareResume(const Arguments& arguments);
int ShareShow(const Arguments& arguments);
int Metrics(const Arguments& arguments);
int Status(const Arguments& arguments);
int SuggestRebuild(const Arguments& arguments);
int ExplainPath(const Arguments& arguments);

}  // namespace quarrox::ctl
