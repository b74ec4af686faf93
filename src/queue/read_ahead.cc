#include "queue/read_ahead.h"

#include <cerrno>

#include "queue/prefetch.h"

namespace orvex {
namespace fileindex {

ReadAhead::ReadAhead(LineReader& reader, const NodeIndex& index)
    : reader_(reader), index_(index), ring_(kLines) {}

AheadLine* ReadAhead::Next() {
  if (handed_) {
    // The caller is done with the previous line.
    AheadLine& done = At(0);
    bytes_ -= done.text.size();
    if (done.text.capacity() > kKeepCapacity) std::string().swap(done.text);
    first_ = (first_ + 1) % kLines;
    --count_;
    handed_ = false;
  }
  while (more_ && count_ < kLines && bytes_ < kBytes) {
    if (!ReadOne()) break;
    LoadStages();
  }
  if (count_ == 0) return nullptr;
  handed_ = true;
  return &At(0);
}

bool ReadAhead::ReadOne() {
  AheadLine& line = At(count_);
  // A failed read would leave errno set while the lines before it are
  // folded; they must see errno as they would without the read.
  const int saved_errno = errno;
  more_ = reader_.Next(line.text);
  errno = saved_errno;
  if (!more_) return false;
  line.too_long = reader_.last_line_too_long();
  line.length = reader_.last_line_length();
  line.fields.is_dir = false;
  line.fields.path_old.clear();
  line.fields.data = Json::Value();
  // The head of an over-long line may well scan as an event on its own.
  line.scanned = !line.too_long && ParseEventFast(line.text, line.fields);
  line.keys = line.scanned ? NodeIndex::KeysOf(line.fields.path) : PathKeys();
  line.candidate = nullptr;
  if (line.keys.canonical) index_.Prefetch(line.keys.key);
  bytes_ += line.text.size();
  ++count_;
  return true;
}

void ReadAhead::LoadStages() {
  // By how far each line is behind the newest: its slot started loading
  // when it was read; then its node, its op list and its ops, each once the
  // stage before had time to arrive.
  const size_t newest = count_ - 1;
  if (newest >= kStageDistance) {
    AheadLine& line = At(newest - kStageDistance);
    if (line.keys.canonical) line.candidate = index_.Candidate(line.keys.key);
    if (line.candidate != nullptr) PrefetchNode(line.candidate);
  }
  if (newest >= 2 * kStageDistance) {
    const OPNode* node = At(newest - 2 * kStageDistance).candidate;
    if (node != nullptr) PrefetchOpList(node);
  }
  if (newest >= 3 * kStageDistance) {
    const OPNode* node = At(newest - 3 * kStageDistance).candidate;
    if (node != nullptr) PrefetchOps(node);
  }
}

}  // namespace fileindex
}  // namespace orvex
