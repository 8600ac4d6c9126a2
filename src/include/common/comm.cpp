#include "common/comm.h"

#include <unistd.h>

#include <cerrno>
#include <string>

#include "common/json.h"
#include "common/log.h"
#include "vexo/socket.h"

namespace quarrox {
namespace {

constexpr int kSocketWaits = 31;  // of a second each

// One who waited in vain goes on: the connection then fails and says why.
void WaitForSocket() {
  for (int attempt = 1; attempt <= kSocketWaits; ++attempt) {
    if (access(kElasticdSocketPath, F_OK) == 0) return;
    QUARROX_LOG_PROGRESS("elastic socket is not ready, retry ... %d", attempt);
    sleep(1);
    errno = 0;  // the miss is in the log; a later line is not about it
  }
}

[[noreturn]] void ThrowRefusal(const Json::Value& error) {
  int code = 0;
  std::string msg;
  GetJsonValue(code, error, "code", true);
  GetJsonValue(msg, error, "msg", true);
  throw Error(static_cast<ErrorCode>(code), "Request failed, msg=" + msg);
}

struct ItemResult {
  bool success = false;
  int code = 0;
  std::string msg = {};
};

// A code or message that a failed item lacks reads as 0 and empty: it fails no more than its item.
ItemResult ReadItem(const Json::Value& item) {
  ItemResult result;
  GetJsonValue(result.success, item, "success", false);
  if (result.success) return result;
  Json::Value error(Json::objectValue);
  GetJsonValue(error, item, "error", false);
  GetJsonValue(result.code, error, "code", false);
  GetJsonValue(result.msg, error, "msg", false);
  return result;
}

}  // namespace

void SendRequestImpl(Json::Value& res, const Json::Value& req) {
  SendRequestImpl(res, req, [](const std::string&) { return false; });
}

void SendRequestImpl(Json::Value& res, const Json::Value& req, const TakeResponse& take) {
  const std::string text = toString(req);  // before connecting, so that the engine need not wait for it
  WaitForSocket();
  vexodaemon::DomainSockConnection conn(kElasticdSocketPath);
  if (!conn.Connect(kElasticdConnectTimeout)) {
    QUARROX_THROW("!conn.Connect(kElasticdConnectTimeout)", kErrEngineReceive, "Connect failed");
  }
  if (!conn.Send(text)) QUARROX_THROW("!conn.Send(req.toString())", kErrEngineReceive, "Send failed");

  std::string resp_raw;
  const bool is_received = conn.Recv(resp_raw);
  if (is_received && take(resp_raw)) return;
  if (!is_received || !fromString(res, resp_raw) || !res.isObject() || !res.isMember("success") ||
      !res["success"].isBool()) {
    QUARROX_THROW(
        "!conn.Recv(resp_raw) || !res.fromString(resp_raw) || !res.isMember(\"success\") || "
        "!res[\"success\"].isBool()",
        kErrEngineReceive, "Recv failed, res=" + toString(res));
  }
  const Json::Value& response = res;  // looking at what is not there adds nothing
  if (!response["success"].asBool()) ThrowRefusal(response["error"]);
  bool has_fail = false;
  GetJsonValue(has_fail, response, "has_fail", false);
  if (!has_fail || !req.isObject() || !req["compound"].isArray() || !response["data"].isArray()) return;
  for (Json::ArrayIndex i = 0; i < response["data"].size(); ++i) {
    const ItemResult item = ReadItem(response["data"][i]);
    if (item.success) continue;
    if (IsElasticdBusy(item.code)) throw Error(static_cast<ErrorCode>(item.code), item.msg);
    const std::string what = log::Text(toString(req["compound"][i]));
    QUARROX_LOG_FAILURE("Compound failed: %s (%d) %s", what.c_str(), item.code, log::Text(item.msg).c_str());
  }
}

}  // namespace quarrox
