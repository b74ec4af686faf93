#include "queue/queue_scan.h"

#include <cerrno>
#include <cstring>

#include "foundation/check.h"
#include "queue/line_reader.h"

namespace orvex {
namespace fileindex {
namespace {

constexpr char kLogSource[] = "queue_mgr";

}  // namespace

bool ScanQueue(const std::string& path, const std::function<bool(const Event&)>& matches) {
  LineReader reader(path);
  if (!reader.ok() && errno == ENOENT) return false;
  ORVEX_CHECK_AS(!reader.ok(), "!input_stream", kErrorSystem,
                 "Failed to open queue, reason=" + std::string(std::strerror(errno)));
  // A malformed line logs errno when it is set: only its own, not what the
  // caller left behind.
  errno = 0;
  std::string line;
  // Producers append each line with one write, but a reader may see the
  // start of a line before its end (an append reaches the file a page at a
  // time), so a last line counts only once its newline is there.
  while (reader.Next(line) && reader.last_line_complete()) {
    ORVEX_CHECK(reader.last_line_too_long(), kErrorMalformedEvent,
                LongLineReason(line, reader.last_line_length(), reader.max_line()));
    if (matches(Event(line))) return true;  // Event throws for a malformed line
  }
  return false;
}

}  // namespace fileindex
}  // namespace orvex
