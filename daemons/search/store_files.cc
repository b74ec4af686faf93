#include "search/store_files.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <system_error>

#include "orvex/portable/file_descriptor.h"
#include "search/search_error.h"

namespace orvex {
namespace search {
namespace {

[[noreturn]] void Fail(const std::string& what, const std::string& path) {
  throw SearchError(kStorage, "cannot " + what + " " + path + ": " + std::strerror(errno));
}

void CopyFile(const std::string& from, const std::string& to) {
  FileDescriptor in(::open(from.c_str(), O_RDONLY | O_CLOEXEC));
  if (!in) Fail("open", from);
  FileDescriptor out(::open(to.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644));
  if (!out) Fail("create", to);
  char buffer[1 << 16];
  for (;;) {
    const ssize_t n = ::read(in.get(), buffer, sizeof(buffer));
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) Fail("read", from);
    if (n == 0) break;
    for (ssize_t done = 0; done < n;) {
      const ssize_t w = ::write(out.get(), buffer + done, static_cast<size_t>(n - done));
      if (w < 0 && errno == EINTR) continue;
      if (w < 0) Fail("write", to);
      done += w;
    }
  }
  if (::fsync(out.get()) != 0 || !out.Close()) Fail("flush", to);
}

}  // namespace

void RemoveStoreFiles(const std::string& path) {
  for (const char* suffix : {"", "-wal", "-shm"}) {
    const std::string file = path + suffix;
    if (::unlink(file.c_str()) != 0 && errno != ENOENT) Fail("remove", file);
  }
}

void MoveStoreFile(const std::string& from, const std::string& to) {
  std::error_code ec;
  std::filesystem::create_directories(std::filesystem::path(to).parent_path(), ec);
  if (ec) throw SearchError(kStorage, "cannot create the directory of " + to + ": " + ec.message());
  // Stale log files at the destination would be read as this database's.
  RemoveStoreFiles(to);
  if (::rename(from.c_str(), to.c_str()) != 0) {
    if (errno != EXDEV) Fail("move " + from + " to", to);
    const std::string temporary = to + ".moving";
    try {
      CopyFile(from, temporary);
    } catch (const SearchError&) {
      ::unlink(temporary.c_str());
      throw;
    }
    if (::rename(temporary.c_str(), to.c_str()) != 0) {
      ::unlink(temporary.c_str());
      Fail("rename into place", to);
    }
  }
  RemoveStoreFiles(from);
}

}  // namespace search
}  // namespace orvex
