#include <charconv>
#include <iostream>
#include <string>

#include "command.h"
#include "common/error.h"
#include "common/json.h"
#include "fileindex/status_mgr.h"
#include "output.h"

namespace quarrox::ctl {
namespace {

using fileindex::StatusMgr;

int HoursOf(const std::string& text) {
  int hours = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), hours);
  if (error != std::errc() || end != text.data() + text.size()) {
    throw UsageError("HOURS is a whole number, not '" + text + "'");
  }
  return hours;
}

// The setters save before they tell the daemon: where only that failed, people are to know that the change holds.
template <typename Set>
int Change(const Arguments& arguments, const Set& set) {
  StatusMgr status;
  try {
    set(status);
  } catch (const Error& error) {
    if (error.code == kErrSystem && StatusMgr().GetPauseInfo() == status.GetPauseInfo()) {
      std::cerr << "fileindexctl: saved: " << DescribePause(status.GetPauseInfo())
                << "; but fileindexd was not reached\n";
    }
    throw;
  }
  const int64_t resume_time = status.GetPauseInfo();
  if (arguments.Has("--json")) {
    Json::Value answer;
    answer["resume_time"] = static_cast<Json::Int64>(resume_time);
    std::cout << toString(answer) << '\n';
  } else {
    std::cout << DescribePause(resume_time) << '\n';
  }
  return kDone;
}

}  // namespace

int Pause(const Arguments& arguments) {
  const int hours = arguments.operands().empty() ? 0 : HoursOf(arguments.operands().front());
  return Change(arguments, [&](StatusMgr& status) { status.Pause(hours); });
}

int Resume(const Arguments& arguments) {
  return Change(arguments, [](StatusMgr& status) { status.Resume(); });
}

}  // namespace quarrox::ctl
