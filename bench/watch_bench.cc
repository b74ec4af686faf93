// The watcher's own cost, with the kernel's part included: how fast a tree is
// first watched, and how many changes per second become queue lines (created
// and written files, then renames and deletes), all in one process driving
// the step function. Prints its figures. FILES (default 20000) is the number
// of files created.
//
//   build/watch_bench [FILES]
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>

#include "kalo/kalo_notify.h"
#include "orvex/portable/root.h"
#include "watch/watcher.h"

namespace {

namespace fs = std::filesystem;
using Clock = std::chrono::steady_clock;

double Seconds(Clock::time_point since) {
  return std::chrono::duration<double>(Clock::now() - since).count();
}

size_t Drain(orvex::watch::Watcher& watcher) {
  size_t events = 0;
  for (size_t n; (n = watcher.RunOnce(0)) > 0;) events += n;
  return events;
}

size_t CountLines(const std::string& path) {
  std::ifstream in(path);
  size_t lines = 0;
  for (std::string line; std::getline(in, line);) ++lines;
  return lines;
}

}  // namespace

int main(int argc, char** argv) {
  const int files = argc > 1 ? std::atoi(argv[1]) : 20000;
  char pattern[] = "/tmp/watch-bench-XXXXXX";
  if (::mkdtemp(pattern) == nullptr) return 1;
  const std::string root = pattern;
  ::setenv("ORVEX_ROOT", root.c_str(), 1);
  const std::string share = root + "/volume1/share";
  const std::string queue = share + "/@eaDir/@fileindex/queue";
  const int dirs = 2000;
  for (int d = 0; d < dirs; ++d)
    fs::create_directories(share + "/a" + std::to_string(d % 20) + "/b" + std::to_string(d));

  orvex::watch::WatcherOptions options;
  options.registry_dir = orvex::portable::RootPath(KALO::KALONOTIFYD::kMonitorRegistryDir);
  orvex::watch::Watcher watcher(options);
  std::string why;
  if (!watcher.Start(why)) {
    std::fprintf(stderr, "watch_bench: %s\n", why.c_str());
    return 1;
  }
  Json::Value desc(Json::objectValue);
  desc["queue"] = queue;
  desc["config"][0]["path"] = share;
  desc["config"][0]["mask"] = 65478;
  desc["config"][0]["ignore"].append("@eaDir");
  if (!KALO::KALONOTIFYD::MonitorQueue::Upsert(KALO::KALONOTIFYD::MonitorQueue(desc), "fileindex",
                                               KALO::KALONOTIFYD::MONITOR_QUEUE_TYPE_APPLICATION)) {
    std::fprintf(stderr, "watch_bench: cannot register the queue\n");
    return 1;
  }
  auto start = Clock::now();
  Drain(watcher);
  std::printf("watch a tree of %d directories: %.1f ms (%zu watches)\n", dirs + 21,
              Seconds(start) * 1000, watcher.watch_count());

  // Changes are made in slices small enough for the kernel's queue, then
  // drained: the figure is the watcher's rate, not the writer's.
  double busy = 0;
  size_t events = 0;
  for (int done = 0; done < files;) {
    const int slice = std::min(files - done, 4000);
    for (int i = done; i < done + slice; ++i) {
      std::ofstream(share + "/a" + std::to_string(i % 20) + "/b" + std::to_string(i % dirs) + "/f" +
                    std::to_string(i))
          << i;
    }
    start = Clock::now();
    events += Drain(watcher);
    busy += Seconds(start);
    done += slice;
  }
  const size_t lines = CountLines(queue);
  std::printf("create+write %d files: %zu events, %zu lines in %.1f ms: %.0f events/s\n", files,
              events, lines, busy * 1000, events / busy);

  start = Clock::now();
  for (int d = 0; d < 20; ++d) {
    fs::rename(share + "/a" + std::to_string(d), share + "/r" + std::to_string(d));
  }
  events = Drain(watcher);
  std::printf("rename 20 directories holding %d watches: %zu events in %.2f ms\n", dirs, events,
              Seconds(start) * 1000);

  start = Clock::now();
  fs::remove_all(share + "/r0");
  fs::remove_all(share + "/r1");
  const double rm_s = Seconds(start);
  start = Clock::now();
  events = Drain(watcher);
  std::printf("rm -rf of %d files (%.1f ms): %zu events handled in %.1f ms\n", files / 10,
              rm_s * 1000, events, Seconds(start) * 1000);
  std::printf("queue: %zu lines\n", CountLines(queue));
  fs::remove_all(root);
  return 0;
}
