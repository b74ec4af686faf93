// NodeIndex: every node of one operation tree in one flat table, found by its
// parent and name or by its full path. A node's key is its parent's key mixed
// with the hash of its name, so the key of a path follows from its components
// alone: a directory with very many entries is searched without scanning its
// siblings, and a path seen before costs one probe however deep it is.
// One thread at a time.
#ifndef ORVEX_SRC_QUEUE_NODE_INDEX_H_
#define ORVEX_SRC_QUEUE_NODE_INDEX_H_

#include <cstddef>
#include <cstdint>
#include <string_view>
#include <vector>

namespace orvex {
namespace fileindex {

class OPNode;

// The keys a path's lookup needs, computed from its components.
struct PathKeys {
  bool canonical = false;  // absolute, no empty component, no trailing slash
  uint64_t key = 0;        // of the path (when canonical)
  uint64_t dir_key = 0;    // of its directory
  size_t name_start = 0;   // where its last component starts
};

class NodeIndex {
 public:
  // The key of a node that heads an index (a tree's root).
  static constexpr uint64_t kRootKey = 0x6f7276657821ULL;

  static uint64_t ChildKey(uint64_t parent_key, std::string_view name);
  static PathKeys KeysOf(std::string_view path);

  // The child of parent named name (exact bytes), or null.
  OPNode* FindChild(uint64_t key, const OPNode* parent, std::string_view name) const;
  // The node whose path is exactly path, or null.
  OPNode* FindPath(uint64_t key, std::string_view path) const;
  // Records node, which must not be recorded yet. Ignored once retired.
  void Add(uint64_t key, OPNode* node);
  // Starts loading the slot of key into the cache.
  void Prefetch(uint64_t key) const;
  // The first node recorded under key, not confirmed to be the one sought:
  // good for starting to load memory early, for nothing else.
  const OPNode* Candidate(uint64_t key) const;

  // Forgets every node for good: the tree is being dropped and its nodes may
  // be freed, so nothing may be looked up or recorded here any more.
  void Retire();
  bool retired() const { return retired_; }

 private:
  static constexpr size_t kInitialSlots = 1024;

  struct Slot {
    uint64_t key;
    OPNode* node;  // null: free slot
  };

  template <typename Match>
  OPNode* Find(uint64_t key, Match match) const;
  void Place(const Slot& slot);

  // Open addressing with linear probing; the size a power of two, at most
  // half full.
  std::vector<Slot> slots_;
  size_t used_ = 0;
  bool retired_ = false;
};

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_SRC_QUEUE_NODE_INDEX_H_
