// What clients tell the daemon, and what it answers.
#pragma once

#include <string>

#include "common/error.h"

namespace quarrox::fileindexd {

struct Command {
  enum Type {
    kWorkerCreate,    // the share's worker is to run
    kWorkerDelete,    // it is to stay away until it is created again
    kSettingChanged,  // the list of folders has changed, for this share
    kPauseChanged,    // the state of pausing has changed
  };
  Type type = kSettingChanged;
  std::string share;  // empty for what concerns all
};

// The longest request in bytes, with its terminating zero.
inline constexpr size_t kMaxRequest = size_t{1} << 20;

// A request's text as a command. Throws Error 120, which is not logged, with a reason that is fit for the answer.
Command ParseCommand(const std::string& text);

// Answers as whole frames.
std::string Acceptance();
std::string Refusal(ErrorCode code, const std::string& reason);

}  // namespace quarrox::fileindexd
