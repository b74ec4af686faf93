#include "search/viewer.h"

#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>

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

Visibility IndexVisibility(const std::string& index_id, const Viewer& viewer) {
  if (viewer.everything || viewer.uid == 0) return Visibility::kAll;
  if (index_id.compare(0, sizeof(kIndexPrefix) - 1, kIndexPrefix) != 0) return Visibility::kAll;
  portable::ShareRecord share;
  try {
    if (!portable::FindShare(index_id.substr(sizeof(kIndexPrefix) - 1), share)) {
      return Visibility::kAll;
    }
  } catch (const portable::ShareRegistryError&) {
    // Without the registry nobody can tell what is allowed: show nothing.
    return Visibility::kNone;
  }
  const auto it = share.privileges.find(viewer.user);
  if (it != share.privileges.end() && it->second == portable::kSharePrivNone) {
    return Visibility::kNone;
  }
  return share.hide_unreadable ? Visibility::kReadable : Visibility::kAll;
}

bool CanRead(const std::string& path, const Viewer& viewer) {
  if (viewer.everything || viewer.uid == 0) return true;
  struct stat st;
  if (::stat(path.c_str(), &st) != 0) return false;  // gone or hidden from us: not shown
  if (st.st_uid == viewer.uid) return (st.st_mode & S_IRUSR) != 0;
  if (std::find(viewer.groups.begin(), viewer.groups.end(), st.st_gid) != viewer.groups.end()) {
    return (st.st_mode & S_IRGRP) != 0;
  }
  return (st.st_mode & S_IROTH) != 0;
}

}  // namespace search
}  // namespace orvex
