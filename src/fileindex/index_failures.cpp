#include "fileindex/index_failures.h"

#include <algorithm>
#include <ctime>
#include <utility>

#include "common/file.h"
#include "common/json.h"
#include "common/log.h"
#include "common/strings.h"

namespace quarrox::fileindex {
namespace {

constexpr int64_t kFirstPause = 60;  // seconds
constexpr int64_t kLongestPause = 3600;

int64_t Nanoseconds(const timespec& time) {
  return time.tv_sec * int64_t{1000000000} + time.tv_nsec;
}

Json::Value AsJson(const IndexFailure& failure) {
  Json::Value data(Json::objectValue);
  data["code"] = failure.code;
  data["reason"] = failure.reason;
  data["has_document"] = failure.has_document;
  data["may_succeed_later"] = failure.may_succeed_later;
  data["size"] = Json::Int64{failure.size};
  data["changed"] = Json::Int64{failure.changed};
  data["tried"] = Json::Int64{failure.tried};
  data["tries"] = failure.tries;
  return data;
}

// What is missing or of another type stays as it is.
IndexFailure FailureOf(const Json::Value& data) {
  IndexFailure failure;
  if (!data.isObject()) return failure;
  GetJsonValue(failure.code, data, "code", false);
  GetJsonValue(failure.reason, data, "reason", false);
  GetJsonValue(failure.has_document, data, "has_document", false);
  GetJsonValue(failure.may_succeed_later, data, "may_succeed_later", false);
  GetJsonValue(failure.size, data, "size", false);
  GetJsonValue(failure.changed, data, "changed", false);
  GetJsonValue(failure.tried, data, "tried", false);
  GetJsonValue(failure.tries, data, "tries", false);
  return failure;
}

}  // namespace

void IndexFailure::SetFile(const struct stat& info) {
  size = info.st_size;
  changed = Nanoseconds(info.st_ctim);
}

bool IndexFailure::IsAbout(const struct stat& info) const {
  return size == info.st_size && changed == Nanoseconds(info.st_ctim);
}

std::optional<int64_t> IndexFailure::NextTry() const {
  if (!may_succeed_later) return std::nullopt;
  constexpr uint32_t kDoublings = 6;  // are enough for the longest pause
  return tried + std::min(kFirstPause << std::min(std::max(tries, 1U) - 1, kDoublings), kLongestPause);
}

bool IndexFailure::IsDue(int64_t now) const {
  return may_succeed_later && (now < tried || now >= *NextTry());
}

std::string IndexFailures::FileOf(const sdk::SDKShare& share) {
  return Dirname(share.GetDBPath()) + "/failures";
}

IndexFailures::IndexFailures(const std::string& file) : file_(file) {
  if (!IsFileExist(file)) return;
  Json::Value data;
  if (!fromFile(data, file) || !data.isObject() || !data["paths"].isObject()) {
    QUARROX_LOG_FAILURE("%s cannot be read; what failed is tried again when it changes", file.c_str());
    return;
  }
  const Json::Value& paths = data["paths"];
  for (auto it = paths.begin(); it != paths.end() && failures_.size() < kMost; ++it) {
    failures_.emplace(it.name(), FailureOf(*it));
  }
  if (data["omitted"].isUInt64()) omitted_ = data["omitted"].asUInt64();
}

const IndexFailure* IndexFailures::Find(const std::string& path) const {
  const auto found = failures_.find(path);
  return found == failures_.end() ? nullptr : &found->second;
}

// What lies below a path is one run of the map.
std::vector<std::string> IndexFailures::AtOrBelow(const std::string& path) const {
  std::vector<std::string> paths;
  if (failures_.count(path) != 0) paths.push_back(path);
  const std::string prefix = path + "/";
  for (auto it = failures_.lower_bound(prefix); it != failures_.end() && StringStartWith(it->first, prefix); ++it) {
    paths.push_back(it->first);
  }
  return paths;
}

std::vector<std::string> IndexFailures::Due(int64_t now) const {
  std::vector<std::string> paths;
  for (const auto& [path, failure] : failures_) {
    if (failure.IsDue(now)) paths.push_back(path);
  }
  return paths;
}

std::optional<int64_t> IndexFailures::NextTry() const {
  std::optional<int64_t> first;
  for (const auto& [path, failure] : failures_) {
    const std::optional<int64_t> next = failure.NextTry();
    if (next && (!first || *next < *first)) first = next;
  }
  return first;
}

void IndexFailures::Note(const std::string& path, IndexFailure failure) {
  failure.tried = time(nullptr);
  failure.tries = 1;
  changed_ = true;
  const auto found = failures_.find(path);
  if (found != failures_.end()) {
    const IndexFailure& before = found->second;
    if (before.size == failure.size && before.changed == failure.changed) failure.tries = before.tries + 1;
    found->second = std::move(failure);
  } else if (failures_.size() < kMost) {
    failures_.emplace(path, std::move(failure));
  } else {
    ++omitted_;
  }
}

void IndexFailures::Forget(const std::string& path) {
  if (failures_.erase(path) != 0) changed_ = true;
}

void IndexFailures::ForgetBelow(const std::string& path) {
  for (const std::string& gone : AtOrBelow(path)) Forget(gone);
  if (path.empty() && omitted_ != 0) {
    omitted_ = 0;
    changed_ = true;
  }
}

void IndexFailures::MoveBelow(const std::string& old_path, const std::string& new_path) {
  std::vector<Map::node_type> moved;
  for (const std::string& path : AtOrBelow(old_path)) moved.push_back(failures_.extract(path));
  if (moved.empty()) return;
  ForgetBelow(new_path);
  for (Map::node_type& node : moved) {
    node.key().replace(0, old_path.size(), new_path);
    failures_.insert(std::move(node));
  }
  changed_ = true;
}

void IndexFailures::Save() {
  if (!changed_) return;
  Json::Value data(Json::objectValue);
  Json::Value& paths = data["paths"] = Json::Value(Json::objectValue);
  for (const auto& [path, failure] : failures_) paths[path] = AsJson(failure);
  data["omitted"] = Json::UInt64{omitted_};
  if (toFile(data, file_)) {
    changed_ = false;
  } else {
    QUARROX_LOG_FAILURE("%s cannot be written", file_.c_str());
  }
}

}  // namespace quarrox::fileindex
