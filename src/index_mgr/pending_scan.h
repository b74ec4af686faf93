// PendingScan: which of a set of folders have events waiting in one share's
// queue (the live file, then its ".tmp" snapshot), answered for all of them
// from one pass over each file instead of one pass per folder. The pass is
// lazy and resumable: a question reads only as far as its own answer needs,
// and later questions go on from there, so a file is read at most once and
// a line is parsed (and, when malformed, logged) exactly when a folder's own
// scan would have reached it. One thread at a time.
#ifndef ORVEX_SRC_INDEX_MGR_PENDING_SCAN_H_
#define ORVEX_SRC_INDEX_MGR_PENDING_SCAN_H_

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "orvex/foundation/error.h"

namespace orvex {
namespace fileindex {

class LineReader;

class PendingScan {
 public:
  // targets are folders' full paths; the questions name them by index.
  PendingScan(const std::string& queue_path, std::vector<std::string> targets);
  PendingScan(const PendingScan&) = delete;
  PendingScan& operator=(const PendingScan&) = delete;
  ~PendingScan();

  // Exactly QueueMgr(queue_path).IsFullPathProcessing(targets[target]) at
  // the time the files are read: true when an event of the target or below
  // it (as path or old path) waits in the live queue or the snapshot.
  // Throws what that scan throws, at the same line: Error 502 "Failed to
  // open queue, reason=..." and the malformed-line errors (906, 120); an
  // error met once is thrown again to every later question that needs the
  // lines past it.
  bool IsPending(size_t target);

 private:
  // One queue file's pass.
  struct File {
    std::string path;
    std::unique_ptr<LineReader> reader;
    bool started = false;
    bool finished = false;
    std::optional<Error> error;
    std::vector<char> matched;  // by target
  };

  // Reads file until target matches, the file ends or a line fails.
  bool Advance(File& file, size_t target);
  // Opens the file as the queue manager's scan does; false when absent.
  bool Start(File& file);
  // Marks every target that holds path (itself or an ancestor of path).
  void MarkHolders(File& file, std::string_view path);

  std::vector<std::string> targets_;
  std::unordered_map<std::string_view, std::vector<size_t>> by_path_;
  size_t min_length_ = 0;
  size_t max_length_ = 0;
  File live_;
  File tmp_;
};

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_SRC_INDEX_MGR_PENDING_SCAN_H_
