// The share registry: the portable platform's list of the NAS's shares, one
// JSON file at /etc/orvex/shares.json (under ORVEX_ROOT). doc/share_registry.md
// describes the format. Readers take no lock and see either the old or the
// new file; writers (add, update, remove) serialise between processes on the
// lock file /tmp/orvex_shares.lock (under ORVEX_ROOT) with flock and replace
// the registry atomically, mode 0644. Safe for concurrent use by threads and
// processes.
#ifndef ORVEX_PORTABLE_SHARE_REGISTRY_H_
#define ORVEX_PORTABLE_SHARE_REGISTRY_H_

#include <map>
#include <string>
#include <vector>

namespace orvex {
namespace portable {

// The registry's fixed paths, resolved with RootPath when used.
constexpr char kShareRegistryPath[] = "/etc/orvex/shares.json";
constexpr char kShareRegistryLockPath[] = "/tmp/orvex_shares.lock";

// Values of ShareRecord::privileges.
constexpr char kSharePrivReadWrite[] = "rw";
constexpr char kSharePrivReadOnly[] = "ro";
constexpr char kSharePrivNone[] = "na";

// One share. Field names follow the registry's keys.
struct ShareRecord {
  std::string name;  // unique, exact case, no "/"
  std::string path;  // absolute root directory, no trailing slash
  bool encryption = false;
  bool encrypted = false;
  bool readonly = false;
  bool recycle_bin = false;
  bool hide_unreadable = false;
  int ftp_privilege = 0;
  std::map<std::string, std::string> privileges;  // user -> "rw", "ro", "na"
};

// Parses registry text. source names the file in error messages. Throws
// std::runtime_error whose message starts with source and says what is wrong
// (not JSON, not an array, which entry and which key is missing or has the
// wrong type, a bad name or path, a duplicate name).
std::vector<ShareRecord> ParseShareRegistry(const std::string& text, const std::string& source);

// The registry's text for shares (what the add, update and remove write).
std::string FormatShareRegistry(const std::vector<ShareRecord>& shares);

// All shares in registry order; none when the file does not exist. Throws
// std::runtime_error naming the file when it cannot be read or is malformed.
std::vector<ShareRecord> LoadShares();

// Looks name up (exact case). Returns false when no share has that name.
// Throws as LoadShares.
bool FindShare(const std::string& name, ShareRecord& out);

// Appends share to the registry, creating the file (and its directory) when
// absent. Trailing slashes of share.path are dropped. Throws
// std::invalid_argument when the name is empty, longer than 255 bytes or
// contains "/", when the path is not absolute, is "/", longer than 4095
// bytes or has empty, "." or ".." components, when a privilege value is not
// "rw", "ro" or "na", or when a share of that name exists. Throws
// std::runtime_error when the registry is malformed or cannot be locked or
// written; the file is then unchanged.
void AddShare(const ShareRecord& share);

// Replaces the share whose name is share.name with share, keeping its place.
// Throws std::invalid_argument when no share has that name or share is
// invalid (as AddShare), std::runtime_error as AddShare.
void UpdateShare(const ShareRecord& share);

// Removes the share called name. Returns false (and writes nothing) when no
// share has that name. Throws std::runtime_error as AddShare.
bool RemoveShare(const std::string& name);

}  // namespace portable
}  // namespace orvex

#endif  // ORVEX_PORTABLE_SHARE_REGISTRY_H_
