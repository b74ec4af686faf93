// The share registry: the portable platform's list of the NAS's shares, one
// JSON file at /etc/orvex/shares.json (under ORVEX_ROOT). doc/share_registry.md
// describes the format. Readers take no lock and see either the old or the
// new file; writers (add, update, remove) serialise between processes on the
// lock file /tmp/orvex_shares.lock (under ORVEX_ROOT) with flock and replace
// the registry atomically, mode 0644. Safe for concurrent use by threads and
// processes.
// Who may include it: in the library, only the platform layer (src/platform/),
// the one door through which every subsystem reaches the platform, and the
// foundation beneath it; the programs and the tests may include it freely.
#ifndef ORVEX_PORTABLE_SHARE_REGISTRY_H_
#define ORVEX_PORTABLE_SHARE_REGISTRY_H_

#include <functional>
#include <map>
#include <stdexcept>
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

// A failure of the registry file or of its lock file, as opposed to a share
// record refused (std::invalid_argument). what() names the file and says
// what is wrong with it, for example "<path> is a symbolic link",
// "<path> cannot be written: no space left on device" or
// "<path>: share [1]: duplicate name \"a\"".
class ShareRegistryError : public std::runtime_error {
 public:
  enum class Kind {
    kLoad,  // the registry cannot be read or is malformed
    kLock,  // the writers' lock file cannot be opened or locked
    kSave,  // the new registry cannot be written
  };
  ShareRegistryError(Kind kind, int error_number, const std::string& what)
      : std::runtime_error(what), kind_(kind), error_number_(error_number) {}
  Kind kind() const { return kind_; }
  // errno of the call that failed; ELOOP when the registry is a symbolic
  // link, EISDIR when it is a directory, 0 when its content is at fault.
  int error_number() const { return error_number_; }

 private:
  Kind kind_;
  int error_number_;
};

// Parses registry text. source names the file in error messages. Throws
// ShareRegistryError (kLoad) whose message starts with source and says what
// is wrong (not JSON, not an array, which entry and which key is missing or
// has the wrong type, a bad name or path, a duplicate name).
std::vector<ShareRecord> ParseShareRegistry(const std::string& text, const std::string& source);

// The registry's text for shares (what the add, update and remove write).
std::string FormatShareRegistry(const std::vector<ShareRecord>& shares);

// All shares in registry order; none when the file does not exist. Throws
// ShareRegistryError (kLoad) naming the file when it cannot be read, is
// malformed, or is a symbolic link or a directory rather than the file
// itself (a link is refused even when it leads to a valid registry: every
// change replaces the file whole, which would silently cut the link).
std::vector<ShareRecord> LoadShares();

// Looks name up (exact case). Returns false when no share has that name.
// Throws as LoadShares.
bool FindShare(const std::string& name, ShareRecord& out);

// A caller's own rule for new shares (the orvex tool refuses overlapping
// share paths): called by AddShare under the writers' lock with the registry
// as it stands and the share as it will be stored (trailing slashes
// dropped). Throws to refuse the share; the exception reaches AddShare's
// caller and the file stays as it was.
using ShareAddCheck =
    std::function<void(const std::vector<ShareRecord>& shares, const ShareRecord& share)>;

// Appends share to the registry, creating the file (and its directory) when
// absent, after check (when given) has accepted it. Trailing slashes of
// share.path are dropped. Throws std::invalid_argument when the name is
// empty, longer than 255 bytes, contains "/", a control character or bytes
// that are not UTF-8, when the path is not absolute, is "/", longer than
// 4095 bytes or has empty, "." or ".." components, when a privilege value is
// not "rw", "ro" or "na", or when a share of that name exists. Throws
// ShareRegistryError when the registry is malformed or cannot be locked or
// written; the file is then unchanged.
void AddShare(const ShareRecord& share, const ShareAddCheck& check = {});

// Replaces the share whose name is share.name with share, keeping its place.
// Throws std::invalid_argument when no share has that name or share is
// invalid (as AddShare), ShareRegistryError as AddShare.
void UpdateShare(const ShareRecord& share);

// Removes the share called name. Returns false (and writes nothing) when no
// share has that name. Throws ShareRegistryError as AddShare.
bool RemoveShare(const std::string& name);

}  // namespace portable
}  // namespace orvex

#endif  // ORVEX_PORTABLE_SHARE_REGISTRY_H_
