#include "index_mgr/share_worker.h"

#include "foundation/check.h"
#include "index_mgr/log_util.h"
#include "orvex/communication.h"
#include "orvex/config/folder_mgr.h"
#include "orvex/index_mgr.h"
#include "orvex/platform/sdk_share.h"
#include "platform/monitor_queue.h"

namespace orvex {
namespace fileindex {
namespace {

// The platform's per-directory metadata folders hold the queue itself and
// thumbnails: watching them would feed the queue its own writes.
constexpr char kMetadataDirName[] = "@eaDir";

Json::Value FolderWatch(const Folder& folder) {
  Json::Value entry(Json::objectValue);
  entry["path"] = folder.GetFullPath();
  entry["mask"] = kMonitorMask;
  entry["ignore"] = Json::Value(Json::arrayValue);
  entry["ignore"].append(kMetadataDirName);
  return entry;
}

}  // namespace

Json::Value MonitorQueueDescription(const std::string& share) {
  const FolderMgr folder_mgr;
  const sdk::SDKShare share_info(share);
  Json::Value description(Json::objectValue);
  description["queue"] = share_info.GetQueuePath();
  description["config"] = Json::Value(Json::arrayValue);
  for (const FolderMgr::FolderPtr& folder : folder_mgr.GetFolders()) {
    if (folder->GetShare() == share) description["config"].append(FolderWatch(*folder));
  }
  return description;
}

void UpsertShareWorker(const std::string& share) {
  const Json::Value monitor_queue = MonitorQueueDescription(share);
  ORVEX_CHECK_AS(!sdk::UpsertMonitorQueue(monitor_queue, kAppName),
                 "!MonitorQueue::Upsert(monitor_queue, kAppName, MONITOR_QUEUE_TYPE_APPLICATION)",
                 kErrorSystem, "MonitorQueue::Upsert failed, share=" + share);
}

void DeleteShareWorker(const std::string& share_name) {
  const sdk::SDKShare share(share_name);
  ORVEX_CHECK_AS(!sdk::DeleteMonitorQueue(share.GetQueuePath(), kAppName),
                 "!MonitorQueue::Delete(share.GetQueuePath(), kAppName, "
                 "MONITOR_QUEUE_TYPE_APPLICATION)",
                 kErrorSystem, "MonitorQueue::Delete failed, share=" + share_name);
}

void NotifySettingChanged(const std::string& share, bool is_upsert) {
  Json::Value data(Json::objectValue);
  data["share_name"] = share;
  data["is_upsert"] = is_upsert;
  SendCommandToDaemon("notify_setting_changed", data);
}

void SendWorkerCommand(const char* command, const std::string& share) {
  Json::Value data(Json::objectValue);
  data["share_name"] = share;
  SendCommandToDaemon(command, data);
}

}  // namespace fileindex
}  // namespace orvex
