#include "common/sdk/share.h"

#include <iostream>
#include <string>
#include <vector>

#include "command.h"
#include "common/error.h"
#include "common/json.h"
#include "output.h"
#include "refusal.h"

namespace quarrox::ctl {
namespace {

using sdk::SDKShare;

// What is wrong in the configuration goes to standard error, beside whatever is printed.
void PrintConfigProblems() {
  for (const std::string& problem : SDKShare::ConfigProblems()) {
    std::cerr << "fileindexctl: " << Visible(problem) << '\n';
  }
}

// Calls what needs the list of shares; where that fails, a mistake in the configuration is the likely cause.
template <typename Call>
auto WithConfigProblems(const Call& call) {
  try {
    return call();
  } catch (const Error& error) {
    if (error.code == kErrNoSuchShare || error.code == kErrShareEnum) PrintConfigProblems();
    throw;
  }
}

Json::Value AsJson(const SDKShare& share) {
  Json::Value object;
  object["name"] = share.GetName();
  object["path"] = share.GetPath();
  const Refusal refusal = RefusalOf(share);
  object["can_be_indexed"] = !refusal;
  if (refusal) Describe(refusal, object);
  return object;
}

Json::Value AllAsJson(const SDKShare& share) {
  Json::Value object = AsJson(share);
  object["index_id"] = share.GetDBName();
  object["db_path"] = share.GetDBPath();
  object["queue_path"] = share.GetQueuePath();
  object["is_encryption"] = share.IsEncryption();
  object["recycle_bin"] = share.IsEnableRecycleBin();
  object["hide_unreadable"] = share.IsHideUnReadable();
  object["space_enough"] = share.IsSpaceEnough();
  return object;
}

const char* YesNo(bool value) {
  return value ? "yes" : "no";
}

void PrintRow(const char* name, const std::string& value) {
  std::cout << name << Visible(value) << '\n';
}

void PrintShare(const SDKShare& share) {
  PrintRow("name             ", share.GetName());
  PrintRow("directory        ", share.GetPath());
  PrintRow("index            ", share.GetDBName());
  PrintRow("index directory  ", share.GetDBPath());
  PrintRow("queue            ", share.GetQueuePath());
  PrintRow("encrypted        ", YesNo(share.IsEncryption()));
  PrintRow("recycle bin      ", YesNo(share.IsEnableRecycleBin()));
  PrintRow("hides unreadable ", YesNo(share.IsHideUnReadable()));
  PrintRow("room for index   ", YesNo(share.IsSpaceEnough()));
  const Refusal refusal = RefusalOf(share);
  PrintRow("can be indexed   ", refusal ? "no: " + refusal.reason : "yes");
  if (refusal) PrintRow("remedy           ", refusal.remedy);
}

// A share may go while the list is walked; it is then left out.
template <typename Use>
void ForEachShare(const Use& use) {
  for (const std::string& name : SDKShare::Enum()) {
    try {
      use(SDKShare(name));
    } catch (const Error& error) {
      if (error.code != kErrNoSuchShare) throw;
    }
  }
}

}  // namespace

int ShareList(const Arguments& arguments) {
  WithConfigProblems([&] {
    if (arguments.Has("--json")) {
      ForEachShare([](const SDKShare& share) { std::cout << toString(AsJson(share)) << '\n'; });
      return;
    }
    std::vector<std::vector<std::string>> rows = {{"SHARE", "DIRECTORY", "CAN BE INDEXED"}};
    ForEachShare([&](const SDKShare& share) {
      const Refusal refusal = RefusalOf(share);
      rows.push_back({Visible(share.GetName()), Visible(share.GetPath()),
                      refusal ? Visible("no: " + refusal.reason + "; " + refusal.remedy) : "yes"});
    });
    if (rows.size() > 1) PrintTable(std::cout, rows);
    if (rows.size() == 1) std::cerr << "fileindexctl: there are no shares; name some in /etc/vexo/shares.conf\n";
  });
  std::cout.flush();
  PrintConfigProblems();
  return kDone;
}

int ShareShow(const Arguments& arguments) {
  WithConfigProblems([&] {
    const SDKShare share(arguments.operands().front());
    if (arguments.Has("--json")) {
      std::cout << toString(AllAsJson(share)) << '\n';
    } else {
      PrintShare(share);
    }
  });
  return kDone;
}

}  // namespace quarrox::ctl
