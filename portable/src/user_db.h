// Look-ups in the system's user and group database for the portable
// platform's user, credential and privilege calls. Safe for concurrent use
// (reentrant getpw*_r calls only).
#ifndef ORVEX_PORTABLE_SRC_USER_DB_H_
#define ORVEX_PORTABLE_SRC_USER_DB_H_

#include <pwd.h>
#include <sys/types.h>

#include <vector>

namespace orvex {
namespace portable {

// A user database entry with the storage its strings point into. Not
// copyable: pw points into buffer.
struct PasswdEntry {
  PasswdEntry() = default;
  PasswdEntry(const PasswdEntry&) = delete;
  PasswdEntry& operator=(const PasswdEntry&) = delete;

  struct passwd pw {};
  std::vector<char> buffer;
};

// False when the user is unknown or the database cannot be read.
bool LookUpUser(uid_t uid, PasswdEntry& entry);
bool LookUpUser(const char* name, PasswdEntry& entry);

// The user's primary and supplementary groups; false when they cannot be
// listed.
bool GroupsOf(const struct passwd& user, std::vector<gid_t>& groups);

}  // namespace portable
}  // namespace orvex

#endif  // ORVEX_PORTABLE_SRC_USER_DB_H_
