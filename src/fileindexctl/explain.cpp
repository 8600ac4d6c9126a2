#include "explain.h"

#include <algorithm>
#include <filesystem>

#include "command.h"
#include "common/comm.h"
#include "common/error.h"
#include "common/file.h"
#include "common/json.h"
#include "common/sdk/share.h"
#include "common/sdk/share_path.h"
#include "daemon_exchange.h"
#include "fileindex/folder_pauses.h"
#include "fileindex/index_scope.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"
#include "output.h"
#include "status.h"

namespace quarrox::ctl {
namespace {

constexpr char kDirectory[] = "directory";
constexpr const char* kFileTypeNames[] = {"document", "audio", "video", "photo", "other"};

// What the engine tells of a document beside its fields.
constexpr char kIndexedAt[] = "@indexed";
constexpr char kTextBytes[] = "@text_bytes";

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
  // Behind a link ".." is elsewhere than it looks.
  if ((path + '/').find("/../") == std::string::npos) path = std::filesystem::path(path).lexically_normal().string();
  while (path.size() > 1 && path.ends_with('/')) path.pop_back();
  if (IsFileExist(path) || HasShare(path, share)) return path;
  try {
    return fileindex::GetFullPath(path);
  } catch (const Error&) {
    return path;
  }
}

// As a search, which waits for no change that is under way. An engine that does not answer leaves all of it untold.
void AskEngine(const std::string& index_id, const std::string& path, Fate& fate) {
  Json::Value request;
  request["command"] = "document_get_by_query";
  request["data"]["id"] = index_id;
  Json::Value& query = request["data"]["query"];
  query["qsl"]["bool"]["must"]["term"]["VEXOMDPath"] = path;
  for (const char* field : {"VEXOMDPath", kIndexedAt, kTextBytes}) query["load_field"].append(field);
  try {
    const Json::Value answer = Exchange(kElasticdSocketPath, request).object;
    if (!answer["success"].asBool()) {
      const Json::Value& code = answer["error"]["code"];
      if (code.isInt() && code.asInt() == kElasticdNoSuchIndex) fate.is_indexed = false;
      return;
    }
    const Json::Value& found = answer["data"];
    fate.is_indexed = found.isArray() && !found.empty();
    if (!*fate.is_indexed) return;
    const Json::Value& document = found[0];
    if (document[kIndexedAt].isInt64()) fate.indexed_at = document[kIndexedAt].asInt64();
    if (document[kTextBytes].isUInt64()) fate.text_bytes = document[kTextBytes].asUInt64();
  } catch (const Error&) {
    return;
  }
}

// What of its share keeps a path waiting.
std::string StateOf(const std::string& share) {
  try {
    const IndexingStatus status = LookAtIndexing(false);
    const auto found = std::ranges::find(status.shares, share, &ShareStatus::name);
    return found == status.shares.end() ? "" : Describe(*found);
  } catch (const Error&) {
    return {};
  }
}

std::string PauseOf(const fileindex::Folder& folder) {
  const std::optional<int64_t> end = fileindex::FolderPauses().EndOf(folder);
  return !end ? "with its share " + folder.GetShare() : folder.GetPath() + " is " + DescribePause(*end);
}

// Null, and not paused, where no folder governs the path, or that cannot be told.
void FindFolder(Explanation& result) {
  fileindex::IndexScope scope(result.share);
  try {
    scope.Read();
    result.folder = scope.FolderOf(result.path);
    result.wants_contents = result.file_type != kDirectory && scope.NeedsMeta(result.path);
    if (result.folder != nullptr && scope.IsPaused(result.path)) result.fate.paused = PauseOf(*result.folder);
  } catch (const Error&) {
    result.is_folder_known = false;
  }
}

void FindFate(const std::string& path, const std::string& share_name, Fate& fate) {
  const sdk::SDKShare share(share_name);
  try {
    fate.is_pending = fileindex::QueueMgr(share.GetQueuePath()).IsFullPathPending(path);
  } catch (const Error&) {
    // It was logged why.
  }
  if (fate.is_pending.value_or(false)) fate.share_state = StateOf(share_name);
  AskEngine(share.GetDBName(), path, fate);
  const fileindex::IndexFailures failures(fileindex::IndexFailures::FileOf(share));
  if (const auto* failure = failures.Find(path.substr(share.GetPath().size()))) fate.failure = *failure;
}

std::string ResumeCommand(const fileindex::Folder& folder) {
  if (fileindex::FolderPauses().EndOf(folder)) return ShellLine({"fileindexctl", "folder", "resume", folder.GetPath()});
  return ShareCommand("resume", folder.GetShare());
}

bool IsAllPaused() {
  const int64_t resume_time = fileindex::StatusMgr().GetPauseInfo();
  return resume_time == fileindex::kPausedWithoutEnd || resume_time > time(nullptr);
}

std::string TypesCommand(const Explanation& result) {
  const std::string types = TypesOf(*result.folder);
  return ShellLine({"fileindexctl", "folder", "set", result.folder->GetPath(), "--types",
                    (types == "none" ? "" : types + ',') + result.file_type});
}

std::string RemedyFor(const Explanation& result) {
  const Fate& fate = result.fate;
  if (result.refusal) return result.refusal.remedy;
  if (!result.is_folder_known) return "fileindexctl doctor";
  if (result.folder == nullptr) return ShellLine({"fileindexctl", "folder", "add", '/' + result.share});
  if (!fate.paused.empty()) return ResumeCommand(*result.folder);
  if (fate.is_pending.value_or(false) && IsAllPaused()) return "fileindexctl resume";
  if (!fate.is_pending || !fate.is_indexed) return "fileindexctl doctor";
  if (fate.failure)
    return "put right what it says, then: " + ShellLine({"touch", "-c", "-r", result.path, result.path});
  if (!*fate.is_pending && !*fate.is_indexed) {
    return ShellLine({"fileindexctl", "folder", "reindex", result.folder->GetPath()});
  }
  const bool is_left_out = result.file_type != kDirectory && !result.wants_contents;
  return is_left_out ? TypesCommand(result) : "";
}

}  // namespace

Explanation Explain(const std::string& typed, const std::string& user) {
  Explanation result;
  result.path = AsFullPath(typed);
  result.file_type =
      IsDirExist(result.path, false) ? kDirectory : kFileTypeNames[fileindex::GetFileTypeByFullPath(result.path)];
  if (HasShare(result.path, result.share)) {
    result.share_path = sdk::SharePathMgr::GetSharePath(result.path, sdk::User(), false);
    FindFolder(result);
  }
  result.refusal = RefusalOf(result.path);
  if (!result.refusal) FindFate(result.path, result.share, result.fate);
  result.remedy = RemedyFor(result);
  result.readers = ReadersOf(result.path);
  result.user = user;
  if (!user.empty()) result.access = AccessAs(user, result.path);
  return result;
}

int ExplainPath(const Arguments& arguments) {
  const std::string& typed = arguments.operands().front();
  if (typed.empty()) throw UsageError("PATH is empty");
  const Explanation explanation = Explain(typed, arguments.Value("--as", ""));
  arguments.Has("--json") ? PrintAsJson(explanation) : PrintAsText(explanation);
  return kDone;
}

}  // namespace quarrox::ctl
