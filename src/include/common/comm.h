// The request channel to the search engine: one JSON request, one JSON response.
#pragma once

#include <functional>
#include <string>

#include <json/json.h>

#include "common/export.h"

namespace quarrox {

inline constexpr char kElasticdSocketPath[] = "/var/run/vexoelasticd.sock";
inline constexpr long kElasticdConnectTimeout = 864000;  // in seconds: ten days

// The engine's own error codes that callers tell apart; each becomes the code of a thrown Error.
enum ElasticdCode : int {
  kElasticdIndexOpening = 607,
  kElasticdIndexRecovering = 608,
  kElasticdNoSuchIndex = 609,
  kElasticdIndexPaused = 610,
  kElasticdBadQuery = 613,
  kElasticdNoRoom = 618,
  kElasticdOutOfMemory = 1400,
  kElasticdTooManyRequests = 1401
};

// Whether the engine has too much to do for now: it is out of its memory budget or has too many requests.
inline bool IsElasticdBusy(int code) {
  return code == kElasticdOutOfMemory || code == kElasticdTooManyRequests;
}

// Sends a request over a connection of its own and waits for the response, which is in `res` on return, "success" true.
// A request is {"command", "data"}, or {"compound": array of such}. Items of a compound request that failed are only
// logged, except that a busy engine fails the whole.
//
// Waits up to 31 s for an engine that has not made its socket yet, then as long as the engine takes. Throws Error 913
// where the engine cannot be reached, goes away or answers what is no response; the engine's own code where it refuses
// ("Request failed, msg=" and its message) or an item was refused because it is busy (its message); 120 where a
// refusal is malformed. Any thread may call; callers that hold a lock keep it for that time.
QUARROX_API void SendRequestImpl(Json::Value& res, const Json::Value& req);

// Takes a response as the text that it came as; false where it is to be read as ever.
using TakeResponse = std::function<bool(const std::string& text)>;

// The same for large responses: where `take` took it, `res` stays as it was.
QUARROX_API void SendRequestImpl(Json::Value& res, const Json::Value& req, const TakeResponse& take);

}  // namespace quarrox
