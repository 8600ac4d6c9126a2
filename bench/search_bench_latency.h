// How long single requests take.
#pragma once

#include <chrono>
#include <cstddef>
#include <functional>
#include <vector>

namespace quarrox::bench {

class Latencies {
 public:
  using Clock = std::chrono::steady_clock;

  // Calls `request` and takes down how long it took, or how long ago `due` is.
  void Measure(const std::function<void()>& request) { Measure(request, Clock::now()); }
  void Measure(const std::function<void()>& request, Clock::time_point due);

  // In milliseconds. The quantile is 0 to 1: half of the requests took no longer than At(0.5), none longer than At(1).
  // There must be one.
  double At(double quantile) const;

  size_t size() const { return milliseconds_.size(); }

 private:
  std::vector<double> milliseconds_;
};

// Makes each of the requests every 20 ms in a thread of its own, one in the pauses of the other, from before `work`
// until after it and at least until each was made once, and returns how long each took, in their order. One that a slow
// one before it has held up counts from when it was due. Passes on what `work` throws, else what a request throws.
std::vector<Latencies> MeasureBeside(const std::vector<std::function<void()>>& requests,
                                     const std::function<void()>& work);

}  // namespace quarrox::bench
