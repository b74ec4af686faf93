#include "index_mgr/pending_scan.h"

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "foundation/check.h"
#include "queue/event_parser.h"
#include "queue/line_reader.h"

namespace orvex {
namespace fileindex {
namespace {

// The lines logged here are the queue manager's own scan's lines, so the
// log reads the same whichever way a folder's status was asked.
constexpr char kLogSource[] = "queue_mgr";
constexpr char kTmpSuffix[] = ".tmp";

}  // namespace

PendingScan::PendingScan(const std::string& queue_path, std::vector<std::string> targets)
    : targets_(std::move(targets)) {
  live_.path = queue_path;
  tmp_.path = queue_path + kTmpSuffix;
  live_.matched.assign(targets_.size(), 0);
  tmp_.matched.assign(targets_.size(), 0);
  min_length_ = targets_.empty() ? 0 : targets_[0].size();
  for (size_t i = 0; i < targets_.size(); ++i) {
    by_path_[targets_[i]].push_back(i);
    min_length_ = std::min(min_length_, targets_[i].size());
    max_length_ = std::max(max_length_, targets_[i].size());
  }
}

PendingScan::~PendingScan() = default;

bool PendingScan::IsPending(size_t target) {
  return Advance(live_, target) || Advance(tmp_, target);
}

bool PendingScan::Start(File& file) {
  file.started = true;
  file.reader = std::make_unique<LineReader>(file.path);
  if (!file.reader->ok() && errno == ENOENT) {
    file.finished = true;
    return false;
  }
  try {
    ORVEX_CHECK_AS(!file.reader->ok(), "!input_stream", kErrorSystem,
                   "Failed to open queue, reason=" + std::string(std::strerror(errno)));
  } catch (const Error& e) {
    file.error = e;
    throw;
  }
  errno = 0;
  return true;
}

// The holders of path are the targets equal to it or to one of its
// ancestors: its prefixes that end at a "/" or at its end. Only prefixes as
// long as some target can hold it, so a line costs a few lookups however
// many folders the share has.
void PendingScan::MarkHolders(File& file, std::string_view path) {
  const size_t last = std::min(max_length_, path.size());
  for (size_t n = min_length_; n <= last; ++n) {
    if (n != path.size() && path[n] != '/') continue;
    auto it = by_path_.find(path.substr(0, n));
    if (it == by_path_.end()) continue;
    for (size_t target : it->second) file.matched[target] = 1;
  }
}

bool PendingScan::Advance(File& file, size_t target) {
  if (file.matched[target]) return true;
  if (file.error) throw *file.error;
  if (file.finished) return false;
  if (!file.started && !Start(file)) return false;
  LineReader& reader = *file.reader;
  std::string line;
  // Reused from line to line: the scan allocates nothing per line once the
  // strings have grown to a path's length.
  EventFields fields;
  // A malformed line's log names errno when it is set: only the scan's own,
  // as when the file was just opened, not what ran since the last question.
  errno = 0;
  try {
    // As the queue manager's scan: a last line without its newline is still
    // being appended and is not looked at.
    while (reader.Next(line) && reader.last_line_complete()) {
      ORVEX_CHECK_AS(reader.last_line_too_long(), "reader.last_line_too_long()",
                     kErrorMalformedEvent,
                     LongLineReason(line, reader.last_line_length(), reader.max_line()));
      // Event's own parse, without building an Event: only the two paths are
      // looked at.
      fields.path_old.clear();
      if (!ParseEventFast(line, fields)) {
        EventFields general;
        ParseEventJson(line, general);
        fields.path = std::move(general.path);
        fields.path_old = std::move(general.path_old);
      }
      MarkHolders(file, fields.path);
      MarkHolders(file, fields.path_old);
      if (file.matched[target]) return true;
    }
  } catch (const Error& e) {
    file.error = e;
    throw;
  }
  file.finished = true;
  file.reader.reset();
  return false;
}

}  // namespace fileindex
}  // namespace orvex
