#include <iostream>

#include "common/error.h"
#include "common/json.h"
#include "common/sdk/share.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_failures.h"
#include "output.h"
#include "status.h"

namespace quarrox::ctl {
namespace {

using fileindex::IndexFailure;
using fileindex::IndexFailures;

void PrintFailure(const std::string& share, const std::string& path, const IndexFailure& failure, bool json) {
  const std::optional<int64_t> next = failure.NextTry();
  if (!json) {
    std::cout << Visible(path) << "\n    " << LocalTime(failure.tried) << ": " << Visible(failure.reason)
              << "; tried again " << (next ? LocalTime(*next) : "when it changes") << '\n';
    return;
  }
  Json::Value object;
  object["share"] = share;
  object["path"] = path;
  object["code"] = failure.code;
  object["reason"] = failure.reason;
  object["tried"] = Json::Int64{failure.tried};
  object["next_try"] = next ? Json::Value(Json::Int64{*next}) : Json::Value();
  std::cout << toString(object) << '\n';
}

// A share that is gone has none.
void PrintFailuresOf(const std::string& name, bool json) {
  try {
    const sdk::SDKShare share(name);
    const IndexFailures failures(IndexFailures::FileOf(share));
    for (const std::string& place : failures.AtOrBelow("")) {
      PrintFailure(name, share.GetPath() + place, *failures.Find(place), json);
    }
    if (failures.omitted() != 0) {
      std::cerr << "fileindexctl: and " << failures.omitted() << " more in the share " << Visible(name) << '\n';
    }
  } catch (const Error& error) {
    if (error.code != kErrNoSuchShare) throw;
  }
}

}  // namespace

int PrintFailures(bool json) {
  for (const std::string& share : fileindex::FolderMgr().GetIndexedShares()) PrintFailuresOf(share, json);
  return 0;
}

}  // namespace quarrox::ctl
