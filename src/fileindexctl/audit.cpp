#include <unistd.h>

#include <chrono>
#include <cstdint>
#include <iostream>
#include <optional>
#include <set>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "command.h"
#include "common/comm.h"
#include "common/error.h"
#include "common/file.h"
#include "common/json.h"
#include "common/sdk/share.h"
#include "common/strings.h"
#include "fileindex/custom_events.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_compare.h"
#include "fileindex/index_progress.h"
#include "fileindex/index_scope.h"
#include "fileindex/optree.h"
#include "fileindex/status_mgr.h"
#include "output.h"
#include "status.h"

namespace quarrox::ctl {
namespace {

using fileindex::FolderKinds;
using fileindex::IndexComparison;
using fileindex::IndexProgress;
using fileindex::Kinds;

// A repair of more places than that reindexes the whole share.
constexpr size_t kMostPlaces = 100;

// How long a repair may take unless people say otherwise, in seconds.
constexpr size_t kTimeToRepair = 600;

constexpr std::chrono::milliseconds kBetweenLooks(50);

// What is still to be done for a share, so that differences may go by themselves; empty where nothing is.
std::string WorkLeftFor(const std::string& name) {
  const sdk::SDKShare share(name);
  // The queue before the ".tmp" that it becomes.
  for (const char* suffix : {"", ".tmp"}) {
    if (IsFileExist(share.GetQueuePath() + suffix)) return "its queue holds events";
  }
  constexpr int kFlags = fileindex::kShareNeedReindex | fileindex::kShareNeedRebuild;
  if ((fileindex::StatusMgr().GetShareStatus(name) & kFlags) != 0) return "a reindex of it is due";
  const std::optional<IndexProgress> progress = IndexProgress::Load(IndexProgress::FileOf(share));
  const bool is_told = progress && IsWorker(progress->pid);
  return is_told && progress->state != IndexProgress::State::kIdle ? "its worker is at work" : "";
}

std::string WaitForQuiet(const std::string& share, std::chrono::seconds longest) {
  const auto end = std::chrono::steady_clock::now() + longest;
  for (;;) {
    std::string left = WorkLeftFor(share);
    if (left.empty() || std::chrono::steady_clock::now() >= end) return left;
    std::this_thread::sleep_for(kBetweenLooks);
  }
}

// Prints each difference when it is found, and keeps no more than a repair needs.
class Listing final : public fileindex::IndexDifferences {
 public:
  Listing(std::string share, std::string directory, bool json)
      : share_(std::move(share)), directory_(std::move(directory)), json_(json) {}

  void CheckPoint() override {}
  void Missing(const std::string& path) override { Say("missing", path); }
  void Changed(const std::string& path) override { Say("stale", path); }
  void AttributesChanged(const std::string& path, bool) override {
    if (attributes_.size() < kMostPlaces) attributes_.insert(path);
    Say("stale", path);
  }
  void Gone(const std::vector<std::string>& paths) override {
    for (const std::string& path : paths) Say("gone", path);
  }
  void Unreadable(const std::string& path, int) override {
    std::cerr << "fileindexctl: " << Visible(path) << " cannot be read, so nothing is said of it\n";
  }

  uint64_t count() const { return count_; }

  // Queues what mends the differences.
  void Repair() const {
    sdk::OpenShares shares;
    fileindex::CustomEvents events(shares);
    for (const std::string& path : places_) events.Add(fileindex::kEventReindex, path, "", Json::Value());
    for (const std::string& path : attributes_) events.Add(fileindex::kEventAttr, path, "", Json::Value());
  }

 private:
  void Say(const char* what, const std::string& path) {
    ++count_;
    const std::string place = path == directory_ ? path : Dirname(path);
    if (places_.size() < kMostPlaces) {
      places_.insert(place);
    } else if (places_.count(place) == 0) {
      places_ = {directory_};
    }
    if (!json_) {
      std::cout << what << std::string(9 - std::string_view(what).size(), ' ') << Visible(path) << '\n';
      return;
    }
    Json::Value object;
    object["share"] = share_;
    object["difference"] = what;
    object["path"] = path;
    std::cout << toString(object) << '\n';
  }

