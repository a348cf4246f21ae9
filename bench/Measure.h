// How long something takes: its median and 99th percentile over many times, in microseconds.
#pragma once

#include <algorithm>
#include <chrono>
#include <functional>
#include <vector>

namespace bench {

struct Sample {
  double median;  ///< microseconds
  double p99;
};

/// Runs `work` until 2000 times or a second have passed, after a tenth of that to warm up.
inline Sample measure(const std::function<void()>& work) {
  using Clock = std::chrono::steady_clock;
  constexpr int kTimes = 2000;
  std::vector<double> times;
  const auto start = Clock::now();
  for (int i = -kTimes / 10; i < kTimes && Clock::now() - start < std::chrono::seconds(1); ++i) {
    const auto before = Clock::now();
    work();
    const std::chrono::duration<double, std::micro> time = Clock::now() - before;
    if (i >= 0 || Clock::now() - start > std::chrono::milliseconds(100)) times.push_back(time.count());
  }
  std::sort(times.begin(), times.end());
  return {times[times.size() / 2], times[times.size() * 99 / 100]};
}

}  // namespace bench
