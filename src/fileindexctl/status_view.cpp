#include <cmath>
#include <cstdio>
#include <iostream>
#include <map>

#include "command.h"
#include "common/json.h"
#include "output.h"
#include "status.h"

namespace quarrox::ctl {
namespace {

using State = ShareStatus::State;

// A pass tells once a second how far it is, but not while it is at a file. In seconds; what is further back was told
// by another clock.
constexpr int64_t kLongForOne = 5;
constexpr int64_t kNotTold = 86400;

constexpr size_t kBarWidth = 24;  // columns between its brackets

constexpr const char* kStates[] = {"current", "pending", "working", "waiting", "paused", "outdated", "blocked"};

// "12,345"
std::string Grouped(uint64_t number) {
  std::string text = std::to_string(number);
  for (size_t at = text.size(); at > 3;) text.insert(at -= 3, 1, ',');
  return text;
}

std::string Documents(uint64_t number) {
  return Grouped(number) + (number == 1 ? " document" : " documents");
}

std::string Bar(double part) {
  std::string bar(kBarWidth, '.');
  bar.replace(0, static_cast<size_t>(part * kBarWidth), static_cast<size_t>(part * kBarWidth), '#');
  return '[' + bar + "] ";
}

// What waits, where there is something.
std::string Pending(const ShareStatus& share) {
  if (!share.queue_age) return {};
  return SizeText(share.queue_bytes) + " of changes, the oldest " + Duration(*share.queue_age) + " old";
}

std::string Failures(const ShareStatus& share) {
  if (share.failures == 0) return {};
  return ", but " + Grouped(share.failures) + (share.failures == 1 ? " file" : " files") +
         " could not be read; 'fileindexctl status --failed' tells which";
}

std::string PausedFolders(const ShareStatus& share) {
  if (share.paused_folders == 0) return {};
  return ", with " + Grouped(share.paused_folders) + (share.paused_folders == 1 ? " folder" : " folders") + " paused";
}

std::string FolderWords(const std::string& status) {
  static const std::map<std::string, std::string> words = {{"finished", "up to date"},
                                                           {"processing", "being indexed"},
                                                           {"need_reindex", "to be indexed again"},
                                                           {"error", "cannot be indexed"}};
  const auto found = words.find(status);
  return found == words.end() ? status : found->second;
}

template <typename T>
Json::Value OrNull(const std::optional<T>& number) {
  return number ? Json::Value(*number) : Json::Value();
}

std::string Progress(const ShareStatus& share, bool bar) {
  const fileindex::IndexProgress& progress = share.progress;
  const uint64_t met = progress.done + progress.failed;
  std::string text;
  if (progress.left) {
    const uint64_t all = met + *progress.left;
    const double part = all == 0 ? 1 : static_cast<double>(met) / static_cast<double>(all);
    char percent[16];
    snprintf(percent, sizeof(percent), "%3d %%, ", static_cast<int>(part * 100));
    text = (bar ? Bar(part) : "") + percent + Grouped(met) + " of " + Documents(all);
  } else {
    text = (bar ? Bar(0) : "") + Documents(met);
  }
  if (const auto rate = share.Rate()) text += ", " + Grouped(static_cast<uint64_t>(llround(*rate))) + " a second";
  if (const auto left = share.SecondsLeft()) text += ", " + Duration(*left) + " left";
  if (progress.failed != 0) text += ", " + Grouped(progress.failed) + " failed";
  const bool is_stuck = kLongForOne <= share.quiet && share.quiet < kNotTold;
  if (is_stuck) text += ", at one file for " + Duration(share.quiet);
  if (!progress.held_back_by.empty()) text += ", slowed down: others need the " + progress.held_back_by;
  return text;
}

}  // namespace

std::string Describe(const ShareStatus& share) {
  const std::string pending = Pending(share);
  const std::string waits = pending.empty() ? "" : " (" + pending + ")";
  switch (share.state) {
    case State::kCurrent:
      return "up to date" + Failures(share) + PausedFolders(share);
    case State::kPending:
      return "pending: " + pending;
    case State::kWorking:
      return (share.rebuilding ? "making its index anew: " : "indexing: ") + Progress(share, false);
    case State::kWaiting:
      return "waiting: " + share.reason + waits;
    case State::kPaused:
      return share.reason + waits;
    case State::kOutdated:
      return "its index is " + share.reason;
    case State::kBlocked:
      return "cannot be indexed: " + share.reason;
  }
  return {};
}

std::string DescribeLong(const ShareStatus& share, bool bar) {
  if (share.state == State::kWorking) return bar ? Progress(share, true) : Describe(share);
  return (share.documents ? Documents(*share.documents) + ", " : "") + Describe(share);
}

std::string NameOf(State state) {
  return kStates[static_cast<size_t>(state)];
}

std::string AsJson(const ShareStatus& share) {
  Json::Value object;
  object["share"] = share.name;
  object["state"] = NameOf(share.state);
  object["reason"] = share.reason;
  object["documents"] = OrNull(share.documents);
  object["done"] = Json::UInt64{share.progress.done};
  object["failed"] = Json::UInt64{share.progress.failed};
  object["left"] = OrNull(share.progress.left);
  object["rate"] = OrNull(share.Rate());
  object["seconds_left"] = OrNull(share.SecondsLeft());
  object["rebuilding"] = share.rebuilding;
  object["since"] = Json::Int64{share.progress.since};
  object["committed"] = Json::Int64{share.progress.committed};
  object["path"] = share.progress.path;
  object["queue_bytes"] = Json::UInt64{share.queue_bytes};
  object["queue_seconds"] = OrNull(share.queue_age);
  object["failures"] = Json::UInt64{share.failures};
  object["held_back_by"] = share.progress.held_back_by;
  object["problems"] = Vec2JsonArr(share.problems);
  object["folders"] = Json::Value(Json::arrayValue);
  for (const ShareStatus::Folder& folder : share.folders) {
    Json::Value& data = object["folders"].append(Json::Value(Json::objectValue));
    data["path"] = folder.path;
    data["status"] = folder.status;
    if (folder.resume_time) data["resume_time"] = Json::Int64{*folder.resume_time};
  }
  return toString(object);
}

void Print(const IndexingStatus& status) {
  std::vector<std::vector<std::string>> shares = {{"SHARE", "DOCUMENTS", "STATE"}};
  std::vector<std::vector<std::string>> folders = {{"FOLDER", "STATE"}};
  for (const ShareStatus& share : status.shares) {
    shares.push_back(
        {Visible(share.name), share.documents ? Grouped(*share.documents) : "unknown", Visible(Describe(share))});
    for (const ShareStatus::Folder& folder : share.folders) {
      folders.push_back(
          {Visible(folder.path), folder.resume_time ? DescribePause(*folder.resume_time) : FolderWords(folder.status)});
    }
  }
  if (shares.size() == 1) {
    std::cout << "no folder is indexed; 'fileindexctl folder add' adds one\n";
    return;
  }
  PrintTable(std::cout, shares);
  std::cout << '\n';
  PrintTable(std::cout, folders);
}

int Status(const Arguments& arguments) {
  const bool json = arguments.Has("--json");
  if (arguments.Has("--follow")) return FollowStatus(arguments.Has("--until-idle"), json);
  if (arguments.Has("--failed")) return PrintFailures(json);
  if (arguments.Has("--until-idle")) throw UsageError("--until-idle goes with --follow");
  const IndexingStatus status = LookAtIndexing(true);
  for (const std::string& problem : status.problems) std::cerr << "fileindexctl: " << problem << '\n';
  if (!json) Print(status);
  for (const ShareStatus& share : status.shares) {
    if (json) std::cout << AsJson(share) << '\n';
  }
  return kDone;
}

}  // namespace quarrox::ctl
