// Timing and reporting helpers shared by the benchmark programs. Figures are
// compared as ratios within one run, so each keeps the fastest of a few runs:
// the one least disturbed by the rest of a shared machine.
#ifndef ORVEX_BENCH_BENCH_TIMING_H_
#define ORVEX_BENCH_BENCH_TIMING_H_

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <cstdio>
#include <functional>
#include <vector>

namespace orvex {
namespace bench {

using Clock = std::chrono::steady_clock;

inline double Seconds(Clock::time_point start) {
  return std::chrono::duration<double>(Clock::now() - start).count();
}

// The seconds work() takes.
inline double SecondsOf(const std::function<void()>& work) {
  const Clock::time_point start = Clock::now();
  work();
  return Seconds(start);
}

// Prints "<what>: <value><unit> (target <= <target>) PASS|FAIL"; true on PASS.
inline bool Report(const char* what, double value, const char* unit, double target) {
  const bool pass = value <= target;
  std::printf("%s: %.3f%s (target <= %g) %s\n", what, value, unit, target, pass ? "PASS" : "FAIL");
  std::fflush(stdout);
  return pass;
}

// The fastest of `repeats` runs of run(), each returning its own seconds.
inline double Fastest(const std::function<double()>& run, int repeats = 3) {
  double best = run();
  for (int i = 1; i < repeats; ++i) best = std::min(best, run());
  return best;
}

// Pushes what a set-up step just wrote out of the processor's caches by
// writing over a buffer larger than any of them. A timed step on a large
// structure then starts from memory whatever the structure's size, and a
// doubling ratio measures the work rather than how much more of the smaller
// structure was still cached.
inline void EvictCaches() {
  constexpr size_t kBytes = size_t{512} << 20;
  constexpr size_t kLine = 64;
  static std::vector<unsigned char> sweep(kBytes);
  for (size_t i = 0; i < kBytes; i += kLine) ++sweep[i];
}

}  // namespace bench
}  // namespace orvex

#endif  // ORVEX_BENCH_BENCH_TIMING_H_
