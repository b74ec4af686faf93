// Index management operations: what the web API and the indexing daemon call
// to manage indexed folders, follow shares that are renamed, moved or have
// their recycle bin looked at, pause and resume shares and volumes, and keep
// the dependent services running exactly while some folder is indexed.
//
// Every operation runs to completion on the caller's thread, loads the
// state files it needs at the call (nothing is cached between calls) and
// throws Error on failure, after logging it. The operations that change the
// folder list (add, set, delete) exclude each other in all processes through
// the folder lock file; the others take no lock of their own. Steps already
// done are not undone when a later step fails. Safe for concurrent use as far
// as the state files allow: see each operation.
#ifndef ORVEX_INDEX_MGR_H_
#define ORVEX_INDEX_MGR_H_

#include <json/json.h>

#include <string>

#include "orvex/export.h"

namespace orvex {
namespace fileindex {

// The application name under which share queues are registered with the
// notification daemon.
inline constexpr char kAppName[] = "fileindex";
// The event kinds watched in every indexed folder (hexadecimal FFC6).
inline constexpr unsigned int kMonitorMask = 65478;
// The services switched on while some folder is indexed.
inline constexpr char kContentExtractService[] = "kalocontentextractd";
inline constexpr char kFileIndexDaemonService[] = "pkg-Orvex-fileindexd";
inline constexpr char kSambaService[] = "samba";

// ---- Folder operations ----

// Adds the folders of folder_list, an array of folder records ("path",
// "name", "document", "audio", "video", "photo"; optional "paused",
// "volume_to_be_clean"), under the folder lock: checks each (indexable path
// unless updater_mode, not yet present, room in the list, free space on its
// share), saves the list, switches the services on, creates the index of
// each share that had no folder, tells the indexing daemon and registers the
// share's queue, then queues a configuration-change event per folder (none
// in updater_mode). Throws Error 120 (not an array, malformed record), 903
// "Path cannot index: <path>", 901 "Duplicated ID: <path>", 900 (more than
// 1000 folders), 1003 "Share (<share>) space not enough" — all before
// anything is saved — and the errors of the steps after the save (504/505
// files, 506 lock, 502 daemon or monitor queue, 913 search daemon, 800).
ORVEX_EXPORT void FolderAdd(const Json::Value& folder_list, bool updater_mode);

// As FolderAdd, but a folder that exists is replaced (a new one is added),
// its event carries only the file types whose indexing changes, and no share
// index is created.
ORVEX_EXPORT void FolderSet(const Json::Value& folder_list, bool updater_mode);

// Queues a re-index event for each path of path_list (share-relative
// paths, "/<share>/rest") whose share has an indexed folder, then clears the need-reindex
// flag of those shares. Paths of shares without folders are skipped. Takes
// no lock. Throws Error 120 (not an array, an element not a string, a path
// in no share), and the errors of the status file and of queueing.
ORVEX_EXPORT void FolderReindex(const Json::Value& path_list);

// Removes the folders of path_list (share-relative paths) under the folder
// lock, saves, queues a configuration-change event for each, tells the
// indexing daemon, and for each share left without folders removes its
// queue registration, its index, its queue files, database and status;
// other touched shares get their queue registration rewritten. Switches the
// services off when no folder is left. Throws Error 120 (not an array, not a
// string), 902 (a path governed by no folder; nothing saved), and the
// errors of the steps.
ORVEX_EXPORT void FolderDelete(const Json::Value& path_list);

// Replaces out by {"folder": [...], "total": n, "offset": offset}: one page
// of the folder list sorted by sort_by ("name", "path", "document", "audio",
// "video", "photo") and sort_direction ("asc", "desc"), each folder with the
// sections named in additional (an array; "status" is the only word). Each
// share's event queue is read at most once per call. Takes no lock. Throws
// the folder list's 504, and Error 120 for a bad additional (only when the
// page holds a folder), and the status errors.
ORVEX_EXPORT void FolderList(Json::Value& out, unsigned int offset, unsigned int limit,
                             const std::string& sort_by, const std::string& sort_direction,
                             const Json::Value& additional);

// Replaces out by the stored record of the folder whose path is path.
// Throws Error 902 with the path when there is none, and 504.
ORVEX_EXPORT void FolderGet(Json::Value& out, const std::string& path);

// ---- Share lifecycle ----

// The share was renamed from share_from to share_to: its folders follow
// (saved first), its index is renamed and re-pointed, and a rename event of
// the share's root is queued. Throws Error 120 "Missing share_from" /
// "Missing share_to", and the errors of the steps.
ORVEX_EXPORT void ShareRename(const std::string& share_from, const std::string& share_to);

// The share moved from path_from to path_to (another volume): when it is
// indexed, its index is re-pointed and a rename event from the old root to
// the new one is queued. Throws Error 120 "Missing share_name", "Missing
// path_from", "Missing path_to" (in that order), and the errors of the steps.
ORVEX_EXPORT void ShareMigrate(const std::string& share_name, const std::string& path_from,
                               const std::string& path_to);

// Queues a re-index event of the share's recycle bin ("<share root>/#recycle").
// Throws Error 800 for an unknown share, and the errors of queueing.
ORVEX_EXPORT void ShareCheckRecycle(const std::string& share_name);

// ---- Pause and resume ----

// Pauses one indexed share: the daemon drops its worker, the queue
// registration is removed, the index paused, then its folders are flagged
// paused and saved. Does nothing for a share without folders. Throws Error
// 120 "Missing share name", and the errors of the steps.
ORVEX_EXPORT void SharePause(const std::string& share_name);

// The mirror image of SharePause, in the reverse order: index resumed,
// queue registered, daemon worker created, folders unflagged and saved.
ORVEX_EXPORT void ShareResume(const std::string& share_name);

// Forgets a share that has gone: removes its queue files, database and
// status, deletes its index, drops its folders and saves; switches the
// services off when no folder is left. Throws Error 120 "Missing share name"
// / "Missing share path", and the errors of the steps.
ORVEX_EXPORT void ShareClearPaused(const std::string& share_name, const std::string& share_path);

// Pauses every unpaused folder whose full path starts with mount_point (a
// plain prefix test: /volume1 also matches /volume10), saves, then for each
// of their shares in name order: daemon worker dropped, queue registration
// removed, index paused. Throws Error 120 "Missing mount point".
ORVEX_EXPORT void VolumePause(const std::string& mount_point);

// Resumes the paused folders on the volume, saves, then for each of their
// shares in name order: index resumed, daemon worker created, queue
// registered (after the daemon, unlike ShareResume).
ORVEX_EXPORT void VolumeResume(const std::string& mount_point);

// Forgets the folders on a removed volume: the status of each of their
// shares is cleared and the shares' folders dropped; saves, and switches the
// services off when no folder is left. The shares' indexes are kept.
ORVEX_EXPORT void VolumeClearPaused(const std::string& mount_point);

// ---- Services ----

// Switches the services on when the folder list holds a folder and off when
// it holds none. Throws only the folder list's errors.
ORVEX_EXPORT void PrepareServices();

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_INDEX_MGR_H_
