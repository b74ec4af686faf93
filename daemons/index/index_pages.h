// IndexPages: the documents a share's index holds below a path, read from
// the search daemon a page at a time ("document_get_by_query" with "limit"
// and "after") in the index's path order, the byte order of full paths. Only
// what a walk compares is kept of each document, so the memory held is one
// page's paths, however large the subtree. One thread at a time.
#ifndef ORVEX_DAEMONS_INDEX_INDEX_PAGES_H_
#define ORVEX_DAEMONS_INDEX_INDEX_PAGES_H_

#include <cstddef>
#include <string>
#include <vector>

namespace orvex {
namespace indexd {

class IndexPages {
 public:
  // A document as a walk compares it with the file; -1 where unknown.
  struct Doc {
    std::string path;
    long long size = -1;
    long long ctime = -1;
    long long mtime = -1;
  };

  // The documents of share's index whose path begins with prefix, page_size
  // (at least 1) at a time. Nothing is asked before the first Peek().
  IndexPages(std::string share, std::string prefix, size_t page_size);

  // The next document, or nullptr after the last; asks for the next page
  // when the current one is used up. Throws the client's Error when the
  // search daemon cannot be asked (nothing is consumed then: the call may be
  // repeated), and Error kErrorSearchDaemon for an answer without "data".
  // Valid until Pop().
  const Doc* Peek();
  void Pop() { ++next_; }

 private:
  void Fetch();

  std::string share_;
  std::string prefix_;
  size_t page_size_;
  std::vector<Doc> page_;
  size_t next_ = 0;
  std::string after_;  // the last path received
  bool more_ = true;
};

}  // namespace indexd
}  // namespace orvex

#endif  // ORVEX_DAEMONS_INDEX_INDEX_PAGES_H_
