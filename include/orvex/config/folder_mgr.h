// FolderMgr: the list of indexed folders, loaded whole from the folder
// configuration file and saved whole. It answers which folder governs a
// file, whether a path or share is indexed, and the sorted, paged listing;
// it inserts, replaces and removes folders and reports which file types
// change state. Made for one operation and dropped; nothing is cached across
// instances. One thread at a time; writers in all processes serialise on
// kFileIndexFoldersLockPath, which FolderMgr itself never takes.
#ifndef ORVEX_CONFIG_FOLDER_MGR_H_
#define ORVEX_CONFIG_FOLDER_MGR_H_

#include <memory>
#include <set>
#include <string>
#include <vector>

#include "orvex/config/folder.h"
#include "orvex/export.h"

namespace orvex {
namespace fileindex {

// The most folders the list may hold.
inline constexpr unsigned int kFileIndexFoldersMax = 1000;
// A JSON array of Folder::GetData() records, in list order. Opened under
// ORVEX_ROOT when that is set.
inline constexpr char kFileIndexFoldersCfgPath[] = "/var/packages/Orvex/etc/fileindex.folders";
// Held by the operations that change the list, from before they load it
// until they return.
inline constexpr char kFileIndexFoldersLockPath[] = "/tmp/orvex_cfg_folder.lock";

class ORVEX_EXPORT FolderMgr {
 public:
  using FolderPtr = std::shared_ptr<Folder>;

  // Loads the file; an absent file is an empty list. Throws Error 504
  // "Cannot load json: <path>" when the file exists but is not JSON, Error
  // 504 "Folder list is not a JSON array: <path>" when it holds another JSON
  // value, and the record's Error 120 when an element is malformed. The size
  // limit is not applied here.
  FolderMgr();
  FolderMgr(const FolderMgr&) = delete;
  FolderMgr& operator=(const FolderMgr&) = delete;
  // Releases the records; does not save.
  ~FolderMgr();

  // Writes the list as root by atomic replacement (a failure never leaves a
  // half-written file), mode 0644, creating missing parent directories.
  // Throws Error 503 when the switch to root fails, 505 with the path when
  // the file cannot be written (the old file then intact) and 502 with the
  // path when the mode cannot be set.
  void Save() const;

  // The records in list order. The list keeps its own references; callers
  // may change a record's flags through them and then Save.
  const std::vector<FolderPtr>& GetFolders() const { return folders_; }

  // ---- Queries (folder_queries.cc); none touches the file. ----

  // Sets out to the first folder whose path equals path byte for byte.
  // Throws Error 902 with path as the reason when there is none.
  void Get(FolderPtr& out, const std::string& path) const;

  // Whether some folder's path equals path byte for byte.
  bool HasFolder(const std::string& path) const;

  // The folder whose settings govern full_path: the deepest folder that
  // contains it (a folder contains its own full path; /v/a contains /v/a/b
  // but not /v/ab), the earliest of equally deep ones; empty when none.
  // Throws the share path helpers' errors (120, 800) when a folder's full
  // path cannot be computed.
  FolderPtr GetMostSuitableCfg(const std::string& full_path) const;

  // Whether the file at full_path is to be indexed with its metadata: the
  // governing folder's flag for the file's class, false for any other class
  // or when no folder governs it. The pause flag is not consulted. Throws as
  // GetMostSuitableCfg.
  bool IsFullPathNeedMeta(const std::string& full_path) const;

  // Whether full_path is itself an indexed folder (exact comparison: a
  // trailing slash does not match). Throws as GetMostSuitableCfg.
  bool IsFullPathHasOwnCfg(const std::string& full_path) const;

  // Whether any folder contains full_path, whatever its flags and pause
  // state. Throws as GetMostSuitableCfg.
  bool IsFullPathIndexed(const std::string& full_path) const;

  // Whether some folder lies in share (exact case). Throws Error 120 when a
  // folder's path has no share component.
  bool IsShareIndexed(const std::string& share) const;

  // The distinct shares of all folders, ordered. Throws as IsShareIndexed.
  std::set<std::string> GetIndexedShares() const;

  // One page of the list. total is set to the number of folders. sort_by
  // "document", "audio", "video" or "photo" puts folders with the flag off
  // first; "path" orders the paths and any other word the names, both
  // case-insensitively (UTF-8 case folding). sort_direction "desc" reverses
  // the order. Then the first offset entries are dropped (an offset at or
  // past the end leaves nothing) and the rest cut to limit entries (limit 0
  // gives an empty page). The order of equal entries is unspecified.
  void List(std::vector<FolderPtr>& out, unsigned int& total, unsigned int offset,
            unsigned int limit, const std::string& sort_by,
            const std::string& sort_direction) const;

  // ---- Mutations (folder_mutation.cc); none saves. ----

  // A fresh change report for subject: its path and name, not paused, and
  // each type flag true where subject and other differ (all four when other
  // is empty). subject must not be empty.
  static FolderPtr DiffCfg(FolderPtr subject, FolderPtr other);

  // Inserts folder, replacing (and moving to the end) every folder with the
  // same path, and sets change to the report against the folder that
  // governed folder's full path before. Throws Error 900 when the list then
  // holds more than kFileIndexFoldersMax folders: the list keeps the new
  // entry and must not be saved. Throws as GetMostSuitableCfg.
  void Upsert(FolderPtr& change, FolderPtr folder);

  // Removes the folders whose path equals path and sets change to the
  // report of the removed folder against the folder that governs its
  // subtree from now on (all four flags when none does). A path inside a
  // folder removes nothing and reports no change. Throws Error 902 with path
  // as the reason (list unchanged) when no folder governs path, and the
  // share path helpers' 120 or 800 when path has no full path.
  void Delete(FolderPtr& change, const std::string& path);

  // Removes every folder of share (exact case), keeping the order of the
  // rest. Throws Error 120 as IsShareIndexed.
  void DeleteByShare(const std::string& share);

 private:
  // Erases every folder whose path equals path, keeping the others' order.
  void RemoveByPath(const std::string& path);

  std::vector<FolderPtr> folders_;
};

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_CONFIG_FOLDER_MGR_H_
