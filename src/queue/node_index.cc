#include "queue/node_index.h"

#include <functional>
#include <string>

#include "orvex/queue/op.h"

namespace orvex {
namespace fileindex {
namespace {

// The finaliser of splitmix64: spreads every input bit over the whole key, so
// that the low bits a probe starts from are as good as the high ones.
uint64_t Mix(uint64_t x) {
  x ^= x >> 30;
  x *= 0xbf58476d1ce4e5b9ULL;
  x ^= x >> 27;
  x *= 0x94d049bb133111ebULL;
  return x ^ (x >> 31);
}

// Whether node's path is exactly path: compares the names up the parent
// chain with the components of path from its end.
bool HasPath(const OPNode* node, std::string_view path) {
  size_t end = path.size();
  for (; node->parent() != nullptr; node = node->parent().get()) {
    const std::string& name = node->name();
    if (end < name.size() + 1) return false;
    const size_t start = end - name.size();
    if (path[start - 1] != '/' || path.compare(start, name.size(), name) != 0) return false;
    end = start - 1;
  }
  return end == 0;
}

}  // namespace

uint64_t NodeIndex::ChildKey(uint64_t parent_key, std::string_view name) {
  return Mix(parent_key * 0x9e3779b97f4a7c15ULL + std::hash<std::string_view>()(name));
}

PathKeys NodeIndex::KeysOf(std::string_view path) {
  PathKeys keys;
  if (path.size() < 2 || path.front() != '/' || path.back() == '/') return keys;
  // One pass over the bytes: components are short, and a search call per
  // component would cost more than it saves.
  uint64_t key = kRootKey;
  size_t start = 1;
  for (size_t i = 1; i <= path.size(); ++i) {
    if (i < path.size() && path[i] != '/') continue;
    if (i == start) return keys;  // an empty component: "//"
    keys.dir_key = key;
    keys.name_start = start;
    key = ChildKey(key, path.substr(start, i - start));
    start = i + 1;
  }
  keys.canonical = true;
  keys.key = key;
  return keys;
}

template <typename Match>
OPNode* NodeIndex::Find(uint64_t key, Match match) const {
  if (slots_.empty()) return nullptr;
  const size_t mask = slots_.size() - 1;
  for (size_t i = key & mask;; i = (i + 1) & mask) {
    const Slot& slot = slots_[i];
    if (slot.node == nullptr) return nullptr;
    if (slot.key == key && match(slot.node)) return slot.node;
  }
}

OPNode* NodeIndex::FindChild(uint64_t key, const OPNode* parent, std::string_view name) const {
  return Find(key, [parent, name](const OPNode* node) {
    return node->parent().get() == parent && node->name() == name;
  });
}

OPNode* NodeIndex::FindPath(uint64_t key, std::string_view path) const {
  return Find(key, [path](const OPNode* node) { return HasPath(node, path); });
}

void NodeIndex::Add(uint64_t key, OPNode* node) {
  if (retired_) return;
  if (2 * (used_ + 1) > slots_.size()) {
    std::vector<Slot> old = std::move(slots_);
    slots_.assign(old.empty() ? kInitialSlots : 2 * old.size(), Slot{0, nullptr});
    for (const Slot& slot : old) {
      if (slot.node != nullptr) Place(slot);
    }
  }
  Place(Slot{key, node});
  ++used_;
}

void NodeIndex::Place(const Slot& slot) {
  const size_t mask = slots_.size() - 1;
  size_t i = slot.key & mask;
  while (slots_[i].node != nullptr) i = (i + 1) & mask;
  slots_[i] = slot;
}

void NodeIndex::Prefetch(uint64_t key) const {
  if (!slots_.empty()) __builtin_prefetch(&slots_[key & (slots_.size() - 1)]);
}

const OPNode* NodeIndex::Candidate(uint64_t key) const {
  return Find(key, [](const OPNode*) { return true; });
}

void NodeIndex::Retire() {
  retired_ = true;
  std::vector<Slot>().swap(slots_);
  used_ = 0;
}

}  // namespace fileindex
}  // namespace orvex
