#include "measure.h"

#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <fstream>
#include <string>
#include <vector>

namespace quarrox::bench {
namespace {

double StatusBytes(const std::string& key) {
  std::ifstream status("/proc/self/status");
  std::string word;
  while (status >> word) {
    double kib = 0;
    if (word == key && status >> kib) return kib * 1024;
  }
  return 0;
}

double CpuSeconds() {
  return static_cast<double>(clock()) / CLOCKS_PER_SEC;
}

Cost RunHere(const std::function<void()>& work) {
  Cost cost;
  const double resident = StatusBytes("VmRSS:");
  const double cpu = CpuSeconds();
  cost.wall_seconds = Seconds(work);
  cost.cpu_seconds = CpuSeconds() - cpu;
  cost.peak_bytes = StatusBytes("VmHWM:") - resident;
  return cost;
}

Cost RunInChild(const std::function<void()>& work) {
  int ends[2];
  if (pipe(ends) != 0) abort();
  fflush(stdout);
  const pid_t child = fork();
  if (child == 0) {
    const Cost cost = RunHere(work);
    const bool sent = write(ends[1], &cost, sizeof(cost)) == sizeof(cost);
    fflush(stdout);
    _exit(sent ? 0 : 1);
  }
  close(ends[1]);
  Cost cost;
  const bool received = read(ends[0], &cost, sizeof(cost)) == sizeof(cost);
  close(ends[0]);
  int status = 0;
  waitpid(child, &status, 0);
  if (!received || status != 0) {
    fprintf(stderr, "a measured process failed (status %d)\n", status);
    exit(1);
  }
  return cost;
}

}  // namespace

double Seconds(const std::function<void()>& work) {
  const auto start = std::chrono::steady_clock::now();
  work();
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

Cost Measure(const std::function<void()>& work, int runs, double Cost::*median_of) {
  std::vector<Cost> costs;
  for (int i = 0; i < runs; ++i) costs.push_back(RunInChild(work));
  std::sort(costs.begin(), costs.end(), [=](const Cost& a, const Cost& b) { return a.*median_of < b.*median_of; });
  return costs[costs.size() / 2];
}

}  // namespace quarrox::bench
