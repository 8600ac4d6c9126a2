// The engine as its clients have it: the real program, asked over its socket.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <string>

#include <json/json.h>

namespace quarrox::bench {

// Gives this process, and those that it starts from then on, a /run of their own in memory, so that the engine's socket
// is nobody else's. Everything else stays the machine's. False where that is not permitted.
bool EnterPrivateRun();

// A running engine. The client's calls of this process go to it. Everything throws std::system_error or Error where it
// fails.
class EngineProcess {
 public:
  // Starts one that keeps its list of indexes in `data_directory`; returns when it has its socket.
  explicit EngineProcess(const std::string& data_directory);

  // Stops it in order, and not so where it does not stop. It also stops when this process dies.
  ~EngineProcess();
  EngineProcess(const EngineProcess&) = delete;
  EngineProcess& operator=(const EngineProcess&) = delete;

  // User and system time of all its threads up to now, to a hundredth of a second.
  double cpu_seconds() const;

  // The peak of its resident memory, all of it, since it started or was last told to begin anew.
  double peak_bytes() const;
  void ResetPeak() const;

 private:
  void WaitForSocket();
  void Stop();
  std::string Proc(const char* file) const;

  pid_t pid_ = -1;
};

// What a piece of work cost on both sides of the socket.
struct Spent {
  double client_cpu_seconds = 0;
  double engine_cpu_seconds = 0;
  double wall_seconds = 0;

  double cpu_seconds() const { return client_cpu_seconds + engine_cpu_seconds; }
};
Spent MeasureBothSides(const EngineProcess& engine, const std::function<void()>& work);

// Makes the index of a share that need not exist, at a path of its own.
void CreateIndex(const std::string& share, const std::string& path);

// The request for the documents of a share that a query finds.
Json::Value QueryRequest(const std::string& share, const Json::Value& qsl);

// How many documents are below a directory.
uint64_t CountBelow(const std::string& share, const std::string& directory);

}  // namespace quarrox::bench
