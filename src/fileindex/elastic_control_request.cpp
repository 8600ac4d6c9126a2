#define QUARROX_LOG_UNIT "elastic_control"
#include "fileindex/elastic_control_request.h"

#include <unistd.h>

#include <cstdlib>

#include "common/comm.h"
#include "common/json.h"
#include "common/log.h"
#include "fileindex/notices.h"

namespace quarrox::fileindex::elastic {
namespace {

constexpr unsigned int kNotReadyWait = 30;  // seconds
constexpr unsigned int kBusyWait = 900;
constexpr unsigned int kBusyWaitStep = 60;  // up to four of them are added, so that callers do not come back at once
constexpr unsigned int kBusyStepChoices = 5;
constexpr unsigned int kBusyAnswersBeforeNotice = 10;

bool IsNotReady(int code) {
  return code == kElasticdIndexOpening || code == kElasticdIndexRecovering || code == kElasticdIndexPaused;
}

std::string TextOf(const Json::Value& object, const char* key) {
  std::string text;
  if (object.isObject()) GetJsonValue(text, object, key, false);
  return text;
}

// Waits out the busy answers of one request.
class BusyWait {
 public:
  explicit BusyWait(const Json::Value& req) : req_(req) {}

  void Wait() {
    const std::string command = TextOf(req_, "command");
    const std::string db = req_.isObject() ? TextOf(req_["data"], "id") : "";
    QUARROX_LOG_PROGRESS("Retry[%u] since vexoelasticd is busy. Command: %s, db: %s", answers_, command.c_str(),
                         db.c_str());
    ++answers_;
    if (answers_ > kBusyAnswersBeforeNotice && !is_reported_) {
      NotifyLackOfMemory();
      is_reported_ = true;
    }
    sleep(kBusyWait + kBusyWaitStep * (static_cast<unsigned int>(rand()) % kBusyStepChoices));
  }

 private:
  const Json::Value& req_;
  unsigned int answers_ = 0;
  bool is_reported_ = false;
};

}  // namespace

Json::Value MakeRequest(const std::string& command, const Json::Value& data) {
  Json::Value request(Json::objectValue);
  request["command"] = command;
  request["data"] = data;
  return request;
}

void SendElasticRequest(Json::Value& res, const Json::Value& req) {
  BusyWait busy(req);
  for (;;) {
    int code = 0;
    try {
      SendRequestImpl(res, req);
      return;
    } catch (const Error& error) {
      code = error.code;
      if (!IsNotReady(code) && !IsElasticdBusy(code)) throw;
    }
    if (IsElasticdBusy(code)) {
      busy.Wait();
    } else {
      QUARROX_LOG_PROGRESS("DB is not good yet, retry... (Error Code: %d)", code);
      sleep(kNotReadyWait);
    }
  }
}

void SendElasticCommand(const Json::Value& req) {
  Json::Value res;
  SendElasticRequest(res, req);
}

}  // namespace quarrox::fileindex::elastic
