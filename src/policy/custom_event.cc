#include "orvex/policy/custom_event.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <fstream>
#include <string>
#include <vector>

#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/lock.h"
#include "orvex/foundation/log.h"
#include "orvex/foundation/util.h"
#include "orvex/platform/sdk_share.h"
#include "orvex/policy/share_path.h"
#include "orvex/queue/queue_mgr.h"
#include "orvex/status/status_mgr.h"
#include "platform/fixed_path.h"
#include "platform/platform_error.h"
#include "platform/program.h"

namespace orvex {
namespace fileindex {
namespace {

constexpr char kLogSource[] = "util";
constexpr char kNotifyApp[] = "KALO.Orvex.Application";
constexpr char kNotifyTarget[] = "@administrators";
constexpr char kKeyDisplayName[] = "app:displayname";
constexpr char kKeyNoSpace[] = "error:index_no_space";
constexpr char kKeyLackOfMemory[] = "error:lack_of_memory";
constexpr char kLinkOpen[] =
    "<a data-kalo-app=\"KALO.Orvex.Application\" data-kalo-fn=\"preference\">";
constexpr char kLinkClose[] = "</a>";

int Pid() { return static_cast<int>(::getpid()); }
unsigned Euid() { return static_cast<unsigned>(::geteuid()); }

// Creates the directories between the share root and the queue file
// (<share>/@eaDir/@fileindex) that a fresh share lacks. The share root itself
// is never created here. Failures are left to the lock, which then reports
// the open that fails.
void MakeQueueDir(const std::string& share_root, const std::string& queue_path) {
  // Only below a share that exists: never make up a share root.
  if (IsDirExist(share_root, /*follow_link=*/true)) MakeParentDirectories(queue_path);
}

// One compact line: the daemon's format without "is_dir", which only the
// create and delete bits consult and custom events never carry.
std::string CustomEventLine(int event, const std::string& path, const std::string& path_old,
                            const Json::Value& data) {
  Json::Value obj(Json::objectValue);
  obj["event"] = event;
  obj["path"] = path;
  obj["path_old"] = path_old;
  obj["data"] = data;
  std::string line = toString(obj);
  line.push_back('\n');
  return line;
}

// Steps that name the share: every Error thrown here leaves the share
// marked for a re-index by the caller.
void AppendToShareQueue(const std::string& share_name, int event, const std::string& path,
                        const std::string& path_old, const Json::Value& data) {
  const sdk::SDKShare share(share_name);
  const std::string queue_path = share.GetQueuePath();
  QueueMgr queue(queue_path);
  // A waiting re-index of the path or an ancestor redoes everything below
  // it, whatever kind of event this one is.
  if (queue.IsFullPathHasReindex(path)) return;
  MakeQueueDir(share.GetPath(), queue_path);
  const LockFile lock(queue_path, /*exclusive=*/true);
  const std::string line = CustomEventLine(event, path, path_old, data);
  // One write of the whole line: appends never interleave inside a line.
  // A queue that cannot be opened loses the line without a word; that is
  // what the consumer side expects of every producer.
  std::ofstream out(queue_path, std::ios::out | std::ios::app | std::ios::binary);
  out.write(line.data(), static_cast<std::streamsize>(line.size()));
  out.flush();
}

// Leaves the share marked so that the lost event is made up by a full
// re-index. A failure to mark is logged; the original error still wins.
void MarkNeedReindex(const std::string& share_name) {
  try {
    StatusMgr().SetShareStatus(share_name, NeedReindex);
  } catch (const Error& e) {
    LogErrno("%s:%d (%d, %u) SetShareStatus failed, code=%d, reason=%s", kLogSource, __LINE__,
             Pid(), Euid(), static_cast<int>(e.code()), e.reason().c_str());
  }
}

// Runs the notification tool with args and waits; only a tool that cannot be
// run at all is logged.
void RunNotifyTool(const std::vector<std::string>& args) {
  const std::string tool = sdk::FixedPath(kPMXNotifyPath);
  sdk::ClearPlatformError();
  if (sdk::RunProgram(tool, args) < 0) {
    LogPlain("%s:%d (%d, %u) KLIBCExecl failed: %s", kLogSource, __LINE__, Pid(), Euid(),
             sdk::PlatformErrorText().c_str());
  }
  errno = 0;
}

}  // namespace

void AddCustomEvent(int event, const std::string& path, const std::string& path_old,
                    const Json::Value& data) {
  // Until the share is known there is nothing to mark: a path outside every
  // share fails as it stands.
  std::string share_name;
  std::string share_path;
  GetShareNamePathByFullPath(path, share_name, share_path);
  try {
    AppendToShareQueue(share_name, event, path, path_old, data);
  } catch (const Error& e) {
    LogErrno("%s:%d (%d, %u) AddCustomEvent failed, code=%d, reason=%s. Set [%s] need reindex",
             kLogSource, __LINE__, Pid(), Euid(), static_cast<int>(e.code()), e.reason().c_str(),
             share_name.c_str());
    MarkNeedReindex(share_name);
    throw;
  }
}

void SendPMXNotify() {
  RunNotifyTool({"-c", kNotifyApp, "-b", "true", "-e", "false", kNotifyTarget, kKeyDisplayName,
                 kKeyNoSpace, kLinkOpen, kLinkClose});
}

void NotifyLackOfMemory() {
  RunNotifyTool({"-c", kNotifyApp, kNotifyTarget, kKeyDisplayName, kKeyLackOfMemory});
}

}  // namespace fileindex
}  // namespace orvex
