// ReadAhead: the lines of a queue file in order, each read and scanned a few
// lines before its turn. Meanwhile the memory its fold will touch (the index
// slot of its path, the node, the node's op list, the ops) starts loading,
// one stage per few lines read, so that the cache misses of one line overlap
// the reading of the next ones. Only timing changes: lines come out in file
// order, and nothing is logged or counted here. One thread at a time.
#ifndef ORVEX_SRC_QUEUE_READ_AHEAD_H_
#define ORVEX_SRC_QUEUE_READ_AHEAD_H_

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "queue/event_parser.h"
#include "queue/line_reader.h"
#include "queue/node_index.h"

namespace orvex {
namespace fileindex {

struct AheadLine {
  std::string text;       // only the head of a line over the reader's cap
  bool too_long = false;  // the line was over the cap: a bad line
  uint64_t length = 0;    // its full length, newline excluded
  EventFields fields;
  bool scanned = false;               // fields hold the line; otherwise parse it in turn
  PathKeys keys;                      // of fields.path, when scanned
  const OPNode* candidate = nullptr;  // its node as far as known, unconfirmed
};

class ReadAhead {
 public:
  // Reads from reader, which must stay open; index is the tree's.
  ReadAhead(LineReader& reader, const NodeIndex& index);

  // The next line of the file, or null after the last one (or a read error).
  // Valid until the next call.
  AheadLine* Next();

 private:
  static constexpr size_t kLines = 16;               // the lines in flight
  static constexpr size_t kBytes = 1 << 20;          // but no more bytes than this
  static constexpr size_t kStageDistance = 4;        // lines between two stages
  static constexpr size_t kKeepCapacity = 64 << 10;  // larger line buffers shrink

  AheadLine& At(size_t age) { return ring_[(first_ + age) % kLines]; }
  // Reads and scans one more line; false at the end of the file.
  bool ReadOne();
  // Advances every line in flight by one loading stage.
  void LoadStages();

  LineReader& reader_;
  const NodeIndex& index_;
  std::vector<AheadLine> ring_;
  size_t first_ = 0;     // the ring position of the line handed out next
  size_t count_ = 0;     // lines read and not yet handed out
  size_t bytes_ = 0;     // their bytes
  bool more_ = true;     // the file may hold more lines
  bool handed_ = false;  // the line at first_ was handed out by the last call
};

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_SRC_QUEUE_READ_AHEAD_H_
