#include <unistd.h>

#include <ctime>
#include <iostream>
#include <memory>
#include <optional>
#include <string>

#include "command.h"
#include "common/comm.h"
#include "common/error.h"
#include "common/file.h"
#include "common/json.h"
#include "common/sdk/share.h"
#include "common/sdk/share_path.h"
#include "fileindex/folder_pauses.h"
#include "fileindex/index_failures.h"
#include "fileindex/index_scope.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/util.h"
#include "output.h"
#include "refusal.h"

namespace quarrox::ctl {
namespace {

constexpr const char* kFileTypeNames[] = {"document", "audio", "video", "photo", "other"};

// What became of a path that can be indexed. What cannot be told is absent.
struct Fate {
  std::optional<bool> is_pending = std::nullopt;
  std::optional<bool> is_indexed = std::nullopt;
  std::optional<fileindex::IndexFailure> failure = std::nullopt;
  std::shared_ptr<fileindex::Folder> paused = nullptr;  // the folder that it is in, where that is paused
};

struct Explanation {
  std::string path = {};        // on its volume
  std::string share = {};       // empty where no share holds it
  std::string share_path = {};  // as users see it; empty likewise
  std::string file_type = {};
  Refusal refusal = {};
  Fate fate = {};
};

bool HasShare(const std::string& full_path, std::string& share) {
  try {
    std::string share_dir;
    fileindex::GetShareNamePathByFullPath(share, share_dir, full_path);
    return true;
  } catch (const Error&) {
    return false;
  }
}

// What a person typed, as a full path: a relative one from here, a share path from its share.
std::string AsFullPath(const std::string& typed) {
  std::string share;
  std::string path = typed.front() == '/' ? typed : RealPath(".") + "/" + typed;
  if (IsFileExist(path) || HasShare(path, share)) return path;
  try {
    return fileindex::GetFullPath(path);
  } catch (const Error&) {
    return path;
  }
}

// With one exchange, not with the library's call, which waits for an engine that is not ready.
std::optional<bool> IsIndexed(const sdk::SDKShare& share, const std::string& path) {
  if (access(kElasticdSocketPath, F_OK) != 0) return std::nullopt;
  Json::Value request;
  request["command"] = "document_get_by_query";
  request["data"]["id"] = share.GetDBName();
  request["data"]["query"]["qsl"]["term"]["VEXOMDPath"] = path;
  request["data"]["query"]["load_field"].append("VEXOMDPath");
  try {
    Json::Value response;
    SendRequestImpl(response, request);
    return response["data"].isArray() && !response["data"].empty();
  } catch (const Error& error) {
    if (int{error.code} == kElasticdNoSuchIndex) return false;
    return std::nullopt;
  }
}

// Null where it is not paused, or that cannot be told.
std::shared_ptr<fileindex::Folder> PausedFolderOf(const std::string& path, const std::string& share) {
  fileindex::IndexScope scope(share);
  try {
    scope.Read();
    return scope.IsPaused(path) ? scope.FolderOf(path) : nullptr;
  } catch (const Error&) {
    return nullptr;
  }
}

Fate FateOf(const std::string& path, const std::string& share_name) {
  const sdk::SDKShare share(share_name);
  Fate fate;
  try {
    fate.is_pending = fileindex::QueueMgr(share.GetQueuePath()).IsFullPathPending(path);
  } catch (const Error&) {
    // It was logged why.
  }
  fate.is_indexed = IsIndexed(share, path);
  fate.paused = PausedFolderOf(path, share_name);
  const fileindex::IndexFailures failures(fileindex::IndexFailures::FileOf(share));
  if (const auto* failure = failures.Find(path.substr(share.GetPath().size()))) fate.failure = *failure;
  return fate;
}

Explanation Explain(const std::string& typed) {
  Explanation result;
  result.path = AsFullPath(typed);
  if (HasShare(result.path, result.share)) {
    result.share_path = sdk::SharePathMgr::GetSharePath(result.path, sdk::User(), false);
  }
  result.file_type =
      IsDirExist(result.path, false) ? "directory" : kFileTypeNames[fileindex::GetFileTypeByFullPath(result.path)];
  result.refusal = RefusalOf(result.path);
  if (!result.refusal) result.fate = FateOf(result.path, result.share);
  return result;
}

Json::Value AsJson(const std::optional<bool>& answer) {
  return answer ? Json::Value(*answer) : Json::Value();
}

Json::Value AsJson(const fileindex::IndexFailure& failure) {
  Json::Value object;
  object["code"] = failure.code;
  object["reason"] = failure.reason;
  object["tried"] = Json::Int64{failure.tried};
  object["tries"] = failure.tries;
  const std::optional<int64_t> next = failure.NextTry();
  object["next_try"] = next ? Json::Value(Json::Int64{*next}) : Json::Value();
  return object;
}

void PrintJson(const Explanation& explanation) {
  Json::Value object;
  object["path"] = explanation.path;
  object["share"] = explanation.share;
  object["share_path"] = explanation.share_path;
  object["file_type"] = explanation.file_type;
  object["indexable"] = !explanation.refusal;
  Describe(explanation.refusal, object);
  object["pending"] = AsJson(explanation.fate.is_pending);
  object["indexed"] = AsJson(explanation.fate.is_indexed);
  object["paused"] = explanation.fate.paused != nullptr;
  object["failure"] = explanation.fate.failure ? AsJson(*explanation.fate.failure) : Json::Value();
  std::cout << toString(object) << '\n';
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

void PrintPause(const fileindex::Folder& folder) {
  const std::optional<int64_t> end = fileindex::FolderPauses().EndOf(folder);
  std::cout << "paused     "
            << Visible(!end ? "with its share " + folder.GetShare() : folder.GetPath() + " is " + DescribePause(*end))
            << '\n';
}

void Print(const Fate& fate) {
  const std::optional<fileindex::IndexFailure>& failure = fate.failure;
  const bool lacks_contents = failure && failure->has_document && fate.is_indexed.value_or(false);
  std::cout << "pending    " << Describe(fate.is_pending) << '\n';
  std::cout << "indexed    " << Describe(fate.is_indexed) << (lacks_contents ? ", without its contents" : "") << '\n';
  if (fate.paused != nullptr) PrintPause(*fate.paused);
  if (!failure) return;
  const std::optional<int64_t> next = failure->NextTry();
  std::cout << "failed     " << TimeOf(failure->tried) << ": " << Visible(failure->reason) << " (code " << failure->code
            << ")\n";
  std::cout << "next try   " << (next ? TimeOf(*next) : "when it changes, or a reindex asks for it") << '\n';
}

void PrintText(const Explanation& explanation) {
  std::cout << "path       " << Visible(explanation.path) << '\n';
  std::cout << "share      "
            << (explanation.share.empty() ? "none" : Visible(explanation.share + " (" + explanation.share_path + ")"))
            << '\n';
  std::cout << "type       " << explanation.file_type << '\n';
  if (!explanation.refusal) {
    std::cout << "indexable  yes\n";
    return Print(explanation.fate);
  }
  std::cout << "indexable  no: " << Visible(explanation.refusal.reason) << " (rule " << explanation.refusal.rule
            << ")\n";
  std::cout << "remedy     " << Visible(explanation.refusal.remedy) << '\n';
}

}  // namespace

int ExplainPath(const Arguments& arguments) {
  const std::string& typed = arguments.operands().front();
  if (typed.empty()) throw UsageError("PATH is empty");
  const Explanation explanation = Explain(typed);
  if (arguments.Has("--json")) {
    PrintJson(explanation);
  } else {
    PrintText(explanation);
  }
  return kDone;
}

}  // namespace quarrox::ctl
