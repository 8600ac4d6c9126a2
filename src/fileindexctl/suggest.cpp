#include <iostream>

#include "command.h"
#include "common/json.h"
#include "fileindex/index_mgr.h"

namespace quarrox::ctl {

int SuggestRebuild(const Arguments& arguments) {
  fileindex::UpdateTermSuggestion();
  if (arguments.Has("--json")) {
    Json::Value answer;
    answer["success"] = true;
    std::cout << toString(answer) << '\n';
  } else {
    std::cout << "no term suggestions are missing\n";
  }
  return kDone;
}

}  // namespace quarrox::ctl
