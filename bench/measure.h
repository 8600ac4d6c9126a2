// What the benchmarks measure with: a piece of work in a process of its own, its CPU time and the memory that it added.
#pragma once

#include <functional>

namespace quarrox::bench {

struct Cost {
  double cpu_seconds = 0;  // user and system
  double wall_seconds = 0;
  double peak_bytes = 0;  // by how much the peak of resident memory passed what was resident before
};

// Runs `work` in a child process `runs` times and returns the run with the median of one of its costs. A child that
// fails ends the program.
Cost Measure(const std::function<void()>& work, int runs = 3, double Cost::*median_of = &Cost::cpu_seconds);

// How long a piece of work takes, by the wall.
double Seconds(const std::function<void()>& work);

}  // namespace quarrox::bench
