// Why something cannot be indexed, in the words of fileindexctl.
#pragma once

#include <string>

#include <json/json.h>

#include "common/sdk/share.h"
#include "fileindex/util.h"

namespace quarrox::ctl {

// All texts are empty where nothing is refused.
struct Refusal {
  std::string rule = {};    // one word
  std::string reason = {};  // the rest of a sentence
  std::string remedy = {};  // what to do

  explicit operator bool() const { return !rule.empty(); }
};

Refusal AsRefusal(const fileindex::PathVerdict& verdict);

// Why a whole share cannot be indexed.
Refusal RefusalOf(const sdk::SDKShare& share);

// Why a path cannot be indexed, a reason that holds for its whole share included.
Refusal RefusalOf(const std::string& full_path);

// Sets the members "rule", "reason" and "remedy".
void Describe(const Refusal& refusal, Json::Value& object);

}  // namespace quarrox::ctl
