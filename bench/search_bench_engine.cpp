#include "search_bench_engine.h"

#include <sched.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdio>
#include <ctime>
#include <fstream>
#include <iterator>
#include <sstream>
#include <stdexcept>
#include <system_error>
#include <thread>

#include "common/comm.h"
#include "common/json.h"
#include "fileindex/elastic_control.h"

namespace quarrox::bench {
namespace {

using namespace std::chrono_literals;
using std::chrono::steady_clock;
namespace elastic = fileindex::elastic;

// It commits what is pending when it stops.
constexpr auto kStopsWithin = 60s;
constexpr auto kStartsWithin = 30s;
constexpr auto kStep = 5ms;

// In /proc/PID/stat, counted behind the command, which is in parentheses and may have blanks in it.
constexpr int kFieldsBeforeTimes = 11;

double Clock() {
  return static_cast<double>(clock()) / CLOCKS_PER_SEC;
}

// Of the child: becomes the engine.
[[noreturn]] void Exec(const std::string& data_directory, pid_t parent) {
  prctl(PR_SET_PDEATHSIG, SIGTERM);
  if (getppid() != parent) _exit(1);  // it died before
  execl(VEXOELASTICD, VEXOELASTICD, "--foreground", "--data", data_directory.c_str(), nullptr);
  perror(VEXOELASTICD);
  _exit(1);
}

Json::Value Request(const char* command, Json::Value data) {
  Json::Value request(Json::objectValue);
  request["command"] = command;
  request["data"].swap(data);
  return request;
}

}  // namespace

bool EnterPrivateRun() {
  return unshare(CLONE_NEWNS) == 0 && mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0 &&
         mount("scratch", "/run", "tmpfs", 0, "mode=0755") == 0;
}

EngineProcess::EngineProcess(const std::string& data_directory) {
  fflush(stdout);
  const pid_t parent = getpid();
  pid_ = fork();
  if (pid_ == 0) Exec(data_directory, parent);
  if (pid_ < 0) throw std::system_error(errno, std::generic_category(), "fork");
  try {
    WaitForSocket();
  } catch (...) {
    Stop();
    throw;
  }
}

EngineProcess::~EngineProcess() {
  Stop();
}

void EngineProcess::WaitForSocket() {
  const auto end = steady_clock::now() + kStartsWithin;
  while (access(kElasticdSocketPath, F_OK) != 0) {
    if (waitpid(pid_, nullptr, WNOHANG) == pid_) pid_ = -1;
    if (pid_ < 0 || steady_clock::now() > end) throw std::runtime_error("the engine did not start: " VEXOELASTICD);
    std::this_thread::sleep_for(kStep);
  }
}

void EngineProcess::Stop() {
  if (pid_ < 0) return;
  kill(pid_, SIGTERM);
  const auto end = steady_clock::now() + kStopsWithin;
  while (waitpid(pid_, nullptr, WNOHANG) == 0) {
    if (steady_clock::now() > end) {
      fprintf(stderr, "the engine did not stop and is killed\n");
      kill(pid_, SIGKILL);
      waitpid(pid_, nullptr, 0);
      break;
    }
    std::this_thread::sleep_for(kStep);
  }
  pid_ = -1;
}

std::string EngineProcess::Proc(const char* file) const {
  return "/proc/" + std::to_string(pid_) + "/" + file;
}

double EngineProcess::cpu_seconds() const {
  std::ifstream in(Proc("stat"));
  const std::string stat(std::istreambuf_iterator<char>(in), {});
  std::istringstream fields(stat.substr(stat.rfind(')') + 1));
  std::string skipped;
  for (int i = 0; i < kFieldsBeforeTimes; ++i) fields >> skipped;
  double user = 0;
  double system = 0;
  if (!(fields >> user >> system)) throw std::runtime_error("the engine is no longer there");
  return (user + system) / static_cast<double>(sysconf(_SC_CLK_TCK));
}

double EngineProcess::peak_bytes() const {
  std::ifstream status(Proc("status"));
  for (std::string word; status >> word;) {
    double kib = 0;
    if (word == "VmHWM:" && status >> kib) return kib * 1024;
  }
  throw std::runtime_error("the engine is no longer there");
}

void EngineProcess::ResetPeak() const {
  std::ofstream(Proc("clear_refs")) << "5";
}

Spent MeasureBothSides(const EngineProcess& engine, const std::function<void()>& work) {
  const double client = Clock();
  const double server = engine.cpu_seconds();
  const auto start = steady_clock::now();
  work();
  Spent spent;
  spent.wall_seconds = std::chrono::duration<double>(steady_clock::now() - start).count();
  spent.client_cpu_seconds = Clock() - client;
  spent.engine_cpu_seconds = engine.cpu_seconds() - server;
  return spent;
}

void CreateIndex(const std::string& share, const std::string& path) {
  Json::Value data(Json::objectValue);
  data["id"] = elastic::GetFileIndexID(share);
  data["path"] = path;
  data["settings"] = elastic::GetFileIndexSettings();
  data["mappings"] = elastic::GetFileIndexMappings();
  data["event_handler"] = elastic::GetFileIndexEventHandler();
  Json::Value response;
  SendRequestImpl(response, Request("index_create", std::move(data)));
}

Json::Value QueryRequest(const std::string& share, const Json::Value& qsl) {
  Json::Value data(Json::objectValue);
  data["id"] = elastic::GetFileIndexID(share);
  data["query"]["qsl"] = qsl;
  data["query"]["load_field"].append("VEXOMDPath");
  return Request("document_get_by_query", std::move(data));
}

// The engine knows the number of all when it has passed the last one.
uint64_t CountBelow(const std::string& share, const std::string& directory) {
  Json::Value qsl(Json::objectValue);
  qsl["prefix"]["VEXOMDPath"] = directory + "/";
  Json::Value request = QueryRequest(share, qsl);
  request["data"]["query"]["from"] = Json::UInt{UINT32_MAX};
  Json::Value response;
  SendRequestImpl(response, request);
  if (!response["total"].isUInt64()) throw std::runtime_error("no total: " + toString(response));
  return response["total"].asUInt64();
}

}  // namespace quarrox::bench
