#include "search/viewer.h"

#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <utility>

#include "orvex/portable/share_registry.h"
#include "search/search_error.h"

namespace orvex {
namespace search {
namespace {

constexpr char kIndexPrefix[] = "fileindex_";

bool FillUser(const std::string& name, Viewer& viewer) {
  struct passwd* pw = ::getpwnam(name.c_str());
  if (pw == nullptr) return false;
  viewer.user = name;
  viewer.uid = pw->pw_uid;
  int count = 64;
  viewer.groups.resize(static_cast<size_t>(count));
  if (::getgrouplist(name.c_str(), pw->pw_gid, viewer.groups.data(), &count) < 0) {
    viewer.groups.resize(static_cast<size_t>(count));
    ::getgrouplist(name.c_str(), pw->pw_gid, viewer.groups.data(), &count);
  }
  viewer.groups.resize(static_cast<size_t>(std::max(count, 0)));
  return true;
}

std::string UserName(uid_t uid) {
  struct passwd* pw = ::getpwuid(uid);
  return pw == nullptr ? std::to_string(uid) : pw->pw_name;
}

}  // namespace

Viewer ResolveViewer(const Json::Value& data, const Caller& caller) {
  Viewer viewer;
  const Json::Value& named = data["user"];
  if (!named.isNull() && !named.isString())
    throw SearchError(kBadArgument, "\"user\" must be a string");
  if (caller.uid == 0 && named.isNull()) return viewer;
  const std::string own = UserName(caller.uid);
  const std::string user = named.isString() ? named.asString() : own;
  if (caller.uid != 0 && user != own) {
    throw SearchError(kNotPermitted, "only root may search as another user");
  }
  viewer.everything = false;
  if (!FillUser(user, viewer)) {
    if (caller.uid == 0) throw SearchError(kBadArgument, "no user \"" + user + "\"");
    // A caller without a passwd entry sees what its own ids allow.
    viewer.user = user;
    viewer.uid = caller.uid;
    viewer.groups = {caller.gid};
  }
  return viewer;
}

IndexAccess IndexVisibility(const std::string& index_id, const Viewer& viewer) {
  IndexAccess access;
  if (viewer.everything || viewer.uid == 0) return access;
  if (index_id.compare(0, sizeof(kIndexPrefix) - 1, kIndexPrefix) != 0) return access;
  portable::ShareRecord share;
  try {
    if (!portable::FindShare(index_id.substr(sizeof(kIndexPrefix) - 1), share)) return access;
  } catch (const portable::ShareRegistryError&) {
    // Without the registry nobody can tell what is allowed: show nothing.
    access.visibility = Visibility::kNone;
    return access;
  }
  const auto it = share.privileges.find(viewer.user);
  if (it != share.privileges.end() && it->second == portable::kSharePrivNone) {
    access.visibility = Visibility::kNone;
  } else if (share.hide_unreadable) {
    access.visibility = Visibility::kReadable;
    access.share_root = share.path;
  }
  return access;
}

ReadCheck::ReadCheck(const Viewer& viewer, std::string share_root, StatFn stat_fn)
    : viewer_(viewer), root_(std::move(share_root)), stat_(std::move(stat_fn)) {
  while (root_.size() > 1 && root_.back() == '/') root_.pop_back();
  if (!stat_) {
    stat_ = [](const std::string& path, struct stat& st) { return ::stat(path.c_str(), &st); };
  }
}

bool ReadCheck::Grants(const struct stat& st, mode_t owner_bit) const {
  if (st.st_uid == viewer_.uid) return (st.st_mode & owner_bit) != 0;
  if (std::find(viewer_.groups.begin(), viewer_.groups.end(), st.st_gid) != viewer_.groups.end()) {
    return (st.st_mode & (owner_bit >> 3)) != 0;
  }
  return (st.st_mode & (owner_bit >> 6)) != 0;
}

bool ReadCheck::Traversable(const std::string& dir) {
  const auto known = traversable_.find(dir);
  if (known != traversable_.end()) return known->second;
  // Only the root and the directories below it get here (CanRead sees to
  // that), so the walk up ends at the root.
  bool ok = true;
  if (dir != root_) ok = Traversable(dir.substr(0, std::max<size_t>(dir.rfind('/'), 1)));
  struct stat st;
  // A directory that its parent hides is never looked at.
  ok = ok && stat_(dir, st) == 0 && S_ISDIR(st.st_mode) && Grants(st, S_IXUSR);
  traversable_.emplace(dir, ok);
  return ok;
}

bool ReadCheck::CanRead(const std::string& path) {
  if (viewer_.everything || viewer_.uid == 0) return true;
  if (path == root_) {
    struct stat st;
    return stat_(path, st) == 0 && Grants(st, S_IRUSR);
  }
  const std::string inside = root_ == "/" ? root_ : root_ + "/";
  if (path.size() <= inside.size() || path.compare(0, inside.size(), inside) != 0) return false;
  // "." and ".." would lead the walk up the tree past directories not
  // checked; "//" and a trailing "/" name no entry of their own.
  for (const char* odd : {"/./", "/../", "//"}) {
    if (path.find(odd, inside.size() - 1) != std::string::npos) return false;
  }
  const size_t slash = path.rfind('/');
  const std::string base = path.substr(slash + 1);
  if (base.empty() || base == "." || base == "..") return false;
  if (!Traversable(slash + 1 == inside.size() ? root_ : path.substr(0, slash))) return false;
  struct stat st;
  return stat_(path, st) == 0 && Grants(st, S_IRUSR);
}

}  // namespace search
}  // namespace orvex
