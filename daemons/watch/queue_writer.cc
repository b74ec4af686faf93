#include "watch/queue_writer.h"

#include <fcntl.h>
#include <json/json.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/lock.h"
#include "orvex/foundation/log.h"
#include "orvex/foundation/util.h"
#include "orvex/portable/file_descriptor.h"
#include "orvex/queue/event.h"

namespace orvex {
namespace watch {
namespace {

constexpr char kQueueSuffix[] = "/@eaDir/@fileindex/queue";

bool EndsWith(const std::string& s, const std::string& end) {
  return s.size() >= end.size() && s.compare(s.size() - end.size(), end.size(), end) == 0;
}

bool WriteAll(int fd, const std::string& data) {
  for (size_t done = 0; done < data.size();) {
    const ssize_t n = ::write(fd, data.data() + done, data.size() - done);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) {
      if (n == 0) errno = EIO;
      return false;
    }
    done += static_cast<size_t>(n);
  }
  return true;
}

}  // namespace

std::string EventLine(uint32_t event, bool is_dir, const std::string& path,
                      const std::string& path_old) {
  Json::Value obj(Json::objectValue);
  obj["event"] = event;
  obj["is_dir"] = is_dir;
  obj["path"] = path;
  if (!path_old.empty()) obj["path_old"] = path_old;
  // toString escapes control characters, a newline in a name included, so a
  // line is always one line.
  std::string line = toString(obj);
  line.push_back('\n');
  return line;
}

std::string CrashMarkPath(const std::string& queue_path, const std::string& fallback) {
  if (EndsWith(queue_path, kQueueSuffix) && queue_path.size() > sizeof(kQueueSuffix)) {
    return queue_path.substr(0, queue_path.size() - (sizeof(kQueueSuffix) - 1));
  }
  return fallback;
}

QueueWriter::QueueWriter(std::string queue_path, std::string crash_path)
    : queue_path_(std::move(queue_path)), crash_path_(std::move(crash_path)) {}

void QueueWriter::Add(const std::string& line) {
  buffer_ += line;
  ++lines_;
}

void QueueWriter::AddCrashMark() {
  if (crash_in_batch_) return;
  crash_in_batch_ = true;
  ++crash_marks_;
  Add(EventLine(fileindex::EVENT_QUEUE_CRASHED, /*is_dir=*/false, crash_path_, ""));
}

bool QueueWriter::Flush(size_t max_waiting) {
  if (lines_ == 0) return true;
  if (Append()) {
    written_ += lines_;
    buffer_.clear();
    lines_ = 0;
    crash_in_batch_ = false;
    last_error_.clear();
    return true;
  }
  ++failures_;
  if (lines_ > max_waiting) {
    LogPlain("%s:%d (%d, %u) Dropped %zu lines for %s; the queue is marked crashed", "watcher",
             __LINE__, static_cast<int>(::getpid()), static_cast<unsigned>(::geteuid()), lines_,
             queue_path_.c_str());
    buffer_.clear();
    lines_ = 0;
    crash_in_batch_ = false;
    AddCrashMark();
  }
  return false;
}

bool QueueWriter::Append() {
  std::string error;
  try {
    // Like the library's own writer: the queue's folders are made only
    // inside a share root that exists, never a share root itself.
    const std::string share_root = CrashMarkPath(queue_path_, "");
    if (!share_root.empty() && IsDirExist(share_root, /*follow_link=*/true)) {
      MakeParentDirectories(queue_path_);
    }
    const LockFile lock(queue_path_, /*exclusive=*/true);
    FileDescriptor fd(::open(queue_path_.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0644));
    struct stat st;
    if (fd && ::fstat(fd.get(), &st) == 0) {
      if (WriteAll(fd.get(), buffer_) && fd.Close()) return true;
      // A short write (a full disk) must not leave half a line for the next
      // append to run into: cut the file back to where this batch began.
      error = std::strerror(errno);
      if (fd.valid() && ::ftruncate(fd.get(), st.st_size) != 0) error += ", and cannot cut back";
    } else {
      error = std::strerror(errno);
    }
  } catch (const Error& e) {
    error = "code " + std::to_string(static_cast<int>(e.code())) + ", " + e.reason();
  }
  if (error != last_error_) {
    errno = 0;
    LogPlain("%s:%d (%d, %u) Cannot append to %s: %s; %zu lines wait", "watcher", __LINE__,
             static_cast<int>(::getpid()), static_cast<unsigned>(::geteuid()), queue_path_.c_str(),
             error.c_str(), lines_);
    last_error_ = error;
  }
  return false;
}

}  // namespace watch
}  // namespace orvex
