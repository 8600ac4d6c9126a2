// One exchange with a daemon that is waited for a few seconds at most, for questions of people: whoever indexes waits
// without end instead. Thread-safe.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <string>

#include <json/json.h>

namespace quarrox::ctl {

struct DaemonAnswer {
  Json::Value object = {};  // its "success" is true or false
  pid_t daemon = 0;         // the process that listens; 0 where that cannot be told from here
};

// How long each step of an exchange may take, and the longest answer in bytes.
struct ExchangeLimits {
  int seconds = 5;
  uint32_t longest = uint32_t{1} << 20;
};

// Sends a request to the Unix socket at a path and takes the answer. Throws Error 502 with the socket's path where
// nobody listens there, the time is up, or the answer is none.
DaemonAnswer Exchange(const std::string& socket_path, const Json::Value& request, ExchangeLimits limits = {});

}  // namespace quarrox::ctl
