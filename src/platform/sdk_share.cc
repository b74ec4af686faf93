#include "orvex/platform/sdk_share.h"

#include <sys/types.h>

#include <algorithm>
#include <exception>
#include <iterator>

#include "foundation/check.h"
#include "kalo/kalo_error.h"
#include "kalo/kalo_path.h"
#include "kalo/kalo_quota.h"
#include "kalo/kalo_share.h"
#include "orvex/portable/share_registry.h"

namespace orvex {
namespace sdk {
namespace {

constexpr char kLogSource[] = "share";

// Shares of other packages that keep their own data: never indexed. The
// comparison is exact, so "Surveillance" is judged like any other share.
constexpr const char* kNeverIndexedShares[] = {"surveillance", "NetBackup"};

// Free space asked of the quota check before indexing: 100 MiB.
constexpr unsigned long long kSpaceNeeded = 0x6400000ULL;

// Room for any composed path: the share root is at most 4095 bytes and the
// kernel refuses longer paths anyway.
constexpr size_t kPathBufferSize = 4096;

bool IsNeverIndexed(const std::string& name) {
  return std::any_of(std::begin(kNeverIndexedShares), std::end(kNeverIndexedShares),
                     [&name](const char* listed) { return name == listed; });
}

}  // namespace

Mutex& SDKMutex() {
  // Never destroyed: a share object may be released from a static destructor
  // after this function's own statics would be gone.
  static Mutex* mutex = new Mutex();
  return *mutex;
}

SDKShare::SDKShare(const std::string& share_name) : name_(share_name) {
  LockMutex lock(SDKMutex());
  ORVEX_CHECK(0 > KALOShareGet(share_name.c_str(), &share_info_) || !share_info_, kErrorNoShare,
              share_name);
}

SDKShare::SDKShare(KALOSHARE* share_info, const std::string& share_name)
    : share_info_(share_info), name_(share_name) {}

std::unique_ptr<SDKShare> SDKShare::Find(const std::string& share_name) {
  LockMutex lock(SDKMutex());
  PKALOSHARE info = nullptr;
  KLIBCErrClear();
  if (0 > KALOShareGet(share_name.c_str(), &info) || !info) {
    ORVEX_CHECK_AS(KLIBCErrGet() != KLIB_ERR_NO_SUCH_SHARE,
                   "0 > KALOShareGet(share_name.c_str(), &info) || !info", kErrorNoShare,
                   share_name);
    return nullptr;
  }
  return std::unique_ptr<SDKShare>(new SDKShare(info, share_name));
}

std::vector<ShareLocation> ListShareLocations() {
  LockMutex lock(SDKMutex());
  std::string problem;
  try {
    std::vector<ShareLocation> locations;
    for (portable::ShareRecord& share : portable::LoadShares()) {
      locations.push_back({std::move(share.name), std::move(share.path)});
    }
    return locations;
  } catch (const std::exception& e) {
    problem = e.what();
  }
  ORVEX_CHECK_AS(true, "!LoadShares()", kErrorSystem, "Cannot read shares: " + problem);
  return {};
}

SDKShare::~SDKShare() {
  LockMutex lock(SDKMutex());
  KALOShareFree(share_info_);
}

std::string SDKShare::GetPath() const { return share_info_->szPath; }

bool SDKShare::IsHideUnReadable() const { return KLIBShareHideUnreadableGet(share_info_); }

bool SDKShare::IsSpaceEnough() const {
  LockMutex lock(SDKMutex());
  // A stale last error from an earlier call must not pass for this check's.
  KLIBCErrClear();
  if (KALOQuotaIsEnough(0, share_info_->szPath, kSpaceNeeded, 0) > 0) return true;
  // Only a definite lack of space stops indexing; a check that could not be
  // made at all lets it go on.
  const int error = KLIBCErrGet();
  return error != KLIB_ERR_QUOTA_EXCEEDED && error != KLIB_ERR_OUT_OF_SPACE;
}

int SDKShare::GetFTPPrivilege() const { return share_info_->nFTPPrivilege; }

int SDKShare::GetPrivilege(const std::string& user) const {
  return KALOShareUserPrivGet(user.c_str(), share_info_);
}

bool SDKShare::IsEncryption() const {
  bool is_encryption = false;
  ORVEX_CHECK(0 > KLIBShareIsEncryptionGet(share_info_, &is_encryption), kErrorSystem,
              "KLIBShareIsEncryptionGet failed, share=" + name_);
  return is_encryption;
}

bool SDKShare::IsEnableRecycleBin() const {
  bool is_enabled = false;
  ORVEX_CHECK(0 > KLIBShareRecycleStatusGet(share_info_, &is_enabled), kErrorSystem,
              "KLIBShareRecycleStatusGet failed, share=" + name_);
  return is_enabled;
}

std::string SDKShare::GetQueuePath() const {
  char path[kPathBufferSize] = {};
  ORVEX_CHECK(0 > FILEIDXQueuePathCompose(share_info_->szPath, path, sizeof(path)), kErrorSystem,
              "FILEIDXQueuePathCompose failed, share=" + name_);
  return path;
}

std::string SDKShare::GetDBPath() const {
  char path[kPathBufferSize] = {};
  ORVEX_CHECK(0 > FILEIDXDBPathCompose(share_info_->szPath, path, sizeof(path)), kErrorSystem,
              "FILEIDXDBPathCompose failed, share=" + name_);
  return path;
}

bool SDKShare::CanBeIndexed() const {
  LockMutex lock(SDKMutex());
  if (IsNeverIndexed(name_)) return false;
  bool is_encrypted = false;
  // The message names the query differently from the function; it is the
  // text operators know, so it stays as it is.
  ORVEX_CHECK(0 > KLIBShareIsEncryptedGet(share_info_, &is_encrypted), kErrorSystem,
              "KLIBShareis_encryptedGet failed, share=" + name_);
  bool is_readonly = false;
  ORVEX_CHECK(0 > KLIBShareIsReadOnlyGet(share_info_, &is_readonly), kErrorSystem,
              "KLIBShareis_readonlyGet failed, share=" + name_);
  return !is_encrypted && !is_readonly;
}

}  // namespace sdk
}  // namespace orvex
