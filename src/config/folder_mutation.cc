// Changes to the in-memory folder list, each with the report of which file
// types change their indexing state in the folder's subtree, so that the
// caller re-indexes or drops exactly those. Nothing here saves.
#include <algorithm>
#include <string>

#include "foundation/check.h"
#include "orvex/config/folder_mgr.h"
#include "orvex/foundation/error.h"
#include "orvex/policy/share_path.h"

namespace orvex {
namespace fileindex {
namespace {

constexpr char kLogSource[] = "folder_mgr";

using FolderPtr = FolderMgr::FolderPtr;

}  // namespace

FolderPtr FolderMgr::DiffCfg(FolderPtr subject, FolderPtr other) {
  if (!other) {
    return std::make_shared<Folder>(subject->GetPath(), subject->GetName(), true, true, true, true,
                                    /*paused=*/false);
  }
  return std::make_shared<Folder>(
      subject->GetPath(), subject->GetName(), subject->IsDocument() != other->IsDocument(),
      subject->IsAudio() != other->IsAudio(), subject->IsVideo() != other->IsVideo(),
      subject->IsPhoto() != other->IsPhoto(), /*paused=*/false);
}

void FolderMgr::Upsert(FolderPtr& change, FolderPtr folder) {
  // Taken before anything changes: the folder's old record when it has one,
  // else the deepest folder that contains it.
  const FolderPtr before = GetMostSuitableCfg(folder->CachedFullPath());
  change = DiffCfg(folder, before);
  RemoveByPath(folder->GetPath());
  folders_.push_back(std::move(folder));
  // Checked after the append, so the new entry counts; the caller must not
  // save the oversized list, so the file never holds more than the limit.
  ORVEX_CHECK(folders_.size() > kFileIndexFoldersMax, kErrorTooManyFolders,
              "Too many folders, max=" + std::to_string(kFileIndexFoldersMax));
}

void FolderMgr::Delete(FolderPtr& change, const std::string& path) {
  const std::string full = GetFullPath(path);
  const FolderPtr before = GetMostSuitableCfg(full);
  // No folder governs the path: there is nothing to remove and no record to
  // report on.
  ORVEX_CHECK(!before, kErrorNoFolder, path);
  RemoveByPath(path);
  const FolderPtr after = GetMostSuitableCfg(full);
  change = DiffCfg(before, after);
}

void FolderMgr::DeleteByShare(const std::string& share) {
  folders_.erase(
      std::remove_if(folders_.begin(), folders_.end(),
                     [&share](const FolderPtr& folder) { return folder->GetShare() == share; }),
      folders_.end());
}

void FolderMgr::RemoveByPath(const std::string& path) {
  folders_.erase(
      std::remove_if(folders_.begin(), folders_.end(),
                     [&path](const FolderPtr& folder) { return folder->GetPath() == path; }),
      folders_.end());
}

}  // namespace fileindex
}  // namespace orvex
