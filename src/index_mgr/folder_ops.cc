// The web API's folder operations: add, change, re-index, delete, list, get.
// The changing ones hold the folder lock from before they load the list
// until they return, save the list before touching anything else, and then
// start or stop per-share indexing and queue the events that make the
// indexing daemon (re)index or drop exactly the subtrees that changed.
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "foundation/check.h"
#include "index_mgr/folder_page.h"
#include "index_mgr/index_data.h"
#include "index_mgr/log_util.h"
#include "index_mgr/services.h"
#include "index_mgr/share_worker.h"
#include "orvex/config/folder_mgr.h"
#include "orvex/elastic.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/lock.h"
#include "orvex/foundation/util.h"
#include "orvex/index_mgr.h"
#include "orvex/platform/sdk_share.h"
#include "orvex/policy/custom_event.h"
#include "orvex/policy/indexability.h"
#include "orvex/policy/share_path.h"
#include "orvex/queue/event.h"
#include "orvex/status/status_mgr.h"
#include "platform/fixed_path.h"

namespace orvex {
namespace fileindex {
namespace {

using FolderPtr = FolderMgr::FolderPtr;

LockFile TakeFolderLock() {
  const std::string path = sdk::FixedPath(kFileIndexFoldersLockPath);
  MakeParentDirectories(path);
  return LockFile(path, /*exclusive=*/true);
}

// A newly added folder is indexed in full, whatever its parents held.
FolderPtr FullChange(const Folder& folder) {
  return std::make_shared<Folder>(folder.GetPath(), folder.GetName(), true, true, true, true,
                                  false);
}

void QueueConfigChanges(const std::vector<FolderPtr>& changes) {
  for (const FolderPtr& change : changes) {
    AddCustomEvent(EVENT_UPDATE_CFG, change->GetFullPath(), "", change->GetIndexCfg());
  }
}

// FolderAdd (create) and FolderSet are one operation.
void FolderSave(const Json::Value& folder_list, bool updater_mode, bool create) {
  const LockFile lock = TakeFolderLock();
  const FolderMgr folder_mgr_before;  // the list as it was: which shares are new
  FolderMgr folder_mgr;
  ORVEX_CHECK(!folder_list.isArray(), kErrorBadArgument, toString(folder_list));
  std::vector<FolderPtr> changes;
  std::set<std::string> shares;
  // Every check comes before the save: a request whose nth element fails
  // leaves the file as it was.
  for (const Json::Value& element : folder_list) {
    const FolderPtr folder_new = std::make_shared<Folder>(element);
    ORVEX_CHECK(!CanPathBeIndexed(folder_new->GetPath()) && !updater_mode, kErrorPathCannotIndex,
                "Path cannot index: " + folder_new->GetPath());
    ORVEX_CHECK(create && folder_mgr.HasFolder(folder_new->GetPath()), kErrorFolderExists,
                "Duplicated ID: " + folder_new->GetPath());
    FolderPtr change;
    folder_mgr.Upsert(change, folder_new);
    changes.push_back(create ? FullChange(*folder_new) : change);
    const sdk::SDKShare share(folder_new->GetShare());
    ORVEX_CHECK(!share.IsSpaceEnough(), kErrorNoSpace,
                "Share (" + folder_new->GetShare() + ") space not enough");
    shares.insert(folder_new->GetShare());
  }
  folder_mgr.Save();
  SetServicesEnabled(true);
  for (const std::string& share : shares) {
    if (create && !folder_mgr_before.IsShareIndexed(share)) elastic::ShareIndexCreate(share);
    NotifySettingChanged(share, /*is_upsert=*/true);
    UpsertShareWorker(share);
  }
  // The updater rewrites the list as it was: nothing to re-index.
  if (!updater_mode) QueueConfigChanges(changes);
}

// The share of a folder whose last folder went: nothing of its indexing may
// stay behind.
void DropShare(const std::string& share) {
  DeleteShareWorker(share);
  elastic::ShareIndexDelete(share);
  RemoveShareIndexData(share, sdk::SDKShare(share).GetPath());
}

}  // namespace

void FolderAdd(const Json::Value& folder_list, bool updater_mode) {
  FolderSave(folder_list, updater_mode, /*create=*/true);
}

void FolderSet(const Json::Value& folder_list, bool updater_mode) {
  FolderSave(folder_list, updater_mode, /*create=*/false);
}

void FolderReindex(const Json::Value& path_list) {
  StatusMgr status_mgr;
  const FolderMgr folder_mgr;
  ORVEX_CHECK(!path_list.isArray(), kErrorBadArgument, toString(path_list));
  std::set<std::string> shares;
  for (const Json::Value& it : path_list) {
    ORVEX_CHECK(!it.isString(), kErrorBadArgument, toString(it));
    const std::string path = it.asString();
    const std::string share = GetShareNameByPath(path);
    // A share without folders has no worker to re-index anything.
    if (!folder_mgr.IsShareIndexed(share)) continue;
    shares.insert(share);
    AddCustomEvent(EVENT_REINDEX, GetFullPath(path), "", Json::Value());
  }
  // The re-index asked for is what the flag was asking for.
  for (const std::string& share : shares) {
    if (status_mgr.GetShareStatus(share) & NeedReindex) {
      status_mgr.UnsetShareStatus(share, NeedReindex);
    }
  }
}

void FolderDelete(const Json::Value& path_list) {
  const LockFile lock = TakeFolderLock();
  FolderMgr folder_mgr;
  ORVEX_CHECK(!path_list.isArray(), kErrorBadArgument, toString(path_list));
  std::vector<FolderPtr> changes;
  std::set<std::string> shares;
  for (const Json::Value& it : path_list) {
    ORVEX_CHECK(!it.isString(), kErrorBadArgument, toString(it));
    const std::string path = it.asString();
    FolderPtr change;
    folder_mgr.Delete(change, path);
    changes.push_back(change);
    shares.insert(GetShareNameByPath(path));
  }
  folder_mgr.Save();
  QueueConfigChanges(changes);
  for (const std::string& share : shares) {
    NotifySettingChanged(share, /*is_upsert=*/false);
    if (!folder_mgr.IsShareIndexed(share)) {
      DropShare(share);
    } else {
      // The remaining folders of the share go on being watched.
      UpsertShareWorker(share);
    }
  }
  if (folder_mgr.GetFolders().empty()) SetServicesEnabled(false);
}

void FolderList(Json::Value& out, unsigned int offset, unsigned int limit,
                const std::string& sort_by, const std::string& sort_direction,
                const Json::Value& additional) {
  const FolderMgr folder_mgr;
  std::vector<FolderPtr> folders;
  unsigned int total = 0;
  folder_mgr.List(folders, total, offset, limit, sort_by, sort_direction);
  out = Json::Value(Json::objectValue);
  out["folder"] = Json::Value(Json::arrayValue);
  out["total"] = total;
  out["offset"] = offset;
  FolderPage page(folders);
  for (size_t i = 0; i < folders.size(); ++i) {
    out["folder"].append(page.GetDataWithAdditional(i, additional));
  }
}

void FolderGet(Json::Value& out, const std::string& path) {
  const FolderMgr folder_mgr;
  FolderPtr folder;
  folder_mgr.Get(folder, path);
  out = folder->GetData();
}

}  // namespace fileindex
}  // namespace orvex
