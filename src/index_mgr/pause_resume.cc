// Pausing and resuming shares and volumes, and forgetting those that are
// gone. Each touches the folder list, the indexing daemon, the share's queue
// registration and its search index in a fixed order: a pause silences the
// daemon first and the search engine last, a resume wakes the search engine
// first, so the daemon never works against a paused index.
#include <set>
#include <string>

#include "foundation/check.h"
#include "index_mgr/index_data.h"
#include "index_mgr/log_util.h"
#include "index_mgr/services.h"
#include "index_mgr/share_worker.h"
#include "orvex/config/folder_mgr.h"
#include "orvex/elastic.h"
#include "orvex/foundation/util.h"
#include "orvex/index_mgr.h"
#include "orvex/status/status_mgr.h"

namespace orvex {
namespace fileindex {
namespace {

constexpr char kWorkerCreate[] = "worker_create";
constexpr char kWorkerDelete[] = "worker_delete";

void SetSharePaused(FolderMgr& folder_mgr, const std::string& share_name, bool paused) {
  for (const FolderMgr::FolderPtr& folder : folder_mgr.GetFolders()) {
    if (folder->GetShare() == share_name) folder->SetPaused(paused);
  }
  folder_mgr.Save();
}

// A plain prefix test, kept so on purpose: /volume1 also takes the folders
// of /volume10. Callers rely on the volume's own mount point.
bool OnVolume(const Folder& folder, const std::string& mount_point) {
  return StringStartWith(folder.GetFullPath(), mount_point);
}

// Flags (or unflags) the folders on the volume whose flag differs, and
// returns their shares in name order.
std::set<std::string> SetVolumePaused(FolderMgr& folder_mgr, const std::string& mount_point,
                                      bool paused) {
  std::set<std::string> shares;
  for (const FolderMgr::FolderPtr& folder : folder_mgr.GetFolders()) {
    if (folder->IsPaused() != paused && OnVolume(*folder, mount_point)) {
      folder->SetPaused(paused);
      shares.insert(folder->GetShare());
    }
  }
  return shares;
}

}  // namespace

void SharePause(const std::string& share_name) {
  ORVEX_CHECK(share_name.empty(), kErrorBadArgument, "Missing share name");
  FolderMgr folder_mgr;
  if (!folder_mgr.IsShareIndexed(share_name)) return;
  SendWorkerCommand(kWorkerDelete, share_name);
  DeleteShareWorker(share_name);
  elastic::ShareIndexPause(share_name);
  SetSharePaused(folder_mgr, share_name, /*paused=*/true);
}

void ShareResume(const std::string& share_name) {
  ORVEX_CHECK(share_name.empty(), kErrorBadArgument, "Missing share name");
  FolderMgr folder_mgr;
  if (!folder_mgr.IsShareIndexed(share_name)) return;
  elastic::ShareIndexResume(share_name);
  UpsertShareWorker(share_name);
  SendWorkerCommand(kWorkerCreate, share_name);
  SetSharePaused(folder_mgr, share_name, /*paused=*/false);
}

void ShareClearPaused(const std::string& share_name, const std::string& share_path) {
  ORVEX_CHECK(share_name.empty(), kErrorBadArgument, "Missing share name");
  ORVEX_CHECK(share_path.empty(), kErrorBadArgument, "Missing share path");
  FolderMgr folder_mgr;
  RemoveShareIndexData(share_name, share_path);
  elastic::ShareIndexDelete(share_name);
  folder_mgr.DeleteByShare(share_name);
  folder_mgr.Save();
  if (folder_mgr.GetFolders().empty()) SetServicesEnabled(false);
}

void VolumePause(const std::string& mount_point) {
  ORVEX_CHECK(mount_point.empty(), kErrorBadArgument, "Missing mount point");
  FolderMgr folder_mgr;
  const std::set<std::string> shares = SetVolumePaused(folder_mgr, mount_point, true);
  folder_mgr.Save();
  for (const std::string& share : shares) {
    SendWorkerCommand(kWorkerDelete, share);
    DeleteShareWorker(share);
    elastic::ShareIndexPause(share);
  }
}

void VolumeResume(const std::string& mount_point) {
  ORVEX_CHECK(mount_point.empty(), kErrorBadArgument, "Missing mount point");
  FolderMgr folder_mgr;
  const std::set<std::string> shares = SetVolumePaused(folder_mgr, mount_point, false);
  folder_mgr.Save();
  // The daemon hears of the share before its queue is registered, unlike
  // ShareResume; both orders are kept as they have always been.
  for (const std::string& share : shares) {
    elastic::ShareIndexResume(share);
    SendWorkerCommand(kWorkerCreate, share);
    UpsertShareWorker(share);
  }
}

void VolumeClearPaused(const std::string& mount_point) {
  ORVEX_CHECK(mount_point.empty(), kErrorBadArgument, "Missing mount point");
  FolderMgr folder_mgr;
  StatusMgr status_mgr;
  std::set<std::string> shares;
  for (const FolderMgr::FolderPtr& folder : folder_mgr.GetFolders()) {
    if (OnVolume(*folder, mount_point)) shares.insert(folder->GetShare());
  }
  // The search indexes stay: the volume may come back.
  for (const std::string& share : shares) {
    status_mgr.ClearShareStatus(share);
    folder_mgr.DeleteByShare(share);
  }
  folder_mgr.Save();
  if (folder_mgr.GetFolders().empty()) SetServicesEnabled(false);
}

}  // namespace fileindex
}  // namespace orvex
