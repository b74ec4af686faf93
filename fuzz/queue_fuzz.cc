// queue_fuzz: libFuzzer target for the queue reader and the operation tree.
// Each input is written whole as a queue file, the tree is built from it and
// every operation is handed out and printed, as the indexing daemon would.
// Besides the sanitizers' findings it traps when a handed-out operation breaks
// the tree's promises: a cancelled or unknown kind, a crash operation in a
// queue not marked crashed, a path that is not absolute or holds a NUL byte.
#include <fcntl.h>
#include <syslog.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <sstream>
#include <string>

#include "orvex/foundation/log.h"
#include "orvex/queue/op_tree.h"

namespace {

using orvex::fileindex::OP;
using orvex::fileindex::OPTree;

// One queue file per fuzzing process, rewritten for every input and removed
// when the process exits normally.
class QueueFile {
 public:
  QueueFile() {
    const char* tmp = std::getenv("TMPDIR");
    std::string dir = ::access("/dev/shm", W_OK) == 0 ? "/dev/shm" : (tmp && *tmp ? tmp : "/tmp");
    path_ = dir + "/queue_fuzz." + std::to_string(::getpid());
  }
  ~QueueFile() { ::unlink(path_.c_str()); }

  const std::string& Write(const uint8_t* data, size_t size) {
    int fd = ::open(path_.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
    if (fd < 0) std::abort();
    while (size > 0) {
      ssize_t n = ::write(fd, data, size);
      if (n <= 0) std::abort();
      data += n;
      size -= static_cast<size_t>(n);
    }
    ::close(fd);
    return path_;
  }

 private:
  std::string path_;
};

QueueFile& Queue() {
  // Bad lines are the common case here: no trace lines, no system log.
  static const bool quiet = [] {
    orvex::fileindex::log_level = LOG_INFO;
    orvex::SetLogSink([](int, const std::string&) {});
    return true;
  }();
  (void)quiet;
  static QueueFile file;  // destroyed, and so removed, at exit
  return file;
}

void Check(bool ok) {
  if (!ok) __builtin_trap();
}

void Touch(const OPTree& tree, const std::shared_ptr<OP>& op, std::ostringstream& out) {
  out << op << '\n';
  Check(op->kind > orvex::fileindex::OP_NONE && op->kind <= orvex::fileindex::OP_QUEUE_CRASHED);
  Check((op->kind == orvex::fileindex::OP_QUEUE_CRASHED) == tree.crashed());
  const std::string path = op->node->GetPath();
  Check(tree.crashed() ? path.empty() : (path.size() > 1 && path[0] == '/'));
  // A NUL byte would cut the path short in every file-system call.
  Check(path.find('\0') == std::string::npos && op->path.find('\0') == std::string::npos);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  OPTree tree(Queue().Write(data, size));
  std::ostringstream out;
  size_t handed = 0;
  const int count = tree.ProcessOP([&](std::shared_ptr<OP> op) {
    Touch(tree, op, out);
    ++handed;
  });
  Check(handed <= static_cast<size_t>(count));
  Check(tree.lines_skipped() <= tree.lines_read());
  return 0;
}
