// A share's indexing worker: its queue registered with the file-change
// notification daemon (which then appends the share's events to the queue)
// and the indexing daemon's worker that drains it. Safe for concurrent use
// as far as the folders file and the registrations allow: the last writer
// of a share's registration wins.
#ifndef ORVEX_SRC_INDEX_MGR_SHARE_WORKER_H_
#define ORVEX_SRC_INDEX_MGR_SHARE_WORKER_H_

#include <json/json.h>

#include <string>

namespace orvex {
namespace fileindex {

// The registration of share's queue: {"queue": its queue path, "config":
// one {"path": full path, "mask": 65478, "ignore": ["@eaDir"]} per folder of
// the share, in folder-list order}. Loads the folder list. Throws its 504,
// Error 800 for an unknown share and 502 when the queue path cannot be
// composed.
Json::Value MonitorQueueDescription(const std::string& share);

// Registers (or re-registers with the current folder list) the share's
// queue. Throws as MonitorQueueDescription, and Error 502
// "MonitorQueue::Upsert failed, share=<share>" when registration fails.
void UpsertShareWorker(const std::string& share);

// Removes the registration of the share's queue. Throws Error 800 for an
// unknown share, 502 "MonitorQueue::Delete failed, share=<share>".
void DeleteShareWorker(const std::string& share);

// Sends "notify_setting_changed" {"share_name": share, "is_upsert":
// is_upsert} to the indexing daemon: start or refresh (true) or drop
// (false) its worker for share. Throws the daemon channel's Error 502.
void NotifySettingChanged(const std::string& share, bool is_upsert);

// Sends command ("worker_create" or "worker_delete") with {"share_name":
// share} to the indexing daemon. Throws the daemon channel's Error 502.
void SendWorkerCommand(const char* command, const std::string& share);

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_SRC_INDEX_MGR_SHARE_WORKER_H_
