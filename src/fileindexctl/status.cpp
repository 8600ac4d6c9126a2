#include "status.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <ctime>
#include <fstream>
#include <map>
#include <set>
#include <utility>

#include "common/comm.h"
#include "common/error.h"
#include "common/file.h"
#include "common/json.h"
#include "common/sdk/open_shares.h"
#include "common/strings.h"
#include "common/unique_fd.h"
#include "daemon_exchange.h"
#include "fileindex/communication.h"
#include "fileindex/elastic_control.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/folder_pauses.h"
#include "fileindex/folder_status.h"
#include "fileindex/index_failures.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/status_mgr.h"
#include "output.h"
#include "refusal.h"

namespace quarrox::ctl {
namespace {

using fileindex::IndexProgress;
using State = ShareStatus::State;

bool IsProcess(int64_t pid, const char* expected) {
  if (pid <= 0 || (kill(static_cast<pid_t>(pid), 0) != 0 && errno != EPERM)) return false;
  std::string name;
  return std::getline(std::ifstream("/proc/" + std::to_string(pid) + "/comm"), name) && name == expected;
}

// Whether a stream socket listens at a path. A socket of another type is told apart from nobody, and its try disturbs
// no listener.
bool Listens(const char* path) {
  const UniqueFd fd(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  strncpy(address.sun_path, path, sizeof(address.sun_path) - 1);
  return connect(fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0 ||
         (errno != ENOENT && errno != ECONNREFUSED);
}

// Whether the notification daemon runs, which tells its process there.
bool IsNotifydRunning() {
  Json::Value status;
  if (!fromFile(status, "/var/run/vexonotifyd.status") || !status.isObject()) return false;
  return status["pid"].isInt64() && IsProcess(status["pid"].asInt64(), "vexonotifyd");
}

// What concerns all shares.
struct Machine {
  bool notifyd_runs = IsNotifydRunning();
  bool daemon_runs = Listens(fileindex::kDaemonSocketPath);
  fileindex::StatusMgr status = {};
  fileindex::FolderPauses pauses = {};
  int64_t resume_time = status.GetPauseInfo();
  int64_t now = time(nullptr);

  bool IsPaused() const { return resume_time == fileindex::kPausedWithoutEnd || resume_time > now; }
};

// A queue's file is made for its first event.
void AddQueueFile(ShareStatus& share, const std::string& path, int64_t now) {
  struct statx file;
  if (statx(AT_FDCWD, path.c_str(), 0, STATX_SIZE | STATX_MTIME | STATX_BTIME, &file) != 0) return;
  const bool has_birth = (file.stx_mask & STATX_BTIME) != 0;
  const int64_t age = now - (has_birth ? file.stx_btime : file.stx_mtime).tv_sec;
  share.queue_bytes += file.stx_size;
  share.queue_age = std::max({int64_t{0}, age, share.queue_age.value_or(0)});
}

void Set(ShareStatus& share, State state, const std::string& reason = {}) {
  share.state = state;
  share.reason = reason;
}

// What a worker failed at, in words for people where they are known.
std::string WhyWaits(const ShareStatus& share, const sdk::SDKShare& opened) {
  constexpr char kNoEngine[] = "Connect failed";  // as the channel to the engine says it
  if (share.progress.reason == kNoEngine) return "the search engine, vexoelasticd, did not answer; it is asked again";
  if (opened.IsSpaceEnough()) return share.progress.reason;
  return "less than 100 MiB are left for its index on " + Dirname(opened.GetPath()) + "; make room there";
}

// The first that holds of what may keep a share from being indexed, then what is under way.
void Judge(ShareStatus& share, const sdk::SDKShare& opened, bool is_paused, const Machine& machine) {
  const Refusal refusal = RefusalOf(opened);
  if (refusal) return Set(share, State::kBlocked, refusal.reason + "; " + refusal.remedy);
  if (is_paused) return Set(share, State::kPaused, "paused; '" + ShareCommand("resume", share.name) + "' ends it");
  if (machine.IsPaused()) return Set(share, State::kPaused, DescribePause(machine.resume_time));
  const int flags = machine.status.GetShareStatus(share.name);
  if (share.progress.state == IndexProgress::State::kWorking) {
    share.rebuilding = (flags & fileindex::kShareNeedRebuild) != 0;
    share.quiet = machine.now - share.progress.updated;
    return Set(share, State::kWorking);
  }
  if (share.progress.state == IndexProgress::State::kWaiting)
    return Set(share, State::kWaiting, WhyWaits(share, opened));
  if (share.queue_age && !machine.daemon_runs) return Set(share, State::kWaiting, "fileindexd is not running");
  if (share.queue_age) return Set(share, State::kPending);
  if ((flags & fileindex::kShareNeedRebuild) != 0) {
    return Set(share, State::kOutdated, "damaged; '" + ShareCommand("rebuild", share.name) + "' makes it anew");
  }
  if (flags != 0) {
    return Set(share, State::kOutdated,
               "incomplete; '" + ShellLine({"fileindexctl", "folder", "reindex", '/' + share.name}) + "' mends it");
  }
  if (!IsDirExist(opened.GetDBPath(), false)) {
    Set(share, State::kOutdated, "not there; '" + ShareCommand("rebuild", share.name) + "' makes it");
  }
}

// False where there is no such share.
bool LookAt(ShareStatus& share, bool is_paused, const Machine& machine, sdk::OpenShares& shares) {
  try {
    const sdk::SDKShare& opened = shares.Get(share.name);
    share.progress_file = IndexProgress::FileOf(opened);
    const std::optional<IndexProgress> told = IndexProgress::Load(share.progress_file);
    if (told && IsWorker(told->pid)) share.progress = *told;
    const fileindex::QueueMgr queue(opened.GetQueuePath());
    for (const std::string& path : {queue.queue_path(), queue.queue_path_tmp()}) {
      AddQueueFile(share, path, machine.now);
    }
    Judge(share, opened, is_paused, machine);
    const fileindex::IndexFailures failures(fileindex::IndexFailures::FileOf(opened));
    share.failures = failures.size() + failures.omitted();
    return true;
  } catch (const Error& error) {
    if (error.code != kErrNoSuchShare) throw;
    Set(share, State::kBlocked,
        "the share is gone; 'fileindexctl share clear-paused' takes its folders out of the list");
    return false;
  }
}

// What the engine says of one index keeps its share from going on, or from being found.
void TakeRefusal(ShareStatus& share, const Json::Value& error) {
  int code = 0;
  GetJsonValue(code, error, "code", false);
  if (share.state == State::kPaused || share.state == State::kBlocked) return;
  if (code == kElasticdIndexOpening || code == kElasticdIndexRecovering) {
    Set(share, State::kWaiting, "the search engine is checking its index");
  } else if (code == kElasticdIndexPaused) {
    Set(share, State::kOutdated, "paused; '" + ShareCommand("resume", share.name) + "' ends that");
  } else if (code == kElasticdNoSuchIndex && share.state == State::kCurrent) {
    Set(share, State::kOutdated, "not there; '" + ShareCommand("rebuild", share.name) + "' makes it");
  } else if (IsElasticdBusy(code)) {
    Set(share, State::kWaiting, "the search engine has too much to do");
  }
}

// Asks how many documents some indexes hold, all at once. False where one of them fails the request for all; what is
// not told otherwise stays unknown.
bool Ask(const std::vector<ShareStatus*>& shares) {
  Json::Value request(Json::objectValue);
  for (const ShareStatus* share : shares) {
    Json::Value item(Json::objectValue);
    item["command"] = "document_get_by_query";
    item["data"]["id"] = fileindex::elastic::GetFileIndexID(share->name);
    Json::Value& query = item["data"]["query"];
    // As a search, which waits for no change that is under way.
    query["qsl"]["bool"]["must"]["prefix"]["VEXOMDPath"] = "";
    query["size"] = 0;
    request["compound"].append(item);
  }
  const Json::Value response = Exchange(kElasticdSocketPath, request).object;
  if (!response["success"].asBool()) {
    if (shares.size() == 1) TakeRefusal(*shares.front(), response["error"]);
    return false;
  }
  const Json::Value& answers = response["data"];
  for (Json::ArrayIndex i = 0; i < std::min(answers.size(), static_cast<Json::ArrayIndex>(shares.size())); ++i) {
    const Json::Value& total = answers[i]["total"];
    if (total.isUInt64()) shares[i]->documents = total.asUInt64();
    if (answers[i].isMember("error")) TakeRefusal(*shares[i], answers[i]["error"]);
  }
  return true;
}

// Throws where the engine does not answer.
void CountDocuments(IndexingStatus& status, sdk::OpenShares& opened) {
  std::vector<ShareStatus*> shares;
  for (ShareStatus& share : status.shares) {
    const bool has_index = share.state != State::kBlocked && IsDirExist(opened.Get(share.name).GetDBPath(), false);
    if (has_index) shares.push_back(&share);
  }
  if (shares.empty() || Ask(shares)) return;
  for (ShareStatus* share : shares) Ask({share});
}

void AddFolders(IndexingStatus& status, const Machine& machine, const fileindex::FolderMgr& folders,
                sdk::OpenShares& shares) {
  fileindex::FolderStatuses statuses(folders, shares);
  for (const auto& folder : folders.GetFolders()) {
    const std::string name = folder->GetShare();
    const auto share = std::ranges::lower_bound(status.shares, name, {}, &ShareStatus::name);
    if (share == status.shares.end() || share->name != name) continue;
    Json::Value text;
    statuses.GetStatus(text, *folder);
    share->folders.push_back(
        {folder->GetPath(), folder->IsPaused() ? "paused" : text["text"].asString(), machine.pauses.EndOf(*folder)});
  }
}

}  // namespace

bool IsWorker(int64_t pid) {
  return IsProcess(pid, "fileindexd");
}

IndexingStatus LookAtIndexing(bool with_folders) {
  const Machine machine;
  fileindex::FolderMgr folders;
  std::set<std::string> served;
  std::map<std::string, size_t> paused;
  for (const auto& folder : folders.GetFolders()) {
    if (machine.pauses.IsServed(*folder)) served.insert(folder->GetShare());
    if (folder->IsPaused()) ++paused[folder->GetShare()];
  }
  IndexingStatus status;
  status.daemon_runs = machine.daemon_runs;
  sdk::OpenShares shares;
  for (const std::string& name : folders.GetIndexedShares()) {
    ShareStatus& share = status.shares.emplace_back(ShareStatus{.name = name});
    if (served.contains(name)) share.paused_folders = paused[name];
    if (!LookAt(share, !served.contains(name), machine, shares)) folders.DeleteByShare(name);
  }
  if (!machine.daemon_runs) status.problems.emplace_back("fileindexd is not running, so nothing is indexed");
  if (!machine.notifyd_runs) status.problems.emplace_back("vexonotifyd is not running, so no change is seen");
  try {
    CountDocuments(status, shares);
  } catch (const Error& error) {
    status.problems.push_back("the search engine, vexoelasticd, does not work: " + error.reason +
                              "; 'fileindexctl doctor' says what to do");
  }
  for (ShareStatus& share : status.shares) share.problems = status.problems;
  if (with_folders) AddFolders(status, machine, folders, shares);
  return status;
}

bool ShareStatus::IsBusy() const {
  return state == State::kPending || state == State::kWorking || state == State::kWaiting ||
         (state == State::kPaused && queue_age);
}

std::optional<double> ShareStatus::Rate() const {
  const int64_t seconds = progress.updated - progress.since;
  if (state != State::kWorking || seconds <= 0 || progress.done == 0) return std::nullopt;
  return static_cast<double>(progress.done) / static_cast<double>(seconds);
}

std::optional<int64_t> ShareStatus::SecondsLeft() const {
  const std::optional<double> rate = Rate();
  if (!rate || !progress.left) return std::nullopt;
  return static_cast<int64_t>(static_cast<double>(*progress.left) / *rate) + 1;
}

}  // namespace quarrox::ctl
