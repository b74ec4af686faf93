#include "zip_reader.h"

#include <archive.h>
#include <archive_entry.h>

#include <algorithm>

namespace orvex {
namespace extract {
namespace {

// A package with more entries than this is not a document we index; walking
// its headers alone would take long.
constexpr size_t kMaxEntries = 100000;

}  // namespace

ZipReader::~ZipReader() {
  if (archive_ != nullptr) archive_read_free(archive_);
}

void ZipReader::SetError(const char* what) {
  const char* reason = archive_ != nullptr ? archive_error_string(archive_) : nullptr;
  error_ =
      std::string("libarchive: ") + what + (reason != nullptr ? std::string(": ") + reason : "");
}

bool ZipReader::Open(const std::string& path, std::string* problem) {
  archive_ = archive_read_new();
  if (archive_ == nullptr) {
    if (problem != nullptr) *problem = "libarchive: cannot allocate a reader";
    return false;
  }
  // Zip only (the seekable reader uses the central directory when the file
  // allows seeking): a document that is any other archive is not one.
  archive_read_support_format_zip(archive_);
  if (archive_read_open_filename(archive_, path.c_str(), 64 * 1024) != ARCHIVE_OK) {
    SetError("cannot open");
    if (problem != nullptr) *problem = error_;
    return false;
  }
  return true;
}

bool ZipReader::Next(std::string* name) {
  if (++entries_ > kMaxEntries) {
    error_ = "libarchive: too many entries";
    return false;
  }
  struct archive_entry* entry = nullptr;
  const int status = archive_read_next_header(archive_, &entry);
  if (status == ARCHIVE_EOF) return false;
  if (status != ARCHIVE_OK && status != ARCHIVE_WARN) {
    SetError("damaged archive");
    return false;
  }
  declared_size_ = archive_entry_size_is_set(entry) ? archive_entry_size(entry) : -1;
  const char* path = archive_entry_pathname(entry);
  if (path == nullptr) path = archive_entry_pathname_utf8(entry);
  name->assign(path != nullptr ? path : "");
  return true;
}

ssize_t ZipReader::Read(char* buf, size_t len) {
  if (budget_ == 0) {
    exhausted_ = true;
    return 0;
  }
  len = static_cast<size_t>(std::min<uint64_t>(len, budget_));
  const la_ssize_t n = archive_read_data(archive_, buf, len);
  if (n < 0) {
    SetError("damaged entry");
    return -1;
  }
  budget_ -= static_cast<uint64_t>(n);
  return n;
}

bool ZipReader::ReadAll(size_t max_bytes, std::string* data) {
  data->clear();
  if (declared_size_ > static_cast<int64_t>(max_bytes)) return false;
  // Outside the budget, which is for the text parts: a small property part
  // must be readable after a bomb has spent it. max_bytes bounds this read.
  char buf[16 * 1024];
  for (;;) {
    const la_ssize_t n = archive_read_data(archive_, buf, sizeof(buf));
    if (n < 0) {
      SetError("damaged entry");
      return false;
    }
    if (n == 0) return true;
    if (data->size() + static_cast<size_t>(n) > max_bytes) return false;
    data->append(buf, static_cast<size_t>(n));
  }
}

}  // namespace extract
}  // namespace orvex
