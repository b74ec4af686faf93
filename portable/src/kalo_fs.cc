#include "kalo/kalo_fs.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <string>

#include "kalo/kalo_error.h"

namespace {

bool IsEmpty(const char* path) { return path == nullptr || path[0] == '\0'; }

int BadParameter() {
  errno = EINVAL;
  KLIBC_ERR_SET(KLIB_ERR_BAD_PARAMETER);
  return -1;
}

// AT_EACCESS tests the effective ids, which is what a process running with
// switched credentials is actually allowed to do.
bool Granted(const char* path, int mode) {
  return ::faccessat(AT_FDCWD, path, mode, AT_EACCESS) == 0;
}

}  // namespace

int KALOACLPermGet(const char* path, unsigned int* perm) {
  if (IsEmpty(path) || perm == nullptr) return BadParameter();
  if (!Granted(path, F_OK)) {
    KLIBC_ERR_SET(KLIB_ERR_IO);
    return -1;
  }
  // Refused modes below leave EACCES behind although nothing failed; keep
  // errno as the caller had it.
  const int saved_errno = errno;
  unsigned int bits = 0;
  if (Granted(path, R_OK)) bits |= KALO_ACL_PERM_READ;
  if (Granted(path, W_OK)) bits |= KALO_ACL_PERM_WRITE;
  if (Granted(path, X_OK)) bits |= KALO_ACL_PERM_EXECUTE;
  *perm = bits;
  errno = saved_errno;
  return 0;
}

int KALOFSDirIsMntPoint(const char* path) {
  if (IsEmpty(path)) return BadParameter();
  struct stat self;
  if (::stat(path, &self) != 0) {
    KLIBC_ERR_SET(KLIB_ERR_IO);
    return -1;
  }
  if (!S_ISDIR(self.st_mode)) return 0;
  // "path/.." is resolved by the kernel after following path, so a link to a
  // directory is compared with its target's real parent.
  const std::string parent_path = std::string(path) + "/..";
  struct stat parent;
  if (::stat(parent_path.c_str(), &parent) != 0) {
    KLIBC_ERR_SET(KLIB_ERR_IO);
    return -1;
  }
  if (self.st_dev != parent.st_dev) return 1;
  // Only the root of the tree is its own parent.
  return self.st_ino == parent.st_ino ? 1 : 0;
}
