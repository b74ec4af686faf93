// The read-only questions asked of the folder list: which folder governs a
// file, whether a path or share is indexed, and the web API's paged listing.
#include <algorithm>
#include <functional>

#include "foundation/check.h"
#include "foundation/path_prefix.h"
#include "orvex/config/folder_mgr.h"
#include "orvex/foundation/error.h"
#include "orvex/policy/file_type.h"
#include "platform/text_compare.h"

namespace orvex {
namespace fileindex {
namespace {

constexpr char kLogSource[] = "folder_mgr";

using FolderPtr = FolderMgr::FolderPtr;
using Comparator = std::function<bool(const FolderPtr&, const FolderPtr&)>;

bool FlagOffFirst(bool (Folder::*flag)() const, const FolderPtr& a, const FolderPtr& b) {
  return !((*a).*flag)() && ((*b).*flag)();
}

bool TextBefore(const std::string& a, const std::string& b) {
  return sdk::CompareIgnoringCase(a, b) < 0;
}

Comparator ComparatorFor(const std::string& sort_by) {
  using std::placeholders::_1;
  using std::placeholders::_2;
  if (sort_by == "document") return std::bind(FlagOffFirst, &Folder::IsDocument, _1, _2);
  if (sort_by == "audio") return std::bind(FlagOffFirst, &Folder::IsAudio, _1, _2);
  if (sort_by == "video") return std::bind(FlagOffFirst, &Folder::IsVideo, _1, _2);
  if (sort_by == "photo") return std::bind(FlagOffFirst, &Folder::IsPhoto, _1, _2);
  if (sort_by == "path") {
    return [](const FolderPtr& a, const FolderPtr& b) {
      return TextBefore(a->GetPath(), b->GetPath());
    };
  }
  return
      [](const FolderPtr& a, const FolderPtr& b) { return TextBefore(a->GetName(), b->GetName()); };
}

}  // namespace

void FolderMgr::Get(FolderPtr& out, const std::string& path) const {
  auto it = std::find_if(folders_.begin(), folders_.end(),
                         [&path](const FolderPtr& folder) { return folder->GetPath() == path; });
  ORVEX_CHECK(it == folders_.end(), kErrorNoFolder, path);
  out = *it;
}

bool FolderMgr::HasFolder(const std::string& path) const {
  return std::any_of(folders_.begin(), folders_.end(),
                     [&path](const FolderPtr& folder) { return folder->GetPath() == path; });
}

FolderPtr FolderMgr::GetMostSuitableCfg(const std::string& full_path) const {
  FolderPtr best;
  size_t best_length = 0;
  for (const FolderPtr& folder : folders_) {
    const std::string& folder_full = folder->CachedFullPath();
    // Strictly longer: of two folders with the same full path (duplicates)
    // the earlier one keeps governing.
    if (folder_full.size() > best_length && IsSameOrBelow(full_path, folder_full)) {
      best = folder;
      best_length = folder_full.size();
    }
  }
  return best;
}

bool FolderMgr::IsFullPathNeedMeta(const std::string& full_path) const {
  const FolderPtr folder = GetMostSuitableCfg(full_path);
  if (!folder) return false;
  switch (GetFileTypeByFullPath(full_path)) {
    case kFileTypeDocument:
      return folder->IsDocument();
    case kFileTypeAudio:
      return folder->IsAudio();
    case kFileTypeVideo:
      return folder->IsVideo();
    case kFileTypeImage:
      return folder->IsPhoto();
    case kFileTypeOther:
      break;
  }
  return false;
}

bool FolderMgr::IsFullPathHasOwnCfg(const std::string& full_path) const {
  return std::any_of(folders_.begin(), folders_.end(), [&full_path](const FolderPtr& folder) {
    return folder->CachedFullPath() == full_path;
  });
}

bool FolderMgr::IsFullPathIndexed(const std::string& full_path) const {
  return std::any_of(folders_.begin(), folders_.end(), [&full_path](const FolderPtr& folder) {
    return IsSameOrBelow(full_path, folder->CachedFullPath());
  });
}

bool FolderMgr::IsShareIndexed(const std::string& share) const {
  return std::any_of(folders_.begin(), folders_.end(),
                     [&share](const FolderPtr& folder) { return folder->GetShare() == share; });
}

std::set<std::string> FolderMgr::GetIndexedShares() const {
  std::set<std::string> shares;
  for (const FolderPtr& folder : folders_) shares.insert(folder->GetShare());
  return shares;
}

void FolderMgr::List(std::vector<FolderPtr>& out, unsigned int& total, unsigned int offset,
                     unsigned int limit, const std::string& sort_by,
                     const std::string& sort_direction) const {
  out = folders_;
  total = static_cast<unsigned int>(out.size());
  // A merge sort: the folding comparison falls back to bytes for text that
  // is not UTF-8, so with such names the order need not be transitive, and a
  // quicksort may then run past the ends of the range. Merging never does.
  std::stable_sort(out.begin(), out.end(), ComparatorFor(sort_by));
  if (sort_direction == "desc") std::reverse(out.begin(), out.end());
  if (offset >= out.size()) {
    out.clear();
    return;
  }
  out.erase(out.begin(), out.begin() + offset);
  if (limit <= out.size()) out.resize(limit);
}

}  // namespace fileindex
}  // namespace orvex
