// Small file-system tests and path-string helpers. Plain functions without
// shared state: safe for concurrent use.
#ifndef ORVEX_FOUNDATION_UTIL_H_
#define ORVEX_FOUNDATION_UTIL_H_

#include <dirent.h>

#include <string>

#include "orvex/export.h"

namespace orvex {

// True when path is a regular file itself: a symbolic link, even to a file,
// gives false. Never throws.
ORVEX_EXPORT bool IsFileExist(const std::string& path);

// True when path is a directory. A symbolic link gives false unless
// follow_link is set; then its target is tested (a relative target against
// the current directory, not the link's). Any failure, a dangling link or a
// link loop gives false. Never throws.
ORVEX_EXPORT bool IsDirExist(const std::string& path, bool follow_link);

// Whether a directory entry is a directory, from its d_type. Entries of
// unknown type (DT_UNKNOWN) count as non-directories; path is the entry's
// full path. Never throws.
ORVEX_EXPORT bool IsDirentDir(const dirent& entry, const std::string& path);

// True when any of the permission bits in perm (read 4, write 2, execute 1)
// is granted on path to the effective user; false when the path does not
// exist or the permissions cannot be read. Never throws.
ORVEX_EXPORT bool CheckACLPerm(const std::string& path, int perm);

// True when the directory at path is a mount point ("/" included); false for
// anything else or on failure. Never throws.
ORVEX_EXPORT bool IsMountPoint(const std::string& path);

// True when s begins with prefix; an empty prefix always matches.
ORVEX_EXPORT bool StringStartWith(const std::string& s, const std::string& prefix);

// The text after the last "/": the whole string when there is none, "" for a
// path ending in "/".
ORVEX_EXPORT std::string Basename(const std::string& path);

// The text before the last "/": the whole string when there is none, "" for
// "/name".
ORVEX_EXPORT std::string Dirname(const std::string& path);

// The text after the last "." of Basename(path), "" when it has none
// ("archive.tar.gz" gives "gz", ".bashrc" gives "bashrc", "name." gives "").
// With lower, each byte is passed through tolower.
ORVEX_EXPORT std::string GetFileExtension(const std::string& path, bool lower);

// Creates the missing directories above path (mode 0755), so that a state
// file can be written on a fresh system or a fresh ORVEX_ROOT. Failures are
// left for the write that follows to report; errno is left as it was.
ORVEX_EXPORT void MakeParentDirectories(const std::string& path);

namespace fileindex {

// The same four string helpers, exported a second time under the file-index
// namespace; they behave exactly as the orvex:: ones.
ORVEX_EXPORT bool StringStartWith(const std::string& s, const std::string& prefix);
ORVEX_EXPORT std::string Basename(const std::string& path);
ORVEX_EXPORT std::string Dirname(const std::string& path);
ORVEX_EXPORT std::string GetFileExtension(const std::string& path, bool lower);

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_FOUNDATION_UTIL_H_
