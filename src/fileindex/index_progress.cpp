#include "fileindex/index_progress.h"

#include <fcntl.h>
#include <unistd.h>

#include <cstdio>

#include "common/file.h"
#include "common/json.h"
#include "common/strings.h"
#include "common/unique_fd.h"

namespace quarrox::fileindex {
namespace {

constexpr const char* kStates[] = {"idle", "working", "waiting"};

// What is missing or no number stays as it is.
template <typename T>
void Take(T& number, const Json::Value& data, const char* key) {
  const Json::Value& value = data[key];
  if (value.isUInt64()) number = static_cast<T>(value.asUInt64());
}

std::string TextOf(const Json::Value& value) {
  return value.isString() ? value.asString() : std::string();
}

}  // namespace

std::string IndexProgress::FileOf(const sdk::SDKShare& share) {
  return Dirname(share.GetDBPath()) + "/progress";
}

std::optional<IndexProgress> IndexProgress::Load(const std::string& file) {
  Json::Value read;
  if (!IsFileExist(file) || !fromFile(read, file) || !read.isObject()) return std::nullopt;
  const Json::Value& data = read;
  IndexProgress progress;
  for (const State state : {State::kIdle, State::kWorking, State::kWaiting}) {
    if (TextOf(data["state"]) == kStates[static_cast<size_t>(state)]) progress.state = state;
  }
  Take(progress.pid, data, "pid");
  Take(progress.since, data, "since");
  Take(progress.updated, data, "updated");
  Take(progress.committed, data, "committed");
  Take(progress.done, data, "done");
  Take(progress.failed, data, "failed");
  if (data["left"].isUInt64()) progress.left = data["left"].asUInt64();
  const Json::Value& operations = data["operations"];
  for (Json::ArrayIndex i = 0; operations.isArray() && i < progress.operations.size(); ++i) {
    if (operations[i].isUInt64()) progress.operations[i] = operations[i].asUInt64();
  }
  progress.path = TextOf(data["path"]);
  progress.reason = TextOf(data["reason"]);
  progress.held_back_by = TextOf(data["held_back_by"]);
  return progress;
}

bool IndexProgress::Save(const std::string& file) const {
  Json::Value data(Json::objectValue);
  data["state"] = kStates[static_cast<size_t>(state)];
  data["pid"] = Json::Int64{pid};
  data["since"] = Json::Int64{since};
  data["updated"] = Json::Int64{updated};
  data["committed"] = Json::Int64{committed};
  data["done"] = Json::UInt64{done};
  data["failed"] = Json::UInt64{failed};
  if (left) data["left"] = Json::UInt64{*left};
  for (const uint64_t count : operations) data["operations"].append(Json::UInt64{count});
  data["path"] = path;
  data["reason"] = reason;
  data["held_back_by"] = held_back_by;
  const std::string text = toString(data) + '\n';
  const std::string beside = file + ".new";
  const UniqueFd out(open(beside.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW, 0600));
  if (!out || write(out.get(), text.data(), text.size()) != static_cast<ssize_t>(text.size())) return false;
  return rename(beside.c_str(), file.c_str()) == 0;
}

}  // namespace quarrox::fileindex
