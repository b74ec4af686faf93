// queue_bench: how the operation tree scales on realistic share queues.
// Prints, each measured in this run, with its target and PASS or FAIL:
//  - peak memory growth while building the tree from the big queue, per line
//    (measured first, in a fresh child process, so nothing else in this
//    process has raised its high-water mark);
//  - the time to build the tree from the big queue against the time the JSON
//    parser alone takes on the same lines, read the same way;
//  - doubling ratios: 2N creates in one directory against N, and renaming or
//    re-indexing a directory with 2N pending operations below it against N.
// Exits 1 when a figure misses its target.
#include <limits.h>
#include <malloc.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <functional>
#include <iostream>
#include <memory>
#include <string>
#include <vector>

#include "bench_timing.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/log.h"
#include "orvex/queue/op_tree.h"
#include "queue/line_reader.h"
#include "queue_generator.h"

namespace {

using orvex::bench::Clock;
using orvex::bench::Fastest;
using orvex::bench::Report;
using orvex::bench::Seconds;
using orvex::fileindex::Event;
using orvex::fileindex::LineReader;
using orvex::fileindex::OPTree;

constexpr size_t kDefaultLines = 1000000;
constexpr size_t kFiles = 100000;
constexpr size_t kDirs = 5000;
constexpr double kMalformed = 0.01;
constexpr double kDirEvents = 0.01;
constexpr size_t kDoublingBase = 100000;
constexpr int kDoublingRepeats = 9;  // the scaling runs are short: more of them

constexpr double kBuildParseTarget = 1.5;
constexpr double kDoublingTarget = 2.3;
constexpr double kBytesPerLineTarget = 200;

const std::string kShare = "/volume1/photo";

// Paths removed when the run is interrupted: the queue files are large.
// Plain arrays, so that the signal handler only calls unlink and rmdir.
constexpr int kMaxTempPaths = 4;
char g_temp_paths[kMaxTempPaths][PATH_MAX];  // files, then the directory last

void RemoveTempPathsAndDie(int sig) {
  for (int i = kMaxTempPaths - 1; i >= 0; --i) {
    if (g_temp_paths[i][0] == '\0') continue;
    if (::unlink(g_temp_paths[i]) != 0) ::rmdir(g_temp_paths[i]);
  }
  std::signal(sig, SIG_DFL);
  std::raise(sig);
}

// A private directory for the queue files, removed with them at the end or
// when the run is interrupted.
class TempDir {
 public:
  TempDir() {
    const char* base = std::getenv("TMPDIR");
    std::string tmpl = std::string(base && *base ? base : "/tmp") + "/queue_bench.XXXXXX";
    if (tmpl.size() >= PATH_MAX - 16 || ::mkdtemp(tmpl.data()) == nullptr) {
      std::perror("queue_bench: mkdtemp");
      std::exit(2);
    }
    path_ = tmpl;
    Remember(path_);
    for (int sig : {SIGINT, SIGTERM, SIGHUP, SIGPIPE}) std::signal(sig, RemoveTempPathsAndDie);
  }
  TempDir(const TempDir&) = delete;
  TempDir& operator=(const TempDir&) = delete;
  ~TempDir() {
    for (const auto& file : files_) ::unlink(file.c_str());
    ::rmdir(path_.c_str());
  }

  // A file name inside the directory, removed at the end.
  std::string File(const std::string& name) {
    files_.push_back(path_ + "/" + name);
    Remember(files_.back());
    return files_.back();
  }

 private:
  static void Remember(const std::string& path) {
    for (auto& slot : g_temp_paths) {
      if (slot[0] != '\0') continue;
      std::snprintf(slot, sizeof(slot), "%s", path.c_str());
      return;
    }
  }

