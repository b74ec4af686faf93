// OrderedTreeWalk: the entries below a directory in the byte order of their
// full paths, the order in which the search daemon lists documents, so that
// a walk and the index's pages can be merged. A directory's descendants do
// not follow it directly in that order ("d" < "d.txt" < "d/x" < "d0"):
// each directory's entries are sorted with a subdirectory keyed both as
// itself ("d") and as the start of its subtree ("d/"), and a subdirectory is
// listed only when its subtree's turn comes. The walk holds the entries
// still to come of the directories between the root and the current one,
// never the whole tree. Entries are looked at with lstat: links are never
// followed. One thread at a time.
#ifndef ORVEX_DAEMONS_INDEX_ORDERED_TREE_WALK_H_
#define ORVEX_DAEMONS_INDEX_ORDERED_TREE_WALK_H_

#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace orvex {
namespace indexd {

class OrderedTreeWalk {
 public:
  struct Entry {
    std::string path;
    bool is_dir = false;
    long long size = 0;
    long long ctime = 0;  // seconds
    long long mtime = 0;  // seconds
  };
  // What the walk does with an entry: yield it, and (directories only) go
  // below it.
  struct Visit {
    bool yield = false;
    bool descend = false;
  };
  using Filter = std::function<Visit(const std::string& path, bool is_dir)>;

  // Walks below root (root itself is not yielded); filter decides per
  // entry. A directory that cannot be read (gone, not ours) has no entries.
  OrderedTreeWalk(const std::string& root, Filter filter);

  // The next entry, or nullptr when the walk is over. Valid until Pop().
  const Entry* Peek();
  void Pop() { current_.reset(); }

 private:
  // An entry by name: a directory's own entry, and its subtree ("name/").
  struct Item {
    std::string key;
    bool is_dir = false;
    long long size = 0, ctime = 0, mtime = 0;
    bool subtree() const { return key.back() == '/'; }
  };
  struct Frame {
    std::string dir;
    std::vector<Item> items;  // sorted by key
    size_t next = 0;
  };

  void Enter(const std::string& dir);

  Filter filter_;
  std::vector<Frame> frames_;
  std::optional<Entry> current_;
};

}  // namespace indexd
}  // namespace orvex

#endif  // ORVEX_DAEMONS_INDEX_ORDERED_TREE_WALK_H_
