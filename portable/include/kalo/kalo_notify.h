// Monitor queues of the file-change notification daemon (kalonotifyd): an
// application registers a queue file and the folders whose changes it wants
// appended to it, one line per change. On Linux a registration is one JSON
// file per queue under /var/lib/orvex/monitor/<app>/ (under ORVEX_ROOT),
// replaced whole and atomically; the daemon watches that directory and
// follows every change at once. doc/monitor_registry.md describes the files.
// Safe for concurrent use: calls share nothing but the files, and two
// writers of the same queue leave one of their files whole (the last wins).
// Who may include it: in the library, only the platform layer (src/platform/),
// the one door through which every subsystem reaches the platform, and the
// foundation beneath it; the programs and the tests may include it freely.
#ifndef KALO_KALO_NOTIFY_H_
#define KALO_KALO_NOTIFY_H_

#include <json/json.h>

#include <string>

namespace KALO {
namespace KALONOTIFYD {

// Whose queue a registration is. Only applications register on Linux.
enum MONITOR_QUEUE_TYPE {
  MONITOR_QUEUE_TYPE_APPLICATION = 1,
};

// The registrations' fixed directory, resolved under ORVEX_ROOT when used;
// each application has its own subdirectory.
constexpr char kMonitorRegistryDir[] = "/var/lib/orvex/monitor";
// What the daemon tells about itself (watched folders, watches, lines per
// queue), rewritten whole every few seconds and when it stops.
constexpr char kNotifyStatusPath[] = "/var/run/kalonotifyd.status.json";
constexpr char kNotifyPidPath[] = "/var/run/kalonotifyd.pid";

// One queue and its folders, as the description given to the constructor:
//   {"queue": "<absolute queue file>",
//    "config": [{"path": "<absolute folder>", "mask": <event bits>,
//                "ignore": ["<name>", ...]}, ...]}
class MonitorQueue {
 public:
  // Keeps a copy of description; it is checked only by Upsert.
  explicit MonitorQueue(const Json::Value& description);

  const Json::Value& description() const { return description_; }

  // Registers queue for app_name, replacing any registration of the same
  // queue path (so a new folder list takes the place of the old one), and
  // creates the application's directory when missing. Returns false, with
  // errno set and the reason in the system log, when: the type is not an
  // application (EINVAL); app_name is empty, ".", "..", longer than 64 bytes or
  // holds a byte other than letters, digits, '.', '_' and '-' (EINVAL); the
  // description is not an object whose "queue" is an absolute path and whose
  // "config" is an array of objects each with an absolute "path", a "mask"
  // from 0 to 4294967295 and an optional "ignore" array of non-empty names
  // without '/' (EINVAL); the file name the queue path maps to belongs to
  // another queue (EEXIST); or the file cannot be written (the system's
  // errno). The registration on disk is then unchanged.
  static bool Upsert(const MonitorQueue& queue, const std::string& app_name,
                     MONITOR_QUEUE_TYPE type);

  // Removes the registration of queue_path for app_name. A queue that is not
  // registered counts as removed (true): the caller's wish already holds.
  // Returns false with errno set, logged, for a bad type or app_name
  // (EINVAL), a registration file that names another queue (EEXIST), or an
  // unlink that fails.
  static bool Delete(const std::string& queue_path, const std::string& app_name,
                     MONITOR_QUEUE_TYPE type);

 private:
  Json::Value description_;
};

// The file that holds the registration of queue_path for app_name, under
// ORVEX_ROOT: "<registry>/<app>/<name>.json", where name is the queue path
// with every byte other than letters, digits, '.', '_', '-' and '@' written
// as %XX (so distinct paths give distinct names). A path whose escaped form
// would pass 200 bytes keeps its first 180 escaped bytes followed by '~' and
// 16 hex digits of a 64-bit hash of the whole path ('~' never appears
// unescaped otherwise, so the two forms cannot meet). Empty when app_name is
// not a valid application name.
std::string MonitorRegistrationPath(const std::string& queue_path, const std::string& app_name);

// True when name is a valid application name (see Upsert).
bool IsValidMonitorAppName(const std::string& name);

}  // namespace KALONOTIFYD
}  // namespace KALO

#endif  // KALO_KALO_NOTIFY_H_
