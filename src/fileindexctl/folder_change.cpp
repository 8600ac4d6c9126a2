#include <algorithm>
#include <array>
#include <functional>
#include <iostream>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "command.h"
#include "common/error.h"
#include "common/json.h"
#include "common/sdk/share.h"
#include "common/strings.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/util.h"
#include "output.h"
#include "refusal.h"
#include "typed_path.h"

namespace quarrox::ctl {
namespace {

using fileindex::FolderMgr;

constexpr std::array kTypes = {"document", "audio", "video", "photo"};

void Tell(const std::string& what) {
  std::cerr << "fileindexctl: " << Visible(what) << '\n';
}

// --- paths -----------------------------------------------------------------------------------------------------------

std::vector<std::string> SharePaths(const Arguments& arguments) {
  const std::set<std::string> shares = sdk::SDKShare::Enum();
  std::vector<std::string> paths;
  for (const std::string& typed : arguments.operands()) paths.push_back(AsSharePath(typed, shares));
  return paths;
}

// --- records ---------------------------------------------------------------------------------------------------------

void SetTypes(Json::Value& record, const std::string& types) {
  for (const char* type : kTypes) record[type] = false;
  if (types == "none") return;
  for (size_t begin = 0; begin <= types.size();) {
    const size_t end = std::min(types.find(',', begin), types.size());
    const std::string type = types.substr(begin, end - begin);
    if (std::find(kTypes.begin(), kTypes.end(), type) == kTypes.end()) {
      throw UsageError("option --types knows no type '" + type + "'; it takes document, audio, video, photo, or none");
    }
    record[type] = true;
    begin = end + 1;
  }
}

// Takes what the options say into a record. Returns whether they say anything.
bool TakeOptions(Json::Value& record, const Arguments& arguments) {
  bool taken = false;
  for (const auto& [option, member] :
       {std::pair("--name", "name"), std::pair("--group", "group"), std::pair("--owner", "owner")}) {
    if (!arguments.Has(option)) continue;
    record[member] = arguments.Value(option, "");
    taken = true;
  }
  if (!arguments.Has("--types")) return taken;
  SetTypes(record, arguments.Value("--types", ""));
  return true;
}

Json::Value NewRecord(const std::string& path) {
  return fileindex::Folder(path, Basename(path), "", "", true, true, true, true, false, false).GetData();
}

// --- answers ---------------------------------------------------------------------------------------------------------

// The paths that an operation took, and those that it passed over.
struct Outcome {
  std::vector<std::string> done = {};
  std::vector<std::string> passed_over = {};
};

int Answer(const Arguments& arguments, Json::Value answer, const std::vector<std::string>& paths, const char* done) {
  if (arguments.Has("--json")) {
    answer["success"] = true;
    std::cout << toString(answer) << '\n';
  } else {
    for (const std::string& path : paths) std::cout << Visible(path) << ": " << done << '\n';
  }
  return kDone;
}

int Answer(const Arguments& arguments, const Outcome& outcome, const char* done, const char* why_passed_over) {
  for (const std::string& path : outcome.passed_over) Tell(path + ": " + why_passed_over + ", passed over");
  Json::Value answer;
  answer["path"] = Vec2JsonArr(outcome.done);
  answer["passed_over"] = Vec2JsonArr(outcome.passed_over);
  return Answer(arguments, answer, outcome.done, done);
}

// Why a path is refused and what to do; nothing where that cannot be told either.
void TellRefusal(const std::string& path) {
  try {
    Refusal refusal = RefusalOf(sdk::SDKShare(fileindex::GetShareNameByPath(path)));
    if (!refusal) refusal = RefusalOf(fileindex::GetFullPath(path));
    if (refusal) Tell(path + ": " + refusal.reason + "; " + refusal.remedy);
  } catch (const Error&) {
    // The refusal itself has been reported.
  }
}

// Calls an operation whose failure people can do something about.
void Run(const std::vector<std::string>& paths, const std::function<void()>& operation) {
  try {
    operation();
  } catch (const Error& error) {
    if (error.code == kErrPathNotIndexable) std::for_each(paths.begin(), paths.end(), TellRefusal);
    if (error.code == kErrNoSuchShare && FolderMgr().IsShareIndexed(error.reason)) {
      Tell("if the share is gone for good: fileindexctl share clear-paused " + error.reason + " PATH");
    }
    throw;
  }
}

Outcome Divide(const std::vector<std::string>& paths, const std::function<bool(const std::string& path)>& is_taken) {
  Outcome outcome;
  for (const std::string& path : paths) (is_taken(path) ? outcome.done : outcome.passed_over).push_back(path);
  return outcome;
}

}  // namespace

int FolderAdd(const Arguments& arguments) {
  if (arguments.operands().size() > 1 && arguments.Has("--name")) {
    throw UsageError("option --name is for one folder only");
  }
  const std::vector<std::string> paths = SharePaths(arguments);
  Json::Value records(Json::arrayValue);
  for (const std::string& path : paths) TakeOptions(records.append(NewRecord(path)), arguments);
  Run(paths, [&] { fileindex::FolderAdd(records, false); });
  Json::Value answer;
  answer["folder"] = records;
  return Answer(arguments, answer, paths, "added");
}

int FolderSet(const Arguments& arguments) {
  const std::vector<std::string> paths = SharePaths(arguments);
  Json::Value changes(Json::objectValue);
  if (!TakeOptions(changes, arguments)) throw UsageError("there is nothing to change; see: fileindexctl --help");
  Json::Value record;
  Run(paths, [&] { fileindex::FolderChange(record, paths.front(), changes); });
  Json::Value answer;
  answer["folder"].append(record);
  return Answer(arguments, answer, paths, "changed");
}

int FolderDelete(const Arguments& arguments) {
  const std::vector<std::string> paths = SharePaths(arguments);
  const FolderMgr folder_mgr;
  const Outcome outcome = Divide(paths, [&](const std::string& path) { return folder_mgr.HasFolder(path); });
  Run(paths, [&] { fileindex::FolderDelete(Vec2JsonArr(paths)); });
  return Answer(arguments, outcome, "deleted", "there is no such folder");
}

int FolderReindex(const Arguments& arguments) {
  const std::vector<std::string> paths = SharePaths(arguments);
  const FolderMgr folder_mgr;
  const Outcome outcome = Divide(
      paths, [&](const std::string& path) { return folder_mgr.IsShareIndexed(fileindex::GetShareNameByPath(path)); });
  Run(paths, [&] { fileindex::FolderReindex(Vec2JsonArr(paths)); });
  return Answer(arguments, outcome, "a reindex waits in the queue", "no folder of this share is indexed");
}

int FolderSummary(const Arguments& arguments) {
  Json::Value summary;
  Run({}, [&] { fileindex::FolderSummary(summary); });
  if (arguments.Has("--json")) {
    std::cout << toString(summary) << '\n';
    return kDone;
  }
  std::vector<std::vector<std::string>> rows = {{"FOLDER OR GROUP", "STATUS"}};
  for (const Json::Value& item : summary["items"]) {
    const std::string name = item["name"].asString();
    rows.push_back({Visible(item.isMember("group") ? name + " (group)" : name), item["text"].asString()});
  }
  if (rows.size() > 1) PrintTable(std::cout, rows);
  std::cout << (rows.size() > 1 ? "\n" : "") << "all: " << summary["status"].asString() << '\n';
  return kDone;
}

}  // namespace quarrox::ctl
