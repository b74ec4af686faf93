// StatusMgr: the indexing service's small persistent state, shared by the
// indexing daemon and the web API through one JSON file: whether indexing as
// a whole is paused and until when, and a set of status flags per share.
// Pausing and resuming also tell the running daemon at once. An instance is
// used by one thread at a time; changes between processes and threads are
// serialised by the status lock file, but each instance loads the file once,
// so of two instances made at the same time the last Save wins.
#ifndef ORVEX_STATUS_STATUS_MGR_H_
#define ORVEX_STATUS_STATUS_MGR_H_

#include <json/json.h>

#include <cstdint>
#include <ctime>
#include <map>
#include <string>

#include "orvex/export.h"

namespace orvex {
namespace fileindex {

// The status file: {"resume_time": <int64>, "share": {<name>: <flags>}},
// both members optional. Opened under ORVEX_ROOT when that is set.
inline constexpr char kFileIndexStatusCfgPath[] = "/var/packages/Orvex/etc/fileindex.status";
// Taken exclusively around every change of the status file.
inline constexpr char kFileIndexStatusLockPath[] = "/tmp/orvex_cfg_fi_status.lock";

// Values of "resume_time" with a meaning of their own; any other value is the
// time (seconds since the epoch) until which indexing is paused.
inline constexpr int64_t kResumeTimeRunning = -1;
inline constexpr int64_t kResumeTimeNoEnd = 0;

// Per-share status flags, an integer bit set combined with bitwise or.
enum ShareStatus : unsigned int {
  // The share's index may have missed changes and must be rebuilt.
  NeedReindex = 1,
};

class ORVEX_EXPORT StatusMgr {
 public:
  // Loads the status file, without taking the lock; a missing file reads as
  // an empty record. Throws Error 504 "Cannot load json: <path>" (logged)
  // when the file exists but does not hold a JSON object.
  StatusMgr();
  StatusMgr(const StatusMgr&) = delete;
  StatusMgr& operator=(const StatusMgr&) = delete;
  ~StatusMgr();

  // "resume_time" as loaded: kResumeTimeRunning (also when absent),
  // kResumeTimeNoEnd, or the end of the pause. Whether a time in the past
  // still means "paused" is the caller's decision. Throws Error 120 when the
  // member is not an integer.
  int64_t GetPauseInfo() const;

  // The share's flags, 0 when it has no entry. Throws Error 120 when "share"
  // is not an object or the share's value is not an unsigned integer.
  int GetShareStatus(const std::string& share) const;

  // Every share with an entry (flags 0 included), by name.
  std::map<std::string, int> GetAllShareStatus() const;

  // Pauses indexing: for `hours` hours from now, or with no end when hours is
  // 0. Under the lock, stores the new "resume_time", saves, then sends
  // "pause" {"resume_time": T} to the indexing daemon. Throws Error 120
  // "Pause length should NOT be negative" (nothing changed), 506 when the
  // lock cannot be taken, the errors of Save, and the daemon channel's
  // Error 502 — the file is then already saved although the daemon was not
  // told.
  void Pause(int hours);

  // Resumes indexing: under the lock stores kResumeTimeRunning, saves, then
  // sends "resume" with null data to the daemon. Throws as Pause.
  void Resume();

  // Under the lock, sets (or clears) the bits of flag in the share's entry,
  // creating it, and saves. A share whose flags drop to 0 keeps its entry.
  // Throws Error 506 for the lock, 120 as GetShareStatus, and the errors of
  // Save.
  void SetShareStatus(const std::string& share, ShareStatus flag);
  void UnsetShareStatus(const std::string& share, ShareStatus flag);

  // Under the lock, removes the share's entry and saves. Throws as
  // SetShareStatus.
  void ClearShareStatus(const std::string& share);

  // Writes the whole record to the status file, as root, by atomic
  // replacement with mode 0644, creating missing parent directories.
  // Throws Error 503 when the switch to root fails, 505 "Failed to save
  // json: <path>" when writing fails (the old file is then intact) and 502
  // "chmod failed, reason=<text>" when the mode cannot be set.
  void Save();

  // The "resume_time" that Pause(hours) stores at time now: 0 for 0 hours,
  // else now + 3600 * hours computed in 32 bits (as on the 32-bit NAS, so
  // a time past 2038 wraps) and widened with its sign. hours must not be
  // negative.
  static int64_t ResumeTimeFor(int hours, time_t now);

 private:
  void UpdateShareFlags(const std::string& share, unsigned int set, unsigned int clear);

  Json::Value data_;
};

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_STATUS_STATUS_MGR_H_
