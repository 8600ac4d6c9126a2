#include "fileindex/custom_events.h"

#include <iterator>
#include <set>
#include <string_view>

#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "common/queue_file.h"
#include "fileindex/optree_fold.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/queue_mgr_search.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"

namespace quarrox::fileindex {
namespace {

constexpr char kFunction[] = "AddCustomEvent";

// The places of which a reindex is pending, each with a slash at its end and none below another: so what sorts before
// a path is the place that it lies in, if any.
class ReindexedPlaces {
 public:
  bool Covers(const std::string& path) const { return IsInPlace(NodePath(path) + "/"); }

  void Add(std::string_view path) {
    if (!CanHaveNode(path)) return;
    const std::string place = NodePath(path) + "/";
    if (IsInPlace(place)) return;
    auto below = places_.lower_bound(place);
    while (below != places_.end() && below->starts_with(place)) below = places_.erase(below);
    places_.insert(below, place);
  }

 private:
  bool IsInPlace(const std::string& place) const {
    const auto next = places_.upper_bound(place);
    return next != places_.begin() && place.starts_with(*std::prev(next));
  }

  std::set<std::string> places_;
};

std::string LineOf(int kind, const std::string& path, const std::string& path_old, const Json::Value& data) {
  Json::Value event(Json::objectValue);
  event["event"] = kind;
  event["path"] = path;
  event["path_old"] = path_old;
  event["data"] = data;
  return toString(event) + "\n";
}

// Makes the loss of an event visible. A failure here must not hide the one that it follows.
void FlagShare(const std::string& share, const Error& error) {
  QUARROX_SYSLOG_FAILURE_(kFunction, "AddCustomEvent failed, code=%d, reason=%s. Set [%s] need reindex",
                          static_cast<int>(error.code), log::Text(error.what()).c_str(), share.c_str());
  if (share.empty()) return;
  try {
    StatusMgr().SetShareStatus(share, kShareNeedReindex);
  } catch (const Error& second) {
    QUARROX_SYSLOG_FAILURE_(kFunction, "Failed to set [%s] need reindex, code=%d, reason=%s", share.c_str(),
                            static_cast<int>(second.code), log::Text(second.what()).c_str());
  }
}

}  // namespace

// One share's queue, as it was when the first event for it was queued.
class CustomEvents::Queue {
 public:
  explicit Queue(const sdk::SDKShare& share) : queue_(share.GetQueuePath()), can_be_indexed_(share.CanBeIndexed()) {
    if (!can_be_indexed_) return;
    for (const std::string& path : {queue_.queue_path(), queue_.queue_path_tmp()}) {
      QueueSearch(path).Find([&](const EventView& event) {
        if (event.event == kEventReindex) reindexed_.Add(event.path);
        return false;
      });
    }
  }

  void Add(int kind, const std::string& path, const std::string& path_old, const Json::Value& data) {
    if (!can_be_indexed_ || reindexed_.Covers(path)) return;
    AppendToQueueWithLockFile(queue_.queue_path(), LineOf(kind, path, path_old, data));
    if (kind == int{kEventReindex}) reindexed_.Add(path);
  }

 private:
  const QueueMgr queue_;
  const bool can_be_indexed_;
  ReindexedPlaces reindexed_;
};

CustomEvents::CustomEvents(OpenShares& shares) : shares_(shares) {}

CustomEvents::~CustomEvents() = default;

CustomEvents::Queue& CustomEvents::QueueOf(const std::string& share) {
  const auto found = queues_.find(share);
  if (found != queues_.end()) return *found->second;
  return *queues_.emplace(share, std::make_unique<Queue>(shares_.Get(share))).first->second;
}

void CustomEvents::Add(int kind, const std::string& full_path, const std::string& path_old, const Json::Value& data) {
  std::string share;
  try {
    std::string share_path;
    GetShareNamePathByFullPath(share, share_path, full_path);
    QueueOf(share).Add(kind, full_path, path_old, data);
  } catch (const Error& error) {
    FlagShare(share, error);
    throw;
  }
}

void AddCustomEvent(int kind, const std::string& full_path, const std::string& path_old, const Json::Value& data) {
  OpenShares shares;
  CustomEvents(shares).Add(kind, full_path, path_old, data);
}

}  // namespace quarrox::fileindex
