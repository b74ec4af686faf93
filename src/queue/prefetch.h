// Hints that start loading a node, its op list or its ops into the cache
// ahead of a walk that will need them. They read only memory that is valid
// at the time of the call and have no effect but timing.
#ifndef ORVEX_SRC_QUEUE_PREFETCH_H_
#define ORVEX_SRC_QUEUE_PREFETCH_H_

#include <cstddef>

#include "orvex/queue/op.h"

namespace orvex {
namespace fileindex {

constexpr size_t kCacheLine = 64;

// The node object: it spans a few cache lines (name, parent, children, ops).
inline void PrefetchNode(const OPNode* node) {
  const char* bytes = reinterpret_cast<const char*>(node);
  for (size_t offset = 0; offset < sizeof(OPNode); offset += kCacheLine) {
    __builtin_prefetch(bytes + offset);
  }
}

// The parts of the node a walk over the tree reads: its children and its ops.
inline void PrefetchNodeLists(const OPNode* node) {
  __builtin_prefetch(&node->children());
  __builtin_prefetch(&node->ops());
}

// The buffer of the node's op list; reads the node.
inline void PrefetchOpList(const OPNode* node) {
  if (!node->ops().empty()) __builtin_prefetch(node->ops().data());
}

// The kinds of the node's first ops; reads the node and its op list.
inline void PrefetchOps(const OPNode* node) {
  constexpr size_t kMaximum = 8;
  const auto& ops = node->ops();
  for (size_t i = 0; i < ops.size() && i < kMaximum; ++i) __builtin_prefetch(&ops[i]->kind);
}

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_SRC_QUEUE_PREFETCH_H_
