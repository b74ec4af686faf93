#include "queue/queue_scan.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <memory>

#include "foundation/check.h"
#include "queue/line_reader.h"

namespace orvex {
namespace fileindex {
namespace {

constexpr char kLogSource[] = "queue_mgr";

bool SameFile(int fd, const std::string& path) {
  struct stat open_file;
  struct stat at_path;
  return ::fstat(fd, &open_file) == 0 && ::stat(path.c_str(), &at_path) == 0 &&
         open_file.st_dev == at_path.st_dev && open_file.st_ino == at_path.st_ino;
}

// A queue file opened for a scan, handing out its complete lines. Producers
// append each line with one write, but a reader may see the start of a line
// before its end (an append reaches the file a page at a time), so the last
// line counts only once its newline is there. LineReader does not tell
// whether its last line had one; a second descriptor on the same file looks
// at the byte after it.
class ScanFile {
 public:
  // Opens path; missing() when there is no such file. Throws Error 502
  // (logged) when the file cannot be read.
  explicit ScanFile(const std::string& path) {
    while (!OpenBoth(path)) {
    }
    errno = 0;
    if (!missing_) has_ahead_ = reader_->Next(ahead_);
  }
  ScanFile(const ScanFile&) = delete;
  ScanFile& operator=(const ScanFile&) = delete;
  ~ScanFile() { CloseFd(); }

  bool missing() const { return missing_; }

  // The next complete line; false at the end of the file or at a last line
  // still being appended.
  bool Next(std::string& line) {
    if (!has_ahead_) return false;
    line.swap(ahead_);
    has_ahead_ = reader_->Next(ahead_);
    const uint64_t end = offset_ + line.size();
    offset_ = end + 1;
    return has_ahead_ || NewlineAt(end);
  }

 private:
  // True when done: both descriptors are on one file, or there is none.
  // The live queue may be moved between the two opens. The path never names
  // a file again once it has moved away (a snapshot is never renamed back),
  // and fd_ keeps its file's inode number from being reused, so the same
  // file at the path after both opens means both are on it.
  bool OpenBoth(const std::string& path) {
    CloseFd();
    fd_ = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd_ >= 0) reader_ = std::make_unique<LineReader>(path);
    const bool opened = fd_ >= 0 && reader_->ok();
    if (!opened && errno == ENOENT) {
      missing_ = true;
      return true;
    }
    ORVEX_CHECK_AS(!opened, "!input_stream", kErrorSystem,
                   "Failed to open queue, reason=" + std::string(std::strerror(errno)));
    return SameFile(fd_, path);
  }

  bool NewlineAt(uint64_t offset) const {
    char c = 0;
    return ::pread(fd_, &c, 1, static_cast<off_t>(offset)) == 1 && c == '\n';
  }

  void CloseFd() {
    if (fd_ >= 0) ::close(fd_);
    fd_ = -1;
  }

  int fd_ = -1;
  std::unique_ptr<LineReader> reader_;
  bool missing_ = false;
  std::string ahead_;  // the line after the one handed out last
  bool has_ahead_ = false;
  uint64_t offset_ = 0;  // where ahead_ starts in the file
};

}  // namespace

bool ScanQueue(const std::string& path, const std::function<bool(const Event&)>& matches) {
  ScanFile file(path);
  if (file.missing()) return false;
  std::string line;
  while (file.Next(line)) {
    if (matches(Event(line))) return true;  // Event throws for a malformed line
  }
  return false;
}

bool IsSameOrBelow(std::string_view path, std::string_view dir) {
  if (path.size() < dir.size() || path.compare(0, dir.size(), dir) != 0) return false;
  return path.size() == dir.size() || path[dir.size()] == '/';
}

}  // namespace fileindex
}  // namespace orvex
