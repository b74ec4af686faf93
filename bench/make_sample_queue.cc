// make_sample_queue: writes a realistic share event queue, the kind the
// notification daemon and the library's custom events leave behind, for
// trying fileindex-queue and the indexing daemon by hand.
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iostream>
#include <string>

#include "queue_generator.h"

namespace {

constexpr char kUsage[] =
    "usage: make_sample_queue OUT [--lines N] [--seed S] [--files F] [--dirs D]\n"
    "                         [--malformed FRACTION] [--dir-events FRACTION]\n"
    "                         [--share-root PATH]\n"
    "Writes N queue lines (default 2000) to OUT: creates, writes, attribute\n"
    "changes, deletes and renames of F files (default 1000) in D directories\n"
    "(default 50) under the share root (default /volume1/photo), directory\n"
    "events, re-index and configuration-change events, and a fraction of\n"
    "malformed lines (default 0.01); directory and custom events make up\n"
    "--dir-events of the events (default 0.01). The same seed (default 1) gives the same file.\n";

struct Options {
  std::string out;
  size_t lines = 2000;
  orvex::bench::QueueShape shape;
};

bool ParseCount(const char* text, size_t& out) {
  char* end = nullptr;
  errno = 0;
  unsigned long long v = std::strtoull(text, &end, 10);
  if (errno != 0 || end == text || *end != '\0' || text[0] == '-') return false;
  out = static_cast<size_t>(v);
  return true;
}

bool ParseFraction(const char* text, double& out) {
  char* end = nullptr;
  double v = std::strtod(text, &end);
  if (end == text || *end != '\0' || !(v >= 0.0 && v <= 1.0)) return false;
  out = v;
  return true;
}

// Returns 0 to go on, else the exit status (usage errors print to stderr).
int ParseArgs(int argc, char** argv, Options& opt) {
  for (int i = 1; i < argc; ++i) {
    const std::string arg = argv[i];
    if (arg == "--help" || arg == "-h") {
      std::cout << kUsage;
      return -1;
    }
    const bool takes_value = arg == "--lines" || arg == "--seed" || arg == "--files" ||
                             arg == "--dirs" || arg == "--malformed" || arg == "--dir-events" ||
                             arg == "--share-root";
    if (takes_value && i + 1 >= argc) {
      std::cerr << "make_sample_queue: " << arg << " needs a value\n" << kUsage;
      return 2;
    }
    bool ok = true;
    size_t seed = 0;
    if (arg == "--lines") {
      ok = ParseCount(argv[++i], opt.lines);
    } else if (arg == "--seed") {
      ok = ParseCount(argv[++i], seed);
      opt.shape.seed = seed;
    } else if (arg == "--files") {
      ok = ParseCount(argv[++i], opt.shape.files);
    } else if (arg == "--dirs") {
      ok = ParseCount(argv[++i], opt.shape.dirs) && opt.shape.dirs > 0;
    } else if (arg == "--malformed") {
      ok = ParseFraction(argv[++i], opt.shape.malformed);
    } else if (arg == "--dir-events") {
      ok = ParseFraction(argv[++i], opt.shape.dir_events);
    } else if (arg == "--share-root") {
      opt.shape.share_root = argv[++i];
      ok = opt.shape.share_root.size() > 1 && opt.shape.share_root.front() == '/' &&
           opt.shape.share_root.back() != '/';
    } else if (!arg.empty() && arg[0] == '-') {
      ok = false;
    } else if (opt.out.empty()) {
      opt.out = arg;
    } else {
      ok = false;
    }
    if (!ok) {
      std::cerr << "make_sample_queue: bad argument: " << arg << "\n" << kUsage;
      return 2;
    }
  }
  if (opt.out.empty()) {
    std::cerr << kUsage;
    return 2;
  }
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  Options opt;
  if (int status = ParseArgs(argc, argv, opt)) return status < 0 ? 0 : status;

  std::ofstream out(opt.out, std::ios::binary | std::ios::trunc);
  if (!out) {
    std::cerr << "make_sample_queue: cannot write " << opt.out << ": " << std::strerror(errno)
              << "\n";
    return 1;
  }
  orvex::bench::QueueGenerator generator(opt.shape);
  generator.Write(out, opt.lines);
  out.close();
  if (!out) {
    std::cerr << "make_sample_queue: cannot write " << opt.out << ": " << std::strerror(errno)
              << "\n";
    return 1;
  }
  const orvex::bench::QueueCounts& c = generator.counts();
  std::cout << "wrote " << c.lines << " lines to " << opt.out << " (" << c.malformed
            << " malformed)\n";
  return 0;
}
