// Following a share when the platform changes it under the index: a rename,
// a move to another volume, a recycle bin to be looked at.
#include "foundation/check.h"
#include "index_mgr/log_util.h"
#include "orvex/config/folder_mgr.h"
#include "orvex/elastic.h"
#include "orvex/foundation/util.h"
#include "orvex/index_mgr.h"
#include "orvex/platform/sdk_share.h"
#include "orvex/policy/custom_event.h"
#include "orvex/policy/share_path.h"
#include "orvex/queue/event.h"

namespace orvex {
namespace fileindex {
namespace {

// Where the share stood before the platform renamed it where it is: the
// same directory, under the old name.
std::string FormerRoot(const std::string& new_root, const std::string& share_from) {
  return Dirname(new_root) + "/" + share_from;
}

}  // namespace

void ShareRename(const std::string& share_from, const std::string& share_to) {
  FolderMgr folder_mgr;
  ORVEX_CHECK(share_from.empty(), kErrorBadArgument, "Missing share_from");
  ORVEX_CHECK(share_to.empty(), kErrorBadArgument, "Missing share_to");
  for (const FolderMgr::FolderPtr& folder : folder_mgr.GetFolders()) {
    if (folder->GetShare() == share_from) folder->SetShare(share_to);
  }
  // Saved before the index is touched: a failed index rename leaves the
  // folders already under the new name, which is where the files are.
  folder_mgr.Save();
  elastic::ShareIndexRename(share_from, share_to, sdk::SDKShare(share_to).GetDBPath());
  // The documents keep their old paths until the daemon replays this rename
  // of the whole share root.
  const std::string path_old = FormerRoot(sdk::SDKShare(share_to).GetPath(), share_from);
  const std::string path = ReplacePathShare(path_old, share_to, share_from);
  AddCustomEvent(EVENT_RENAME, path, path_old, Json::Value());
}

void ShareMigrate(const std::string& share_name, const std::string& path_from,
                  const std::string& path_to) {
  ORVEX_CHECK(share_name.empty(), kErrorBadArgument, "Missing share_name");
  ORVEX_CHECK(path_from.empty(), kErrorBadArgument, "Missing path_from");
  ORVEX_CHECK(path_to.empty(), kErrorBadArgument, "Missing path_to");
  const FolderMgr folder_mgr;
  if (!folder_mgr.IsShareIndexed(share_name)) return;
  elastic::ShareIndexMigrate(share_name, sdk::SDKShare(share_name).GetDBPath());
  AddCustomEvent(EVENT_RENAME, path_to, path_from, Json::Value());
}

void ShareCheckRecycle(const std::string& share_name) {
  const sdk::SDKShare share(share_name);
  const std::string recycle_path = share.GetPath() + "/" + kRecycleBinName;
  AddCustomEvent(EVENT_REINDEX, recycle_path, "", Json::Value());
}

}  // namespace fileindex
}  // namespace orvex
