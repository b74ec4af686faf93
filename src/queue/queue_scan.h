// The queue manager's scans: reading a share's queue file line by line and
// asking a question of each event until one answers yes. A scan reads a
// file that producers may be appending to and that the consumer may move or
// delete at any moment. Plain functions: safe for concurrent use on
// different calls.
#ifndef ORVEX_SRC_QUEUE_QUEUE_SCAN_H_
#define ORVEX_SRC_QUEUE_QUEUE_SCAN_H_

#include <functional>
#include <string>

// The scans' callers test paths with IsSameOrBelow.
#include "foundation/path_prefix.h"
#include "orvex/queue/event.h"

namespace orvex {
namespace fileindex {

// Whether some complete line of the queue file at path, parsed as an
// Event, is one for which matches is true; false when there is no such file
// (a file that vanishes while being opened included). A last line without
// its newline is one a producer is still appending and is not looked at.
// Throws Error 502 "Failed to open queue, reason=..." (logged, source
// "queue_mgr", condition "!input_stream") when the file cannot be read, and
// Event's errors (906, 120) at the first malformed line before a match; a
// line longer than LineReader's cap is malformed (906, logged with its
// length and only its first bytes).
bool ScanQueue(const std::string& path, const std::function<bool(const Event&)>& matches);

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_SRC_QUEUE_QUEUE_SCAN_H_