  std::string path_;
  std::vector<std::string> files_;
};

// Peak resident memory of this process in bytes, from /proc/self/status.
long long PeakResidentBytes() {
  std::ifstream status("/proc/self/status");
  std::string line;
  while (std::getline(status, line)) {
    if (line.compare(0, 6, "VmHWM:") == 0) return std::atoll(line.c_str() + 6) * 1024;
  }
  return -1;
}

void WriteQueue(const std::string& path, size_t lines, double dir_events) {
  orvex::bench::QueueShape shape;
  shape.share_root = kShare;
  shape.files = kFiles;
  shape.dirs = kDirs;
  shape.malformed = kMalformed;
  shape.dir_events = dir_events;
  shape.seed = 20240601;
  orvex::bench::QueueGenerator generator(shape);
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  generator.Write(out, lines);
  out.close();
  if (!out) {
    std::fprintf(stderr, "queue_bench: cannot write %s\n", path.c_str());
    std::exit(2);
  }
  const auto& c = generator.counts();
  std::printf(
      "queue: %zu lines over %zu files in %zu directories: %zu creates, %zu modifies, "
      "%zu attrs, %zu deletes, %zu renames, %zu reindexes, %zu config changes, %zu malformed\n",
      c.lines, kFiles, kDirs, c.creates, c.modifies, c.attrs, c.deletes, c.renames, c.reindexes,
      c.configs, c.malformed);
}

// Growth of the peak resident memory while one tree is built, in a child
// forked for it; -1 when the child failed.
double TreeBytesPerLine(const std::string& queue) {
  int fds[2];
  if (::pipe(fds) != 0) return -1;
  pid_t pid = ::fork();
  if (pid == 0) {
    ::close(fds[0]);
    const long long before = PeakResidentBytes();
    OPTree tree(queue);
    const long long after = PeakResidentBytes();
    double per_line = tree.lines_read() == 0 ? 0
                                             : static_cast<double>(after - before) /
                                                   static_cast<double>(tree.lines_read());
    ssize_t n = ::write(fds[1], &per_line, sizeof(per_line));
    ::_exit(n == sizeof(per_line) ? 0 : 1);
  }
  ::close(fds[1]);
  double per_line = -1;
  if (pid < 0 || ::read(fds[0], &per_line, sizeof(per_line)) != sizeof(per_line)) per_line = -1;
  ::close(fds[0]);
  int status = 0;
  if (pid > 0) ::waitpid(pid, &status, 0);
  return per_line;
}

double TimeBuild(const std::string& queue) {
  Clock::time_point start = Clock::now();
  OPTree tree(queue);
  return Seconds(start);  // the tree's release is not part of building it
}

// The JSON parser alone on the same lines, read the same way.
double TimeParse(const std::string& queue) {
  Clock::time_point start = Clock::now();
  LineReader reader(queue);
  std::string line;
  size_t parsed = 0;
  while (reader.Next(line)) {
    Json::Value value;
    if (orvex::fromString(value, line)) ++parsed;
  }
  double seconds = Seconds(start);
  if (parsed == 0) std::fprintf(stderr, "queue_bench: nothing parsed in %s\n", queue.c_str());
  return seconds;
}

using Events = std::vector<std::shared_ptr<Event>>;

Events CreatesIn(const std::string& dir, size_t count) {
  Events events;
  events.reserve(count);
  char name[32];
  for (size_t i = 0; i < count; ++i) {
    std::snprintf(name, sizeof(name), "/IMG_%07zu.JPG", i);
    events.push_back(std::make_shared<Event>(
        orvex::bench::DaemonLine(orvex::bench::kMaskCreate, false, dir + name)));
  }
  return events;
}

// count creates spread over subdirectories of dir, 1000 to a directory.
Events CreatesBelow(const std::string& dir, size_t count) {
  Events events;
  events.reserve(count);
  char name[64];
  for (size_t i = 0; i < count; ++i) {
    std::snprintf(name, sizeof(name), "/album %04zu/IMG_%07zu.JPG", i / 1000, i);
    events.push_back(std::make_shared<Event>(
        orvex::bench::DaemonLine(orvex::bench::kMaskCreate, false, dir + name)));
  }
  return events;
}

double TimeInserts(const std::string& empty_queue, const Events& events) {
  OPTree tree(empty_queue);
  Clock::time_point start = Clock::now();
  for (const auto& ev : events) tree.InsertEvent(ev);
  return Seconds(start);
}

// Time of one event folded into a tree that already holds `pending`, starting
// with none of the tree in the processor's caches.
double TimeOneInsert(const std::string& empty_queue, const Events& pending,
                     const std::shared_ptr<Event>& ev) {
  OPTree tree(empty_queue);
  for (const auto& p : pending) tree.InsertEvent(p);
  orvex::bench::EvictCaches();
  Clock::time_point start = Clock::now();
  tree.InsertEvent(ev);
  return Seconds(start);
}

// time_for(n) returns a run timing the work for n. The runs for N and 2N
// alternate, so that a busy spell of the machine hits both alike.
double DoublingRatio(const std::function<std::function<double()>(size_t)>& time_for) {
  std::function<double()> single_run = time_for(kDoublingBase);
  std::function<double()> twice_run = time_for(2 * kDoublingBase);
  double single = single_run();
  double twice = twice_run();
  for (int i = 1; i < kDoublingRepeats; ++i) {
    single = std::min(single, single_run());
    twice = std::min(twice, twice_run());
  }
  std::printf("  N=%zu: %.4f s, N=%zu: %.4f s\n", kDoublingBase, single, 2 * kDoublingBase, twice);
  return single > 0 ? twice / single : 0;
}

struct Options {
  size_t lines = kDefaultLines;
  double dir_events = kDirEvents;
};

Options ParseArgs(int argc, char** argv) {
  Options opt;
  for (int i = 1; i < argc; ++i) {
    const std::string arg = argv[i];
    if (arg == "--lines" && i + 1 < argc) {
      opt.lines = std::strtoull(argv[++i], nullptr, 10);
    } else if (arg == "--dir-events" && i + 1 < argc) {
      opt.dir_events = std::strtod(argv[++i], nullptr);
    } else {
      std::printf(
          "usage: queue_bench [--lines N] [--dir-events FRACTION]\n"
          "Measures the operation tree on a generated queue of N lines (default %zu) over\n"
          "%zu files in %zu directories, a fraction of the events (default %g) being on\n"
          "directories, and its scaling; prints each figure with its target and PASS or\n"
          "FAIL. Exit status 1 when a figure misses its target.\n",
          kDefaultLines, kFiles, kDirs, kDirEvents);
      std::exit(arg == "--help" ? 0 : 2);
    }
  }
  if (opt.lines == 0) opt.lines = kDefaultLines;
  return opt;
}

}  // namespace

