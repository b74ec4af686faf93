#include "user_db.h"

#include <grp.h>
#include <unistd.h>

#include <cerrno>

namespace orvex {
namespace portable {
namespace {

constexpr size_t kMaxBuffer = 1u << 20;

// Runs a getpw*_r call with a buffer that grows while it answers ERANGE.
template <typename Key, typename Lookup>
bool LookUp(Key key, Lookup lookup, PasswdEntry& entry) {
  long hint = ::sysconf(_SC_GETPW_R_SIZE_MAX);
  entry.buffer.resize(hint > 0 ? static_cast<size_t>(hint) : 1024);
  for (;;) {
    struct passwd* found = nullptr;
    int rc = lookup(key, &entry.pw, entry.buffer.data(), entry.buffer.size(), &found);
    if (rc == ERANGE && entry.buffer.size() < kMaxBuffer) {
      entry.buffer.resize(entry.buffer.size() * 2);
      continue;
    }
    return rc == 0 && found != nullptr;
  }
}

}  // namespace

bool LookUpUser(uid_t uid, PasswdEntry& entry) { return LookUp(uid, ::getpwuid_r, entry); }

bool LookUpUser(const char* name, PasswdEntry& entry) { return LookUp(name, ::getpwnam_r, entry); }

bool GroupsOf(const struct passwd& user, std::vector<gid_t>& groups) {
  int count = 32;
  for (int attempt = 0; attempt < 8; ++attempt) {
    groups.resize(static_cast<size_t>(count));
    int wanted = count;
    if (::getgrouplist(user.pw_name, user.pw_gid, groups.data(), &wanted) >= 0) {
      groups.resize(static_cast<size_t>(wanted));
      return true;
    }
    // On overflow getgrouplist reports the size it needs in wanted.
    count = wanted > count ? wanted : count * 2;
  }
  return false;
}

}  // namespace portable
}  // namespace orvex
