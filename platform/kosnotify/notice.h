// One notice to people, as a program's arguments name it.
#pragma once

#include <stdexcept>
#include <string>
#include <vector>

namespace quarrox::kosnotify {

extern const char* const kUsage;

// What is wrong with the arguments, for people.
class UsageError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

struct Notice {
  std::string application;  // "VEXO.Quarrox.Application"
  std::string recipient;    // "@administrators": a group
  std::string key;          // of the message: "error:lack_of_memory"
  std::string title;        // for people, on one line, like the text
  std::string text;
};

// Reads the words behind the program's name: options, then recipient, the title's key, the message's key, and what the
// message is filled with. A key without a text of its own stands for itself. Throws UsageError.
Notice ParseNotice(const std::vector<std::string>& words);

}  // namespace quarrox::kosnotify
