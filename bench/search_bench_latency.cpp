#include "search_bench_latency.h"

#include <algorithm>
#include <atomic>
#include <cmath>
#include <future>
#include <thread>

namespace quarrox::bench {
namespace {

constexpr std::chrono::milliseconds kEvery(20);

// What waking up costs is not the engine's.
Latencies Repeat(const std::function<void()>& request, Latencies::Clock::time_point due,
                 const std::atomic<bool>& stopped) {
  Latencies latencies;
  do {
    const bool is_late = Latencies::Clock::now() > due;
    std::this_thread::sleep_until(due);
    latencies.Measure(request, is_late ? due : Latencies::Clock::now());
    due += kEvery;
  } while (!stopped);
  return latencies;
}

}  // namespace

void Latencies::Measure(const std::function<void()>& request, Clock::time_point due) {
  request();
  milliseconds_.push_back(std::chrono::duration<double, std::milli>(Clock::now() - due).count());
}

double Latencies::At(double quantile) const {
  std::vector<double> sorted = milliseconds_;
  std::sort(sorted.begin(), sorted.end());
  return sorted[static_cast<size_t>(std::ceil(quantile * static_cast<double>(sorted.size() - 1)))];
}

std::vector<Latencies> MeasureBeside(const std::vector<std::function<void()>>& requests,
                                     const std::function<void()>& work) {
  std::atomic<bool> stopped(false);
  std::vector<std::future<Latencies>> running;
  auto begin = Latencies::Clock::now();
  for (const auto& request : requests) {
    running.push_back(std::async(std::launch::async, [&, begin] { return Repeat(request, begin, stopped); }));
    begin += kEvery / requests.size();
  }
  try {
    work();
  } catch (...) {
    stopped = true;
    throw;  // the futures wait for their threads
  }
  stopped = true;
  std::vector<Latencies> latencies;
  for (auto& request : running) latencies.push_back(request.get());
  return latencies;
}

}  // namespace quarrox::bench
