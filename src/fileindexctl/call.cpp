// `call`: any operation that the library exports, by its name, for scripts that have no command of their own for it.
#include <cstddef>
#include <cstdint>
#include <functional>
#include <iostream>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include "command.h"
#include "common/error.h"
#include "common/json.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"

namespace quarrox::ctl {
namespace {

using fileindex::FolderMgr;
using fileindex::StatusMgr;
using Values = std::vector<Json::Value>;

struct Parameter {
  const char* name;
  const char* kind;  // of JSON, for people
  bool (*accepts)(const Json::Value& value);
};

struct Operation {
  const char* name;
  std::vector<Parameter> parameters;
  std::function<Json::Value(const Values& arguments)> run;
};

// --- an operation from its function ----------------------------------------------------------------------------------
// Number and kinds of the arguments are those of the function, so that the table below cannot say otherwise.

template <typename T>
using Plain = std::remove_cvref_t<T>;

template <typename T>
const char* KindOf() {
  if (std::is_same_v<T, std::string>) return "a string";
  if (std::is_same_v<T, bool>) return "true or false";
  if (std::is_same_v<T, int> || std::is_same_v<T, int64_t>) return "a whole number";
  return std::is_same_v<T, unsigned int> ? "a whole number that is not negative" : "an array";
}

template <typename... P, typename Run, size_t... I>
Operation Describe(const char* name, Run run, const std::vector<const char*>& names, std::index_sequence<I...>) {
  return {name,
          {Parameter{names[I], KindOf<Plain<P>>(), isJsonType<Plain<P>>}...},
          [run]([[maybe_unused]] const Values& arguments) { return run(asJsonType<Plain<P>>(arguments[I])...); }};
}

// One that has no result.
template <typename... P, typename... Names>
Operation Change(const char* name, void (*function)(P...), Names... names) {
  static_assert(sizeof...(P) == sizeof...(Names));
  const auto run = [function](const Plain<P>&... arguments) {
    function(arguments...);
    return Json::Value();
  };
  return Describe<P...>(name, run, {names...}, std::index_sequence_for<P...>());
}

// One that fills its first parameter.
template <typename... P, typename... Names>
Operation Question(const char* name, void (*function)(Json::Value&, P...), Names... names) {
  static_assert(sizeof...(P) == sizeof...(Names));
  const auto run = [function](const Plain<P>&... arguments) {
    Json::Value result;
    function(result, arguments...);
    return result;
  };
  return Describe<P...>(name, run, {names...}, std::index_sequence_for<P...>());
}

void UpsertMonitor(const std::string& share_name) {
  FolderMgr folder_mgr;
  fileindex::UpsertVEXONotifydCfg(share_name, folder_mgr);
}

void AskProcessingStatus(Json::Value& result) {
  result = fileindex::GetIndexProcessingStatus();
}

void PauseIndexing(int hours) {
  StatusMgr().Pause(hours);
}

void ResumeIndexing() {
  StatusMgr().Resume();
}

const std::vector<Operation>& Operations() {
  static const std::vector<Operation> operations = {
      Question("FolderList", fileindex::FolderList, "offset", "limit", "sort_by", "sort_direction", "group", "keyword",
               "additional"),
      Question("FolderGet", fileindex::FolderGet, "path"),
      Question("FolderListGroups", fileindex::FolderListGroups),
      Question("FolderSummary", fileindex::FolderSummary),
      Change("FolderAdd", fileindex::FolderAdd, "folder_list", "updater_mode"),
      Change("FolderSet", fileindex::FolderSet, "folder_list", "updater_mode"),
      Question("FolderChange", fileindex::FolderChange, "path", "changes"),
      Change<const Json::Value&>("FolderDelete", fileindex::FolderDelete, "path_list"),
      Change<const std::string&>("FolderDeleteByShare", fileindex::FolderDelete, "share_name"),
      Change("FolderPause", fileindex::FolderPause, "path", "resume_time"),
      Change("FolderResume", fileindex::FolderResume, "path"),
      Change("FolderReindex", fileindex::FolderReindex, "path_list"),
      Change("ShareRename", fileindex::ShareRename, "share_from", "share_to"),
      Change("ShareMigrate", fileindex::ShareMigrate, "share_name", "path_from", "path_to"),
      Change("ShareCheckRecycle", fileindex::ShareCheckRecycle, "share_name"),
      Change("SharePause", fileindex::SharePause, "share_name"),
      Change("ShareResume", fileindex::ShareResume, "share_name"),
      Change("ShareRebuild", fileindex::ShareRebuild, "share_name"),
      Change("ShareAutoClean", fileindex::ShareAutoClean, "share_name"),
      Change("ShareClearPaused", fileindex::ShareClearPaused, "share_name", "share_path"),
      Change("VolumePause", fileindex::VolumePause, "mount_point"),
      Change("VolumeResume", fileindex::VolumeResume, "mount_point"),
      Change("VolumeClean", fileindex::VolumeClean, "mount_point"),
      Change("UserRename", fileindex::UserRename, "user_from", "user_to"),
      Change("UserDelete", fileindex::UserDelete, "user_name"),
      Change("HomeEnable", fileindex::HomeEnable, "enable"),
      Change("PrepareServices", fileindex::PrepareServices),
      Change("UpsertVEXONotifydCfg", UpsertMonitor, "share_name"),
      Change("DeleteVEXONotifydCfg", fileindex::DeleteVEXONotifydCfg, "share_name"),
      Question("GetIndexProcessingStatus", AskProcessingStatus),
      Change("UpdateTermSuggestion", fileindex::UpdateTermSuggestion),
      Change("Pause", PauseIndexing, "hours"),
      Change("Resume", ResumeIndexing),
  };
  return operations;
}

// --- the command -----------------------------------------------------------------------------------------------------

std::string SynopsisOf(const Operation& operation) {
  std::string synopsis = operation.name;
  for (const Parameter& parameter : operation.parameters) synopsis.append(1, ' ').append(parameter.name);
  return synopsis;
}

const Operation& Find(const std::vector<std::string>& words) {
  std::string all;
  for (const Operation& operation : Operations()) {
    if (!words.empty() && words.front() == operation.name) return operation;
    all += "\n  " + SynopsisOf(operation);
  }
  throw UsageError((words.empty() ? "an operation is missing" : "unknown operation '" + words.front() + "'") +
                   "; there are" + all);
}

[[noreturn]] void Refuse(const Operation& operation, size_t index, const std::string& what) {
  throw Error(kErrBadParameter, "argument " + std::to_string(index + 1) + " of " + operation.name + " (" +
                                    operation.parameters[index].name + ") " + what);
}

Values Read(const Operation& operation, const std::vector<std::string>& texts) {
  Values values(texts.size());
  for (size_t i = 0; i < texts.size(); ++i) {
    if (!fromString(values[i], texts[i])) {
      Refuse(operation, i, "is no JSON: " + texts[i] + "; a string is written in double quotes, '\"...\"'");
    }
    const Parameter& parameter = operation.parameters[i];
    if (!parameter.accepts(values[i])) Refuse(operation, i, std::string("is not ") + parameter.kind + ": " + texts[i]);
  }
  return values;
}

}  // namespace

int Call(const Arguments& arguments) {
  const Operation& operation = Find(arguments.operands());
  const std::vector<std::string> texts(arguments.operands().begin() + 1, arguments.operands().end());
  if (texts.size() != operation.parameters.size()) {
    throw UsageError("usage: fileindexctl call " + SynopsisOf(operation));
  }
  Json::Value answer;
  answer["data"] = operation.run(Read(operation, texts));
  answer["success"] = true;
  std::cout << toString(answer) << '\n';
  return kDone;
}

}  // namespace quarrox::ctl
