// Share path helpers: converting between the three kinds of path the library
// handles. A share-relative path is "/<share>" or "/<share>/rest", as folders
// are configured; a full path is the share's registered root directory
// followed by the rest, as the file system and the event queues see it; a
// share path is a share's root directory itself. The share registry is read
// on every call (nothing is cached), under the process-wide SDKMutex. Safe
// for concurrent use.
#ifndef ORVEX_POLICY_SHARE_PATH_H_
#define ORVEX_POLICY_SHARE_PATH_H_

#include <string>

#include "orvex/export.h"

namespace orvex {
namespace fileindex {

// The recycle-bin folder directly under every share root that keeps one.
inline constexpr char kRecycleBinName[] = "#recycle";

// The share component of a share-relative path: "photo" for "/photo/2024/a.jpg",
// "/photo" and "/photo/". Throws Error 120 (logged) for an empty or relative
// path and for one without a share component ("/", "//photo").
ORVEX_EXPORT std::string GetShareNameByPath(const std::string& share_relative_path);

// The full path of a share-relative path: the registered root of its share
// followed by the rest ("/photo/x" gives "/volume1/photo/x"). Throws Error 120
// as GetShareNameByPath, and Error 800 with the share name as the reason when
// no such share is registered.
ORVEX_EXPORT std::string GetFullPath(const std::string& share_relative_path);

// Finds the registered share that holds full_path: the share whose root is
// full_path itself or a whole-component prefix of it ("/srv/a" holds
// "/srv/a/x" but not "/srv/ab/x"); when roots nest, the longest wins. Sets
// share_name to its name and share_path to its root. Throws Error 120
// "Cannot find share: " + full_path when no share holds it (outputs
// unchanged), and Error 502 when the registry cannot be read.
ORVEX_EXPORT void GetShareNamePathByFullPath(const std::string& full_path, std::string& share_name,
                                             std::string& share_path);

// Moves path from share share_from to share share_to. Note the order: the
// new share comes first, the old one last.
//
// A share-relative path has its share component replaced: "/a/x" with
// share_to "b" and share_from "a" gives "/b/x". A full path has the root of
// share_from replaced by the registered root of share_to; when share_from is
// no longer registered (the share was already renamed where it stands, its
// root "<dir>/share_from" becoming "<dir>/share_to"), a full path under
// "<dir>/share_from" is moved under share_to's root. Throws Error 120 when
// path is empty or relative, a share name is empty or contains "/", or path
// lies in neither form in share_from; Error 800 when share_to must be looked
// up and is not registered.
ORVEX_EXPORT std::string ReplacePathShare(const std::string& path, const std::string& share_to,
                                          const std::string& share_from);

// True when any component of path is the recycle-bin folder "#recycle".
// Works on any kind of path. Never throws.
ORVEX_EXPORT bool IsRecyclePath(const std::string& path);

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_POLICY_SHARE_PATH_H_
