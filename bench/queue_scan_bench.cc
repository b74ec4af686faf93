// queue_scan_bench: what the queue manager's scans cost on a long queue.
// Writes a realistic share queue of one million lines (none of them about
// the path asked for, so each scan reads every line), then prints, measured
// in this run, the time of QueueMgr::IsFullPathProcessing and of
// QueueMgr::IsFullPathHasReindex as a ratio to the JSON parser alone on the
// same lines read the same way, each with its target and PASS or FAIL.
// Exits 1 when a figure misses its target.
//
//   queue_scan_bench [LINES]
#include <stdlib.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <functional>
#include <string>

#include "bench_timing.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/log.h"
#include "orvex/queue/queue_mgr.h"
#include "queue/line_reader.h"
#include "queue_generator.h"

namespace {

using orvex::bench::Clock;
using orvex::bench::Fastest;
using orvex::bench::Report;
using orvex::bench::Seconds;
using orvex::fileindex::LineReader;
using orvex::fileindex::QueueMgr;

constexpr size_t kDefaultLines = 1000000;
constexpr double kScanParseTarget = 1.2;

const std::string kShare = "/volume1/photo";
// Outside the generated share: no line is about it or an ancestor of it.
const std::string kAskedPath = "/volume1/video/2024/Holiday";

// A private directory that is also this run's ORVEX_ROOT, so that the
// folder configuration loaded by IsFullPathProcessing is a private one.
class BenchDir {
 public:
  BenchDir() {
    const char* base = std::getenv("TMPDIR");
    std::string tmpl = std::string(base && *base ? base : "/tmp") + "/queue_scan_bench.XXXXXX";
    if (::mkdtemp(tmpl.data()) == nullptr) {
      std::perror("queue_scan_bench: mkdtemp");
      std::exit(2);
    }
    path_ = tmpl;
    ::setenv("ORVEX_ROOT", path_.c_str(), 1);
  }
  BenchDir(const BenchDir&) = delete;
  BenchDir& operator=(const BenchDir&) = delete;
  ~BenchDir() {
    ::unlink(queue().c_str());
    ::rmdir(path_.c_str());
  }

  std::string queue() const { return path_ + "/queue"; }

 private:
  std::string path_;
};

// Well-formed lines only: a malformed line ends a scan with an error.
void WriteQueue(const std::string& path, size_t lines) {
  orvex::bench::QueueShape shape;
  shape.share_root = kShare;
  shape.files = 100000;
  shape.dirs = 5000;
  shape.malformed = 0;
  shape.dir_events = 0.01;
  shape.seed = 20240611;
  orvex::bench::QueueGenerator generator(shape);
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  generator.Write(out, lines);
  out.close();
  if (!out) {
    std::fprintf(stderr, "queue_scan_bench: cannot write %s\n", path.c_str());
    std::exit(2);
  }
  std::printf("queue: %zu lines, %zu reindexes, %zu config changes, %zu renames\n",
              generator.counts().lines, generator.counts().reindexes, generator.counts().configs,
              generator.counts().renames);
}

// The JSON parser alone on the same lines, read the same way.
double TimeParse(const std::string& queue, size_t& lines) {
  const Clock::time_point start = Clock::now();
  LineReader reader(queue);
  std::string line;
  Json::Value value;
  lines = 0;
  while (reader.Next(line)) {
    if (!orvex::fromString(value, line)) std::exit(2);
    ++lines;
  }
  return Seconds(start);
}

double TimeScan(const std::string& queue, bool (QueueMgr::*scan)(const std::string&)) {
  const Clock::time_point start = Clock::now();
  QueueMgr mgr(queue);
  if ((mgr.*scan)(kAskedPath)) {
    std::fprintf(stderr, "queue_scan_bench: the queue unexpectedly holds a match\n");
    std::exit(2);
  }
  return Seconds(start);
}

}  // namespace

int main(int argc, char** argv) {
  const size_t lines = argc > 1 ? std::strtoull(argv[1], nullptr, 10) : kDefaultLines;
  orvex::fileindex::log_level = LOG_INFO;
  BenchDir dir;
  WriteQueue(dir.queue(), lines);
  try {
    size_t parsed = 0;
    const double parse = Fastest([&] { return TimeParse(dir.queue(), parsed); });
    const double processing =
        Fastest([&] { return TimeScan(dir.queue(), &QueueMgr::IsFullPathProcessing); });
    const double reindex =
        Fastest([&] { return TimeScan(dir.queue(), &QueueMgr::IsFullPathHasReindex); });
    std::printf("jsoncpp parse: %.3f s for %zu lines (%.0f ns/line)\n", parse, parsed,
                parse * 1e9 / static_cast<double>(std::max<size_t>(parsed, 1)));
    std::printf("IsFullPathProcessing: %.3f s, IsFullPathHasReindex: %.3f s\n", processing,
                reindex);
    bool pass = Report("IsFullPathProcessing / parse", processing / parse, "", kScanParseTarget);
    pass = Report("IsFullPathHasReindex / parse", reindex / parse, "", kScanParseTarget) && pass;
    return pass ? 0 : 1;
  } catch (const orvex::Error& e) {
    std::fprintf(stderr, "queue_scan_bench: Error %d: %s\n", static_cast<int>(e.code()),
                 e.reason().c_str());
    return 2;
  }
}
