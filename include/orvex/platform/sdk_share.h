// SDKShare: the library's view of one shared folder as the platform knows it.
// It opens the platform's share record by name and answers what indexing asks
// of a share: may it be indexed, is it encrypted, does it keep a recycle bin,
// is there space left, where do its event queue and index database live, what
// may a user do in it. Callers make one per operation and drop it; nothing is
// cached between objects. One thread at a time per object; the platform calls
// that need it are serialised process-wide by SDKMutex().
#ifndef ORVEX_PLATFORM_SDK_SHARE_H_
#define ORVEX_PLATFORM_SDK_SHARE_H_

#include <memory>
#include <string>
#include <vector>

#include "orvex/export.h"
#include "orvex/foundation/lock.h"

// The platform's share record (kalo/kalo_share.h); only a pointer is held here.
struct KALOSHARE;

namespace orvex {
namespace sdk {

// The one process-wide mutex that serialises platform share calls. It lives
// for the whole process; never destroyed while in use.
ORVEX_EXPORT Mutex& SDKMutex();

// Where one share lives: its name and its root directory (absolute, no
// trailing slash).
struct ShareLocation {
  std::string name;
  std::string path;
};

// Every share the platform knows, in the platform's order, under SDKMutex().
// Throws Error 502 "Cannot read shares: <cause>" (logged) when the platform's
// share list cannot be read.
ORVEX_EXPORT std::vector<ShareLocation> ListShareLocations();

class ORVEX_EXPORT SDKShare {
 public:
  // Opens the platform record of share_name (exact case) under SDKMutex().
  // Throws Error 800 with the share name as the reason (after logging the
  // failed check) when the share does not exist or its record cannot be read.
  explicit SDKShare(const std::string& share_name);

  // Opens share_name like the constructor, but a share that does not exist
  // is an answer, not a failure: returns null without logging. Any other
  // failure to read the record throws Error 800 as the constructor does.
  static std::unique_ptr<SDKShare> Find(const std::string& share_name);

  SDKShare(const SDKShare&) = delete;
  SDKShare& operator=(const SDKShare&) = delete;
  // Releases the record under SDKMutex().
  ~SDKShare();

  // The share name given at construction.
  const std::string& GetName() const { return name_; }

  // The share's root directory as the platform records it (absolute, no
  // trailing slash).
  std::string GetPath() const;

  // The share's hide-unreadable setting. Never throws.
  bool IsHideUnReadable() const;

  // Whether 100 MiB more fit at the share's location, under SDKMutex(). False
  // only when the platform definitely reports a lack of space or quota; any
  // other failure of the check answers true. Never throws.
  bool IsSpaceEnough() const;

  // The FTP privilege field of the share record. Never throws.
  int GetFTPPrivilege() const;

  // user's privilege on the share as the platform encodes it (read bit 0x1,
  // write bit 0x2); negative when the platform cannot tell. Never throws.
  int GetPrivilege(const std::string& user) const;

  // Whether the share is of the encrypted kind (mounted or not). Throws Error
  // 502 when the platform query fails.
  bool IsEncryption() const;

  // Whether the share keeps a recycle bin. Throws Error 502 when the platform
  // query fails.
  bool IsEnableRecycleBin() const;

  // The share's live event queue file. Throws Error 502 when the path cannot
  // be composed.
  std::string GetQueuePath() const;

  // The share's index database path. Throws Error 502 when the path cannot be
  // composed.
  std::string GetDBPath() const;

  // Whether the share may be indexed at all, under SDKMutex(): false for the
  // never-indexed shares ("surveillance", "NetBackup", exact case), for a
  // locked encrypted share and for a read-only share. Throws Error 502 when a
  // platform query fails.
  bool CanBeIndexed() const;

 private:
  // Takes ownership of an open record.
  SDKShare(KALOSHARE* share_info, const std::string& share_name);

  KALOSHARE* share_info_ = nullptr;  // owned, released by the destructor
  std::string name_;
};

}  // namespace sdk
}  // namespace orvex

#endif  // ORVEX_PLATFORM_SDK_SHARE_H_