int main(int argc, char** argv) {
  const Options opt = ParseArgs(argc, argv);
  // Bad lines in the generated queue are logged as errors, once per build:
  // keep thousands of them out of the system log.
  orvex::fileindex::log_level = LOG_INFO;
  orvex::SetLogSink([](int, const std::string&) {});

  TempDir tmp;
  const std::string queue = tmp.File("queue");
  const std::string empty = tmp.File("empty");
  WriteQueue(queue, opt.lines, opt.dir_events);
  std::ofstream(empty).close();

  bool pass = true;
  pass &= Report("tree memory per line", TreeBytesPerLine(queue), " bytes", kBytesPerLineTarget);

  // The timings measure the tree, not the kernel: freed memory stays in the
  // process (no trimming, no mmap per large block), so a run does not pay
  // page faults again for memory the run before it handed back. Set after
  // the memory figure, which a child process measured with the defaults.
  ::mallopt(M_TRIM_THRESHOLD, 1 << 30);
  ::mallopt(M_MMAP_THRESHOLD, 32 << 20);
  const double build = Fastest([&] { return TimeBuild(queue); });
  const double parse = Fastest([&] { return TimeParse(queue); });
  std::printf("  build: %.3f s, parse: %.3f s\n", build, parse);
  pass &= Report("build/parse ratio", parse > 0 ? build / parse : 0, "", kBuildParseTarget);

  const double creates = DoublingRatio([&](size_t n) {
    auto events = std::make_shared<Events>(CreatesIn(kShare + "/bulk", n));
    return [&empty, events] { return TimeInserts(empty, *events); };
  });
  pass &= Report("creates in one directory, 2N/N", creates, "", kDoublingTarget);

  const auto rename = std::make_shared<Event>(orvex::bench::DaemonLine(
      orvex::bench::kMaskRename, true, kShare + "/moved", kShare + "/source"));
  const double renames = DoublingRatio([&](size_t n) {
    auto pending = std::make_shared<Events>(CreatesBelow(kShare + "/source", n));
    return [&empty, &rename, pending] { return TimeOneInsert(empty, *pending, rename); };
  });
  pass &= Report("directory rename over N pending, 2N/N", renames, "", kDoublingTarget);

  const auto reindex = std::make_shared<Event>(
      orvex::bench::CustomLine(orvex::bench::kMaskReindex, kShare + "/source"));
  const double reindexes = DoublingRatio([&](size_t n) {
    auto pending = std::make_shared<Events>(CreatesBelow(kShare + "/source", n));
    return [&empty, &reindex, pending] { return TimeOneInsert(empty, *pending, reindex); };
  });
  pass &= Report("directory reindex over N pending, 2N/N", reindexes, "", kDoublingTarget);

  orvex::SetLogSink(nullptr);
  return pass ? 0 : 1;
}
