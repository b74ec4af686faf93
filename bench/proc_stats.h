// What the benchmarks read of other processes from /proc: memory figures,
// processor time, children. Figures are approximate by nature (the kernel
// counts in pages and clock ticks) and each reader returns a neutral value
// for a process that is gone.
#ifndef ORVEX_BENCH_PROC_STATS_H_
#define ORVEX_BENCH_PROC_STATS_H_

#include <sys/types.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

namespace orvex {
namespace bench {

// The number on the "KEY: N ..." line of /proc/PID/FILE (kB for the memory
// lines of "status", a count for those of "io"); -1 when absent.
inline long long ProcNumber(pid_t pid, const char* file, const std::string& key) {
  std::ifstream in("/proc/" + std::to_string(pid) + "/" + file);
  for (std::string line; std::getline(in, line);) {
    if (line.compare(0, key.size() + 1, key + ":") == 0) {
      return std::atoll(line.c_str() + key.size() + 1);
    }
  }
  return -1;
}

// A memory line of /proc/PID/status ("VmHWM", "VmRSS") in KiB; -1 when absent.
inline long long StatusKiB(pid_t pid, const std::string& key) {
  return ProcNumber(pid, "status", key);
}

inline double KiBToMiB(long long kib) { return static_cast<double>(kib) / 1024; }

// The text of /proc/PID/stat after the command name, which may itself hold
// spaces and parentheses; empty when the process is gone.
inline std::string StatFieldsAfterName(pid_t pid) {
  std::ifstream in("/proc/" + std::to_string(pid) + "/stat");
  std::string text;
  std::getline(in, text);
  const size_t close = text.rfind(')');
  return close == std::string::npos || close + 2 > text.size() ? std::string()
                                                               : text.substr(close + 2);
}

// The processor seconds (user and system) pid has used so far: on a shared
// machine a rate per processor second varies less than one by the clock.
inline double ProcessorSeconds(pid_t pid) {
  std::istringstream fields(StatFieldsAfterName(pid));
  std::string field;
  unsigned long long utime = 0;
  unsigned long long stime = 0;
  // After the name: state is field 3, utime 14 and stime 15.
  for (int i = 3; i <= 13 && fields >> field; ++i) {
  }
  fields >> utime >> stime;
  return static_cast<double>(utime + stime) / static_cast<double>(::sysconf(_SC_CLK_TCK));
}

// The processes whose parent is parent (a daemon's workers).
inline std::vector<pid_t> Children(pid_t parent) {
  std::vector<pid_t> children;
  for (const auto& entry : std::filesystem::directory_iterator("/proc")) {
    const std::string name = entry.path().filename().string();
    if (name.find_first_not_of("0123456789") != std::string::npos) continue;
    const pid_t pid = static_cast<pid_t>(std::atol(name.c_str()));
    char state = 0;
    int ppid = 0;
    if (std::sscanf(StatFieldsAfterName(pid).c_str(), "%c %d", &state, &ppid) == 2 &&
        ppid == parent) {
      children.push_back(pid);
    }
  }
  return children;
}

// The value at fraction (0 to 1) of values in sorted order, the nearest rank.
inline double Percentile(std::vector<double> values, double fraction) {
  if (values.empty()) return 0;
  std::sort(values.begin(), values.end());
  const size_t at = static_cast<size_t>(fraction * static_cast<double>(values.size() - 1) + 0.5);
  return values[std::min(at, values.size() - 1)];
}

}  // namespace bench
}  // namespace orvex

#endif  // ORVEX_BENCH_PROC_STATS_H_
