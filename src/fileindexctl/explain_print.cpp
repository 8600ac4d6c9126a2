#include <ctime>
#include <iostream>

#include "common/json.h"
#include "explain.h"
#include "output.h"

namespace quarrox::ctl {
namespace {

template <typename T>
Json::Value OrNull(const std::optional<T>& value) {
  return value ? Json::Value(*value) : Json::Value();
}

Json::Value AsJson(const fileindex::IndexFailure& failure) {
  Json::Value object;
  object["code"] = failure.code;
  object["reason"] = failure.reason;
  object["tried"] = Json::Int64{failure.tried};
  object["tries"] = failure.tries;
  object["next_try"] = OrNull(failure.NextTry());
  return object;
}

Json::Value AsJson(const Readers& readers) {
  Json::Value object;
  object["who"] = readers.who;
  object["on_the_way"] = Json::Value(Json::arrayValue);
  for (const Readers::Step& step : readers.steps) {
    Json::Value& entry = object["on_the_way"].append(Json::Value(Json::objectValue));
    entry["directory"] = step.directory;
    entry["who"] = step.who;
  }
  return object;
}

Json::Value AsJson(const Access& access) {
  Json::Value object;
  object["may_find"] = access.reason.empty();
  object["refused_by"] = access.refused_by;
  object["reason"] = access.reason;
  object["remedy"] = access.remedy;
  return object;
}

Json::Value AsJson(const fileindex::Folder* folder) {
  if (folder == nullptr) return {};
  Json::Value object;
  object["path"] = folder->GetPath();
  object["name"] = folder->GetName();
  object["types"] = TypesOf(*folder);
  return object;
}

void PrintRow(const char* name, const std::string& value) {
  std::cout << name << std::string(11 - std::string_view(name).size(), ' ') << Visible(value) << '\n';
}

const char* Describe(const std::optional<bool>& answer) {
  return !answer ? "cannot be told" : *answer ? "yes" : "no";
}

std::string TimeOf(time_t time) {
  tm parts = {};
  char text[32] = "";
  if (localtime_r(&time, &parts) != nullptr) strftime(text, sizeof(text), "%F %T", &parts);
  return text;
}

// What the index holds of it, and since when.
std::string DescribeDocument(const Explanation& explanation) {
  const Fate& fate = explanation.fate;
  if (!fate.is_indexed.value_or(false)) return Describe(fate.is_indexed);
  const std::string text = fate.indexed_at ? "yes, since " + TimeOf(*fate.indexed_at) : "yes, since when is not known";
  const bool lacks_contents = fate.failure && fate.failure->has_document;
  const bool are_unwanted = explanation.folder != nullptr && !explanation.wants_contents;
  if (lacks_contents || (are_unwanted && explanation.file_type != "directory")) {
    return text + ", without its contents";
  }
  return fate.text_bytes.value_or(0) == 0 ? text : text + ", with " + SizeText(*fate.text_bytes) + " of text";
}

void PrintFate(const Explanation& explanation) {
  const Fate& fate = explanation.fate;
  const std::string state = fate.share_state.empty() ? "" : "; its share: " + fate.share_state;
  PrintRow("pending", Describe(fate.is_pending) + state);
  PrintRow("indexed", DescribeDocument(explanation));
  if (!fate.paused.empty()) PrintRow("paused", fate.paused);
  if (!fate.failure) return;
  const std::optional<int64_t> next = fate.failure->NextTry();
  PrintRow("failed", TimeOf(fate.failure->tried) + ": " + fate.failure->reason + " (code " +
                         std::to_string(fate.failure->code) + ")");
  PrintRow("next try", next ? TimeOf(*next) : "when it changes, or a reindex asks for it");
}

std::string DescribeFolder(const Explanation& explanation) {
  const fileindex::Folder* folder = explanation.folder.get();
  if (folder == nullptr) return explanation.is_folder_known ? "none, so it is not indexed" : "cannot be told";
  const std::string types = TypesOf(*folder);
  return folder->GetPath() + " (" + folder->GetName() + "), " +
         (types == "none" ? "names, and the contents of files of no known type" : "contents of these types: " + types);
}

}  // namespace

void PrintAsJson(const Explanation& explanation) {
  const Fate& fate = explanation.fate;
  Json::Value object;
  object["path"] = explanation.path;
  object["share"] = explanation.share;
  object["share_path"] = explanation.share_path;
  object["folder"] = AsJson(explanation.folder.get());
  object["file_type"] = explanation.file_type;
  object["indexable"] = !explanation.refusal;
  Describe(explanation.refusal, object);
  object["remedy"] = explanation.remedy;
  object["pending"] = OrNull(fate.is_pending);
  object["share_state"] = fate.share_state;
  object["indexed"] = OrNull(fate.is_indexed);
  object["indexed_at"] = OrNull(fate.indexed_at);
  object["wants_contents"] = explanation.wants_contents;
  object["text_bytes"] = OrNull(fate.text_bytes);
  object["paused"] = !fate.paused.empty();
  object["failure"] = fate.failure ? AsJson(*fate.failure) : Json::Value();
  object["readers"] = AsJson(explanation.readers);
  if (!explanation.user.empty()) object["as"] = AsJson(explanation.access);
  std::cout << toString(object) << '\n';
}

void PrintAsText(const Explanation& explanation) {
  PrintRow("path", explanation.path);
  PrintRow("share", explanation.share.empty() ? "none" : explanation.share + " (" + explanation.share_path + ")");
  PrintRow("folder", DescribeFolder(explanation));
  PrintRow("type", explanation.file_type);
  if (explanation.refusal) {
    PrintRow("indexable", "no: " + explanation.refusal.reason + " (rule " + explanation.refusal.rule + ")");
  } else {
    PrintRow("indexable", "yes");
    PrintFate(explanation);
  }
  if (!explanation.remedy.empty()) PrintRow("remedy", explanation.remedy);
  if (!explanation.refusal) PrintRow("found by", Describe(explanation.readers));
  if (explanation.user.empty()) return;
  const std::string& refused = explanation.access.reason;
  PrintRow("as", explanation.user + ": " +
                     (!refused.empty()      ? refused
                      : explanation.refusal ? "may read it"
                                            : "may find it"));
  if (!explanation.access.remedy.empty()) PrintRow("remedy", explanation.access.remedy);
}

}  // namespace quarrox::ctl