  const std::string share_;
  const std::string directory_;
  const bool json_;
  uint64_t count_ = 0;
  std::set<std::string> places_;      // the directories that hold the differences
  std::set<std::string> attributes_;  // some of those that a comparison in the usual way may pass over
};

struct Result {
  uint64_t documents = 0;
  uint64_t differences = 0;
};

Result Compare(const std::string& share, bool json, bool repair) {
  fileindex::IndexScope scope(share);
  scope.Read();
  for (const std::string& folder : scope.paused()) {
    std::cerr << "fileindexctl: the folder " << Visible(folder) << " is paused, so it is left out\n";
  }
  // A file whose folder's kinds are others than when the index was made has more or less of its contents there.
  const FolderKinds before = FolderKinds::Load(scope.kinds_file()).value_or(scope.kinds());
  const auto is_forced = [&](const std::string& path, const struct stat& info) {
    const Kinds then = before.At(path.substr(scope.directory().size())).value_or(Kinds());
    return !S_ISDIR(info.st_mode) && (then ^ scope.KindsAt(path)).Has(path);
  };
  Listing listing(share, scope.directory(), json);
  IndexComparison comparison(
      scope, listing, before == scope.kinds() ? IndexComparison::IsForced() : IndexComparison::IsForced(is_forced),
      IndexComparison::Care::kThorough);
  comparison.Run(scope.directory());
  if (repair && listing.count() != 0) listing.Repair();
  return {comparison.documents(), listing.count()};
}

class Auditor {
 public:
  explicit Auditor(const Arguments& arguments)
      : json_(arguments.Has("--json")),
        repair_(arguments.Has("--repair")),
        wait_(arguments.Number("--wait", 0)),
        wait_for_repair_(arguments.Number("--wait", kTimeToRepair)) {}

  void Audit(const std::string& share) {
    const std::string left_before = WaitForQuiet(share, wait_);
    Result result = Compare(share, json_, repair_);
    std::string left = left_before.empty() && !repair_ ? WorkLeftFor(share) : left_before;
    if (repair_ && result.differences != 0) {
      std::cerr << "fileindexctl: the differences in the share " << Visible(share)
                << " are being mended: " << result.differences << '\n';
      left = WaitForQuiet(share, wait_for_repair_);
      result = Compare(share, json_, false);
    }
    ++shares_;
    documents_ += result.documents;
    differences_ += result.differences;
    if (left.empty()) return;
    ++pending_;
    std::cerr << "fileindexctl: there may be differences in the share " << Visible(share) << " for now: " << left
              << '\n';
  }

  void PrintTotal() const {
    if (!json_) {
      std::cout << "differences: " << differences_ << ", documents: " << documents_ << ", shares: " << shares_ << '\n';
      return;
    }
    Json::Value object;
    object["shares"] = Json::UInt64{shares_};
    object["documents"] = Json::UInt64{documents_};
    object["differences"] = Json::UInt64{differences_};
    if (pending_ != 0) object["pending"] = Json::UInt64{pending_};
    std::cout << toString(object) << '\n';
  }

  bool found_any() const { return differences_ != 0; }

 private:
  const bool json_;
  const bool repair_;
  const std::chrono::seconds wait_;
  const std::chrono::seconds wait_for_repair_;
  uint64_t shares_ = 0;
  uint64_t documents_ = 0;
  uint64_t differences_ = 0;
  uint64_t pending_ = 0;  // shares that are not at rest
};

}  // namespace

int Audit(const Arguments& arguments) {
  // The channel waits for an engine that is about to start; a person need not.
  if (access(kElasticdSocketPath, F_OK) != 0) throw Error(kErrEngineReceive, "the search engine is not running");
  Auditor auditor(arguments);
  if (!arguments.operands().empty()) {
    auditor.Audit(arguments.operands().front());
    auditor.PrintTotal();
    return auditor.found_any() ? kFailed : kDone;
  }
  bool failed = false;
  for (const std::string& share : fileindex::FolderMgr().GetIndexedShares()) {
    try {
      auditor.Audit(share);
    } catch (const Error& error) {
      failed = true;
      std::cerr << "fileindexctl: the share " << Visible(share) << " is left out: error " << error.code << ": "
                << Visible(error.reason) << '\n';
    }
  }
  auditor.PrintTotal();
  return failed || auditor.found_any() ? kFailed : kDone;
}

}  // namespace quarrox::ctl
