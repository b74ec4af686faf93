// Timing helpers shared by the benchmark programs. Figures are compared as
// ratios within one run, so each keeps the fastest of a few runs: the one
// least disturbed by the rest of a shared machine.
#ifndef ORVEX_BENCH_BENCH_TIMING_H_
#define ORVEX_BENCH_BENCH_TIMING_H_

#include <algorithm>
#include <chrono>
#include <functional>

namespace orvex {
namespace bench {

using Clock = std::chrono::steady_clock;

inline double Seconds(Clock::time_point start) {
  return std::chrono::duration<double>(Clock::now() - start).count();
}

// The fastest of `repeats` runs of run(), each returning its own seconds.
inline double Fastest(const std::function<double()>& run, int repeats = 3) {
  double best = run();
  for (int i = 1; i < repeats; ++i) best = std::min(best, run());
  return best;
}

}  // namespace bench
}  // namespace orvex

#endif  // ORVEX_BENCH_BENCH_TIMING_H_
