// fileindex-queue: shows what the indexing daemon would do with a share's
// event queue. Builds the operation tree from the queue file (or standard
// input) exactly as the daemon does, prints the coalesced operations in
// processing order, then one summary line. Reads the file only; never
// touches the queue's lock or its snapshot.
#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <iostream>
#include <memory>
#include <new>
#include <sstream>
#include <stdexcept>
#include <string>

#include "orvex/foundation/error.h"
#include "orvex/foundation/log.h"
#include "orvex/portable/file_descriptor.h"
#include "orvex/portable/json_text.h"
#include "orvex/queue/op_tree.h"
#include "orvex/version.h"

namespace {

using orvex::fileindex::OP;
using orvex::fileindex::OPTree;

constexpr int kExitFailure = 2;  // every failure, bad usage included
constexpr char kProgram[] = "fileindex-queue";
constexpr char kUsage[] =
    "usage: fileindex-queue [--json] [--trace] QUEUE_FILE\n"
    "Prints the operations the indexing daemon would send for a share's event\n"
    "queue, coalesced and in processing order, then a summary: lines read, lines\n"
    "skipped as bad, operations pending and whether the queue was marked crashed.\n"
    "QUEUE_FILE \"-\" reads the queue from standard input. A line longer than\n"
    "1 MiB is a bad line: skipped, and logged with only its first 200 bytes.\n"
    "  --json     print one JSON document instead of text. Paths are bytes: valid\n"
    "             UTF-8 is written as it is, and each byte of an invalid UTF-8\n"
    "             sequence as the escape \\udcXX (XX its value, as Python's\n"
    "             surrogateescape decoding gives), so every byte can be recovered\n"
    "  --trace    keep the per-event trace lines in the system log (off by default)\n"
    "  --version  print the version\n"
    "  --help     print this help\n"
    "Exit status: 0 on success, 2 on any failure or bad usage; errors are\n"
    "printed as \"fileindex-queue: error CODE: REASON\".\n";

// Bad usage: main reports it as error 120, then prints the usage.
class UsageError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

struct Options {
  bool json = false;
  bool trace = false;
  bool help = false;
  bool version = false;
  std::string queue;  // "-" for standard input
};

Options ParseArgs(int argc, char** argv) {
  Options opt;
  bool positional_only = false;
  bool have_queue = false;
  for (int i = 1; i < argc; ++i) {
    const std::string arg = argv[i];
    // A lone "-" is the standard input, not an option.
    const bool option = !positional_only && arg.size() > 1 && arg[0] == '-';
    if (!option) {
      if (have_queue) throw UsageError("unexpected argument " + arg);
      opt.queue = arg;
      have_queue = true;
    } else if (arg == "--") {
      positional_only = true;
    } else if (arg == "--help") {
      opt.help = true;
    } else if (arg == "--version") {
      opt.version = true;
    } else if (arg == "--json") {
      opt.json = true;
    } else if (arg == "--trace") {
      opt.trace = true;
    } else {
      throw UsageError("unknown option " + arg);
    }
  }
  if (!have_queue && !opt.help && !opt.version) throw UsageError("missing QUEUE_FILE");
  return opt;
}

// The file OPTree reads for the queue argument, and how messages name it.
std::string QueuePath(const Options& opt) { return opt.queue == "-" ? "/dev/stdin" : opt.queue; }
std::string QueueName(const Options& opt) {
  return opt.queue == "-" ? "standard input" : opt.queue;
}

// Throws Error 502, naming the queue and the system's cause, unless the
// queue can be opened for reading and is not a directory. Checked before the
// tree is built so that the message says it plainly.
void CheckReadable(const Options& opt) {
  // Without waiting for a writer, as the tree's reader opens it: a FIFO.
  const orvex::FileDescriptor fd(::open(QueuePath(opt).c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  struct stat st;
  int error = 0;
  if (!fd) {
    error = errno;
  } else if (::fstat(fd.get(), &st) != 0) {
    error = errno;
  } else if (S_ISDIR(st.st_mode)) {
    error = EISDIR;
  }
  if (error != 0) {
    throw orvex::Error(orvex::kErrorSystem,
                       "cannot read queue " + QueueName(opt) + ": " + std::strerror(error));
  }
}

// Throws what OPTree throws (502 when the queue cannot be opened after all),
// naming the queue.
std::unique_ptr<OPTree> BuildTree(const Options& opt) {
  try {
    return std::make_unique<OPTree>(QueuePath(opt));
  } catch (const orvex::Error& e) {
    throw orvex::Error(e.code(), "cannot read queue " + QueueName(opt) + ": " + e.reason());
  }
}

// Standard output through a buffer of our own, so that a failed write is
// reported with its own errno.
class Output {
 public:
  Output() = default;
  Output(const Output&) = delete;
  Output& operator=(const Output&) = delete;

  void Write(const std::string& text) {
    buffer_ += text;
    if (buffer_.size() >= kChunk) Flush();
  }

  // Throws Error 502 when standard output refuses the text.
  void Flush() {
    size_t done = 0;
    while (done < buffer_.size()) {
      const ssize_t n = ::write(STDOUT_FILENO, buffer_.data() + done, buffer_.size() - done);
      if (n < 0 && errno == EINTR) continue;
      if (n < 0) {
        throw orvex::Error(orvex::kErrorSystem,
                           std::string("cannot write to standard output: ") + std::strerror(errno));
      }
      done += static_cast<size_t>(n);
    }
    buffer_.clear();
  }

 private:
  static constexpr size_t kChunk = 64 << 10;
  std::string buffer_;
};

struct Summary {
  size_t lines_read = 0;
  size_t lines_skipped = 0;
  size_t pending = 0;
  bool crashed = false;
};

Summary Summarize(const OPTree& tree, size_t pending) {
  return Summary{tree.lines_read(), tree.lines_skipped(), pending, tree.crashed()};
}

void PrintText(OPTree& tree, Output& out) {
  size_t pending = 0;
  std::ostringstream line;
  tree.ProcessOP([&](std::shared_ptr<OP> op) {
    line.str(std::string());
    line << op << '\n';
    out.Write(line.str());
    ++pending;
  });
  const Summary s = Summarize(tree, pending);
  line.str(std::string());
  line << "lines read: " << s.lines_read << ", skipped as bad: " << s.lines_skipped
       << ", operations pending: " << s.pending << ", crashed: " << (s.crashed ? "yes" : "no")
       << '\n';
  out.Write(line.str());
}

Json::Value OpToJson(const OP& op) {
  Json::Value out(Json::objectValue);
  out["op"] = static_cast<int>(op.kind);
  out["path"] = op.node ? op.node->GetPath() : std::string();
  out["path_old"] = op.path;
  out["data"] = op.data;
  return out;
}

void PrintJson(OPTree& tree, Output& out) {
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
  // Paths are bytes: jsoncpp's writer would pass those that are not UTF-8
  // through as they are, which no JSON reader need accept.
  std::string text;
  orvex::portable::AppendJsonText(doc, text, orvex::portable::NonUtf8Bytes::kSurrogateEscape);
  text += '\n';
  out.Write(text);
}

int Run(const Options& opt) {
  Output out;
  if (opt.help) {
    out.Write(kUsage);
  } else if (opt.version) {
    out.Write(std::string(kProgram) + " " + ORVEX_VERSION + "\n");
  } else {
    CheckReadable(opt);
    // A queue of a million lines would otherwise write a million trace lines.
    if (!opt.trace) orvex::fileindex::log_level = LOG_INFO;
    const std::unique_ptr<OPTree> tree = BuildTree(opt);
    if (opt.json) {
      PrintJson(*tree, out);
    } else {
      PrintText(*tree, out);
    }
  }
  out.Flush();
  return 0;
}

}  // namespace

// Failures stop here: each becomes one "fileindex-queue: error CODE: REASON"
// line on standard error (bad usage: code 120, then the usage).
int main(int argc, char** argv) {
  const auto report = [](int code, const std::string& reason) {
    std::cerr << kProgram << ": error " << code << ": " << reason << "\n";
  };
  try {
    return Run(ParseArgs(argc, argv));
  } catch (const UsageError& e) {
    report(orvex::kErrorBadArgument, e.what());
    std::cerr << kUsage;
  } catch (const orvex::Error& e) {
    report(e.code(), e.reason());
  } catch (const std::bad_alloc&) {
    report(orvex::kErrorSystem, "out of memory");
  } catch (const std::exception& e) {
    report(orvex::kErrorSystem, e.what());
  }
  return kExitFailure;
}
