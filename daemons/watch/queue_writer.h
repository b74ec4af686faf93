// QueueWriter: the lines waiting for one share queue, appended in batches
// under the queue's own lock, exactly as the library appends its custom
// events, so producers and the queue's rotation never cut into each other.
// One thread at a time.
#ifndef ORVEX_DAEMONS_WATCH_QUEUE_WRITER_H_
#define ORVEX_DAEMONS_WATCH_QUEUE_WRITER_H_

#include <cstdint>
#include <string>

namespace orvex {
namespace watch {

// The queue line of one change: {"event","is_dir","path"} and "path_old" for
// a rename, compact and on one line whatever bytes the paths hold.
std::string EventLine(uint32_t event, bool is_dir, const std::string& path,
                      const std::string& path_old);

class QueueWriter {
 public:
  // crash_path is the path a crash mark names (the share's root).
  QueueWriter(std::string queue_path, std::string crash_path);

  const std::string& queue_path() const { return queue_path_; }

  // Queues one line (from EventLine) for the next Flush.
  void Add(const std::string& line);
  // Queues the crash mark, at most once per batch.
  void AddCrashMark();

  // Appends every waiting line with one write under LockFile(queue, true),
  // creating the queue's directories below an existing share root. On any
  // failure the file is put back to its length before the write, the lines
  // stay waiting, the reason is logged (once per kind of failure in a row)
  // and false is returned. Past max_waiting lines the waiting ones are
  // dropped and replaced by a crash mark: the consumer must learn of the loss.
  bool Flush(size_t max_waiting);

  size_t waiting_lines() const { return lines_; }
  uint64_t written_lines() const { return written_; }
  uint64_t crash_marks() const { return crash_marks_; }
  uint64_t failed_flushes() const { return failures_; }

 private:
  bool Append();

  std::string queue_path_;
  std::string crash_path_;
  std::string buffer_;
  size_t lines_ = 0;
  bool crash_in_batch_ = false;
  uint64_t written_ = 0;
  uint64_t crash_marks_ = 0;
  uint64_t failures_ = 0;
  std::string last_error_;
};

// The path a crash mark of queue_path names: the share root for a queue at
// "<root>/@eaDir/@fileindex/queue", else fallback.
std::string CrashMarkPath(const std::string& queue_path, const std::string& fallback);

}  // namespace watch
}  // namespace orvex

#endif  // ORVEX_DAEMONS_WATCH_QUEUE_WRITER_H_
