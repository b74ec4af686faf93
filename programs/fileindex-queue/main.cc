// fileindex-queue: shows what the indexing daemon would do with a share's
// event queue. Builds the operation tree from the queue file exactly as the
// daemon does, prints the coalesced operations in processing order, then one
// summary line. Reads the file only; never touches the queue's lock or its
// snapshot.
#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <iostream>
#include <memory>
#include <string>

#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/log.h"
#include "orvex/queue/op_tree.h"

namespace {

using orvex::fileindex::OP;
using orvex::fileindex::OPTree;

constexpr int kExitUsage = 2;
constexpr char kUsage[] =
    "usage: fileindex-queue [--json] [--trace] QUEUE_FILE\n"
    "Prints the operations the indexing daemon would send for a share's event\n"
    "queue, coalesced and in processing order, then a summary: lines read, lines\n"
    "skipped as bad, operations pending and whether the queue was marked crashed.\n"
    "  --json   print one JSON document instead of text\n"
    "  --trace  keep the per-event trace lines in the system log (off by default)\n"
    "  --help   print this help\n"
    "Exit status: 0 on success, 2 for bad usage or a queue that cannot be read.\n";

struct Options {
  bool json = false;
  bool trace = false;
  std::string queue;
};

// Returns -1 to go on, else the exit status.
int ParseArgs(int argc, char** argv, Options& opt) {
  bool positional_only = false;
  for (int i = 1; i < argc; ++i) {
    const std::string arg = argv[i];
    if (!positional_only && arg == "--help") {
      std::cout << kUsage;
      return 0;
    }
    if (!positional_only && arg == "--json") {
      opt.json = true;
    } else if (!positional_only && arg == "--trace") {
      opt.trace = true;
    } else if (!positional_only && arg == "--") {
      positional_only = true;
    } else if ((positional_only || arg.empty() || arg[0] != '-') && opt.queue.empty()) {
      opt.queue = arg;
    } else {
      std::cerr << "fileindex-queue: unexpected argument: " << arg << "\n" << kUsage;
      return kExitUsage;
    }
  }
  if (opt.queue.empty()) {
    std::cerr << kUsage;
    return kExitUsage;
  }
  return -1;
}

// Empty when the queue can be opened for reading as a regular file (or a
// pipe), else the reason it cannot.
std::string WhyUnreadable(const std::string& path) {
  int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return std::strerror(errno);
  struct stat st;
  int saved = ::fstat(fd, &st) == 0 ? 0 : errno;
  ::close(fd);
  if (saved != 0) return std::strerror(saved);
  if (S_ISDIR(st.st_mode)) return std::strerror(EISDIR);
  return std::string();
}

struct Summary {
  size_t lines_read = 0;
  size_t lines_skipped = 0;
  size_t pending = 0;
  bool crashed = false;
};

Summary Summarize(const OPTree& tree, size_t pending) {
  return Summary{tree.lines_read(), tree.lines_skipped(), pending, tree.crashed()};
}

void PrintText(OPTree& tree) {
  size_t pending = 0;
  tree.ProcessOP([&](std::shared_ptr<OP> op) {
    std::cout << op << '\n';
    ++pending;
  });
  const Summary s = Summarize(tree, pending);
  std::cout << "lines read: " << s.lines_read << ", skipped as bad: " << s.lines_skipped
            << ", operations pending: " << s.pending << ", crashed: " << (s.crashed ? "yes" : "no")
            << '\n';
}

Json::Value OpToJson(const OP& op) {
  Json::Value out(Json::objectValue);
  out["op"] = static_cast<int>(op.kind);
  out["path"] = op.node ? op.node->GetPath() : std::string();
  out["path_old"] = op.path;
  out["data"] = op.data;
  return out;
}

void PrintJson(OPTree& tree) {
  Json::Value doc(Json::objectValue);
  Json::Value& operations = doc["operations"] = Json::Value(Json::arrayValue);
  size_t pending = 0;
  tree.ProcessOP([&](std::shared_ptr<OP> op) {
    operations.append(OpToJson(*op));
    ++pending;
  });
  const Summary s = Summarize(tree, pending);
  doc["lines_read"] = static_cast<Json::UInt64>(s.lines_read);
  doc["lines_skipped"] = static_cast<Json::UInt64>(s.lines_skipped);
  doc["pending"] = static_cast<Json::UInt64>(s.pending);
  doc["crashed"] = s.crashed;
  std::cout << orvex::toString(doc) << '\n';
}

int Run(const Options& opt) {
  const std::string why = WhyUnreadable(opt.queue);
  if (!why.empty()) {
    std::cerr << "fileindex-queue: cannot read queue " << opt.queue << ": " << why << "\n";
    return kExitUsage;
  }
  // A queue of a million lines would otherwise write a million trace lines.
  if (!opt.trace) orvex::fileindex::log_level = LOG_INFO;
  OPTree tree(opt.queue);
  if (opt.json) {
    PrintJson(tree);
  } else {
    PrintText(tree);
  }
  std::cout.flush();
  return std::cout ? 0 : 1;
}

}  // namespace

int main(int argc, char** argv) {
  std::ios::sync_with_stdio(false);
  Options opt;
  int status = ParseArgs(argc, argv, opt);
  if (status >= 0) return status;
  try {
    return Run(opt);
  } catch (const orvex::Error& e) {
    std::cerr << "fileindex-queue: " << opt.queue << ": " << e.reason() << " (code " << e.code()
              << ")\n";
    return 1;
  }
}
