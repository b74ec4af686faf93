#include "orvex/status/status_mgr.h"

#include <sys/stat.h>
#include <sys/types.h>

#include <cerrno>
#include <cstring>
#include <string>

#include "foundation/check.h"
#include "foundation/state_file.h"
#include "orvex/communication.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/lock.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/foundation/util.h"
#include "orvex/platform/sdk_credentials.h"
#include "platform/fixed_path.h"

namespace orvex {
namespace fileindex {
namespace {

constexpr char kLogSource[] = "status_mgr";

constexpr char kResumeTimeKey[] = "resume_time";
constexpr char kShareKey[] = "share";
constexpr uint32_t kSecondsPerHour = 3600;

std::string StatusPath() { return sdk::FixedPath(kFileIndexStatusCfgPath); }

const Json::Value* FindMember(const Json::Value& object, const char* key) {
  return object.find(key, key + std::strlen(key));
}

// Every change holds the status lock exclusively, as the folder
// configuration's writers hold theirs. Under a fresh ORVEX_ROOT its "tmp"
// directory may be missing too.
LockFile TakeStatusLock() {
  const std::string path = sdk::FixedPath(kFileIndexStatusLockPath);
  MakeParentDirectories(path);
  return LockFile(path, /*exclusive=*/true);
}

}  // namespace

StatusMgr::StatusMgr() {
  const std::string path = StatusPath();
  const std::string not_a_file = NotARegularFile(path);
  ORVEX_CHECK(!not_a_file.empty(), kErrorLoadJson, "Cannot load json: " + path + not_a_file);
  ORVEX_CHECK_AS(IsFileExist(path) && !fromFile(data_, path),
                 "IsFileExist(kFileIndexStatusCfgPath) && !data_.fromFile(kFileIndexStatusCfgPath)",
                 kErrorLoadJson, "Cannot load json: " + path);
  // Valid JSON that is not a record (an array, a number) is as unusable as
  // text that does not parse.
  ORVEX_CHECK(!data_.isNull() && !data_.isObject(), kErrorLoadJson, "Cannot load json: " + path);
  if (data_.isNull()) data_ = Json::Value(Json::objectValue);
}

StatusMgr::~StatusMgr() = default;

int64_t StatusMgr::GetPauseInfo() const {
  long long resume_time = kResumeTimeRunning;
  GetJsonValue(resume_time, data_, kResumeTimeKey, /*required=*/false);
  return resume_time;
}

int StatusMgr::GetShareStatus(const std::string& share) const {
  const Json::Value* shares = FindMember(data_, kShareKey);
  if (shares == nullptr) return 0;
  unsigned int flags = 0;
  GetJsonValue(flags, *shares, share, /*required=*/false);
  return static_cast<int>(flags);
}

std::map<std::string, int> StatusMgr::GetAllShareStatus() const {
  std::map<std::string, int> all;
  const Json::Value* shares = FindMember(data_, kShareKey);
  if (shares == nullptr) return all;
  if (!shares->isObject()) throw Error(kErrorBadArgument, "Not an object" + AppendData(*shares));
  for (const std::string& name : shares->getMemberNames()) all[name] = GetShareStatus(name);
  return all;
}

int64_t StatusMgr::ResumeTimeFor(int hours, time_t now) {
  if (hours == 0) return kResumeTimeNoEnd;
  // The NAS computes this with a 32-bit time_t; unsigned arithmetic gives the
  // same wrapped bits without signed overflow.
  const uint32_t end = static_cast<uint32_t>(now) + kSecondsPerHour * static_cast<uint32_t>(hours);
  return static_cast<int32_t>(end);
}

void StatusMgr::Pause(int hours) {
  LockFile lock = TakeStatusLock();
  ORVEX_CHECK_AS(hours < 0, "0 > hours", kErrorBadArgument, "Pause length should NOT be negative");
  const int64_t resume_time = ResumeTimeFor(hours, Now());
  data_[kResumeTimeKey] = static_cast<Json::Int64>(resume_time);
  Save();
  Json::Value data(Json::objectValue);
  data[kResumeTimeKey] = static_cast<Json::Int64>(resume_time);
  SendCommandToDaemon("pause", data);
}

void StatusMgr::Resume() {
  LockFile lock = TakeStatusLock();
  data_[kResumeTimeKey] = static_cast<Json::Int64>(kResumeTimeRunning);
  Save();
  SendCommandToDaemon("resume", Json::Value());
}

void StatusMgr::SetShareStatus(const std::string& share, ShareStatus flag) {
  UpdateShareFlags(share, flag, 0);
}

void StatusMgr::UnsetShareStatus(const std::string& share, ShareStatus flag) {
  UpdateShareFlags(share, 0, flag);
}

void StatusMgr::UpdateShareFlags(const std::string& share, unsigned int set, unsigned int clear) {
  LockFile lock = TakeStatusLock();
  // Read first: a malformed "share" member throws here, before anything is
  // written into it.
  const unsigned int current = static_cast<unsigned int>(GetShareStatus(share));
  data_[kShareKey][share] = static_cast<Json::UInt>((current | set) & ~clear);
  Save();
}

void StatusMgr::ClearShareStatus(const std::string& share) {
  LockFile lock = TakeStatusLock();
  if (data_.isMember(kShareKey) && data_[kShareKey].isObject()) {
    data_[kShareKey].removeMember(share);
  }
  Save();
}

void StatusMgr::Save() {
  sdk::SDKCredentials creds("root");
  const std::string path = StatusPath();
  MakeParentDirectories(path);
  ORVEX_CHECK_AS(!toFile(data_, path), "!data_.toFile(kFileIndexStatusCfgPath)", kErrorSaveJson,
                 "Failed to save json: " + path);
  ORVEX_CHECK_AS(-1 == ::chmod(path.c_str(), 0644), "-1 == chmod(kFileIndexStatusCfgPath, 0644)",
                 kErrorSystem, std::string("chmod failed, reason=") + std::strerror(errno));
}

}  // namespace fileindex
}  // namespace orvex
