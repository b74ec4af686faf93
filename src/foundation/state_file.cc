#include "foundation/state_file.h"

#include <sys/stat.h>

namespace orvex {

std::string NotARegularFile(const std::string& path) {
  struct stat st;
  if (::lstat(path.c_str(), &st) != 0 || S_ISREG(st.st_mode)) return "";
  if (S_ISLNK(st.st_mode)) return " is a symbolic link";
  if (S_ISDIR(st.st_mode)) return " is a directory";
  return " is not a regular file";
}

}  // namespace orvex
