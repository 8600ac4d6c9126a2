#include "command.h"

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <iterator>

#include "common/json.h"

namespace quarrox::fileindexd {
namespace {

struct Row {
  const char* name;
  Command::Type type;
  bool has_share;
};

// Pausing carries its end with it; it is read from the status file instead, which was written before.
constexpr Row kCommands[] = {
    {"worker_create", Command::kWorkerCreate, true},
    {"worker_delete", Command::kWorkerDelete, true},
    {"notify_setting_changed", Command::kSettingChanged, true},
    {"pause", Command::kPauseChanged, false},
    {"resume", Command::kPauseChanged, false},
};

// A name from outside as it goes into an answer and a log line.
constexpr size_t kMaxQuoted = 100;

const std::string* FindText(const Json::Value& object, const char* key, std::string& text) {
  if (!object.isObject()) return nullptr;
  const Json::Value* member = object.find(key, key + strlen(key));
  if (member == nullptr || !member->isString()) return nullptr;
  text = member->asString();
  return &text;
}

std::string Frame(const Json::Value& answer) {
  const std::string text = toString(answer);
  const auto length = static_cast<uint32_t>(text.size() + 1);
  std::string frame(sizeof(length), '\0');
  memcpy(frame.data(), &length, sizeof(length));
  return frame.append(text.c_str(), length);
}

}  // namespace

Command ParseCommand(const std::string& text) {
  Json::Value request;
  std::string name;
  if (!fromString(request, text) || FindText(request, "type", name) == nullptr) {
    throw Error(kErrBadParameter, "The request is no JSON object with a text \"type\"");
  }
  const Row* row =
      std::find_if(std::begin(kCommands), std::end(kCommands), [&](const Row& r) { return r.name == name; });
  if (row == std::end(kCommands)) throw Error(kErrBadParameter, "Unknown command: " + name.substr(0, kMaxQuoted));
  Command command{row->type, {}};
  if (row->has_share && FindText(request["data"], "share_name", command.share) == nullptr) {
    throw Error(kErrBadParameter, name + " needs \"data\" with a text \"share_name\"");
  }
  return command;
}

std::string Acceptance() {
  Json::Value answer;
  answer["success"] = true;
  return Frame(answer);
}

std::string Refusal(ErrorCode code, const std::string& reason) {
  Json::Value answer;
  answer["success"] = false;
  answer["error"]["code"] = code;
  answer["error"]["msg"] = reason;
  return Frame(answer);
}

}  // namespace quarrox::fileindexd
