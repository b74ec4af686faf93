// Reading the parts of a zip package (office documents, EPUB) with
// libarchive, entry by entry, under a budget of uncompressed bytes for the
// whole archive: a zip bomb costs at most the budget, whatever its entries
// claim or really hold. One thread at a time.
#ifndef ORVEX_PORTABLE_EXTRACT_ZIP_READER_H_
#define ORVEX_PORTABLE_EXTRACT_ZIP_READER_H_

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <string>

struct archive;

namespace orvex {
namespace extract {

class ZipReader {
 public:
  // budget: the most uncompressed bytes Read hands out in total.
  explicit ZipReader(uint64_t budget) : budget_(budget) {}
  ZipReader(const ZipReader&) = delete;
  ZipReader& operator=(const ZipReader&) = delete;
  ~ZipReader();

  // Opens the zip file at path; false with *problem on failure.
  bool Open(const std::string& path, std::string* problem);
  // Moves to the next entry and sets *name to its path inside the archive.
  // Returns false at the end and on a damaged archive (then error() is set).
  bool Next(std::string* name);
  // Reads up to len bytes of the current entry: 0 at its end or once the
  // budget is spent (then exhausted() is true), -1 on a damaged entry.
  ssize_t Read(char* buf, size_t len);
  // Reads the whole current entry into *data unless it is larger than
  // max_bytes (then false, with nothing read past max_bytes). Not charged
  // to the budget: callers read each small part once at most.
  bool ReadAll(size_t max_bytes, std::string* data);

  // The uncompressed size the current entry claims, -1 when it claims none.
  // Only a hint: the budget holds whatever the data turns out to be.
  int64_t declared_size() const { return declared_size_; }
  bool exhausted() const { return exhausted_; }
  const std::string& error() const { return error_; }

 private:
  void SetError(const char* what);

  struct archive* archive_ = nullptr;
  uint64_t budget_;
  size_t entries_ = 0;
  int64_t declared_size_ = -1;
  bool exhausted_ = false;
  std::string error_;
};

}  // namespace extract
}  // namespace orvex

#endif  // ORVEX_PORTABLE_EXTRACT_ZIP_READER_H_
