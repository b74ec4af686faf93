#include "index/ordered_tree_walk.h"

#include <dirent.h>
#include <sys/stat.h>

#include <algorithm>
#include <utility>

namespace orvex {
namespace indexd {

OrderedTreeWalk::OrderedTreeWalk(const std::string& root, Filter filter)
    : filter_(std::move(filter)) {
  Enter(root);
}

const OrderedTreeWalk::Entry* OrderedTreeWalk::Peek() {
  while (!current_ && !frames_.empty()) {
    Frame& top = frames_.back();
    if (top.next == top.items.size()) {
      frames_.pop_back();
      continue;
    }
    const Item& item = top.items[top.next++];
    if (item.subtree()) {
      // Enter may move frames_: top and item are not used after it.
      Enter(top.dir + "/" + item.key.substr(0, item.key.size() - 1));
      continue;
    }
    current_ = Entry{top.dir + "/" + item.key, item.is_dir, item.size, item.ctime, item.mtime};
  }
  return current_ ? &*current_ : nullptr;
}

void OrderedTreeWalk::Enter(const std::string& dir) {
  DIR* d = ::opendir(dir.c_str());
  if (d == nullptr) return;
  Frame frame;
  frame.dir = dir;
  while (const dirent* found = ::readdir(d)) {
    const std::string name = found->d_name;
    if (name == "." || name == "..") continue;
    const std::string path = dir + "/" + name;
    struct stat st;
    if (::lstat(path.c_str(), &st) != 0) continue;  // gone meanwhile
    const bool is_dir = S_ISDIR(st.st_mode);
    const Visit visit = filter_(path, is_dir);
    if (visit.descend && is_dir) frame.items.push_back({name + "/", true, 0, 0, 0});
    if (visit.yield) {
      frame.items.push_back({name, is_dir, st.st_size, st.st_ctim.tv_sec, st.st_mtim.tv_sec});
    }
  }
  ::closedir(d);
  // Names hold no "/", so comparing keys compares the full paths (and
  // std::string compares bytes as unsigned, like the index).
  std::sort(frame.items.begin(), frame.items.end(),
            [](const Item& a, const Item& b) { return a.key < b.key; });
  frame.items.shrink_to_fit();
  frames_.push_back(std::move(frame));
}

}  // namespace indexd
}  // namespace orvex
