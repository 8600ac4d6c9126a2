// What all commands of fileindexctl share: the table, the words behind a command, the exit status.
#pragma once

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

// The words behind a command, options apart from the rest. "--" ends the options.
class Arguments {
 public:
  Arguments(const std::vector<std::string>& words, const std::set<std::string>& known_options);

  bool Has(const std::string& option) const { return options_.count(option) != 0; }
  const std::vector<std::string>& operands() const { return operands_; }

 private:
  std::set<std::string> options_;
  std::vector<std::string> operands_;
};

struct Command {
  const char* noun;
  const char* verb;      // empty for a command of one word
  const char* synopsis;  // what follows
  const char* help;      // one line
  std::set<std::string> options;
  size_t operands;  // how many it takes
  int (*run)(const Arguments& arguments);
};

// The words that name a command.
std::string NameOf(const Command& command);

// Every command, in the order of the help.
const std::vector<Command>& Commands();

int QueueFold(const Arguments& arguments);
int ShareList(const Arguments& arguments);
int ShareShow(const Arguments& arguments);
int ExplainPath(const Arguments& arguments);

}  // namespace quarrox::ctl
