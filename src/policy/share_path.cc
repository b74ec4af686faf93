#include "orvex/policy/share_path.h"

#include <memory>
#include <vector>

#include "foundation/check.h"
#include "foundation/path_prefix.h"
#include "orvex/foundation/util.h"
#include "orvex/platform/sdk_share.h"

namespace orvex {
namespace fileindex {
namespace {

constexpr char kLogSource[] = "share_path";

// The first component of an absolute path ("a" for "/a/x"); "" for "/" and
// "//x".
std::string FirstComponent(const std::string& path) {
  const size_t end = path.find('/', 1);
  return path.substr(1, end == std::string::npos ? std::string::npos : end - 1);
}

bool IsShareName(const std::string& name) {
  return !name.empty() && name.find('/') == std::string::npos;
}

// Looks a share's root up. False when no share has that name; any other
// failure of the platform throws Error 800 as SDKShare does. Unlike
// SDKShare, an absent share is an answer here, not a failure to log.
bool LookUpShareRoot(const std::string& name, std::string& root) {
  const std::unique_ptr<sdk::SDKShare> share = sdk::SDKShare::Find(name);
  if (!share) return false;
  root = share->GetPath();
  return true;
}

}  // namespace

std::string GetShareNameByPath(const std::string& share_relative_path) {
  const std::string& path = share_relative_path;
  ORVEX_CHECK(path.empty() || path[0] != '/', kErrorBadArgument,
              "Not a share-relative path: [" + path + "]");
  std::string share = FirstComponent(path);
  ORVEX_CHECK(share.empty(), kErrorBadArgument, "No share name in path: [" + path + "]");
  return share;
}

std::string GetFullPath(const std::string& share_relative_path) {
  const std::string share_name = GetShareNameByPath(share_relative_path);
  sdk::SDKShare share(share_name);
  return share.GetPath() + share_relative_path.substr(1 + share_name.size());
}

void GetShareNamePathByFullPath(const std::string& full_path, std::string& share_name,
                                std::string& share_path) {
  const sdk::ShareLocation* best = nullptr;
  const std::vector<sdk::ShareLocation> shares = sdk::ListShareLocations();
  for (const sdk::ShareLocation& share : shares) {
    if (!IsSameOrBelow(full_path, share.path)) continue;
    if (best == nullptr || share.path.size() > best->path.size()) best = &share;
  }
  ORVEX_CHECK(best == nullptr, kErrorBadArgument, "Cannot find share: " + full_path);
  share_name = best->name;
  share_path = best->path;
}

std::string ReplacePathShare(const std::string& path, const std::string& share_to,
                             const std::string& share_from) {
  ORVEX_CHECK(path.empty() || path[0] != '/', kErrorBadArgument,
              "Not an absolute path: [" + path + "]");
  ORVEX_CHECK(!IsShareName(share_to), kErrorBadArgument, "Invalid share_to: [" + share_to + "]");
  ORVEX_CHECK(!IsShareName(share_from), kErrorBadArgument,
              "Invalid share_from: [" + share_from + "]");
  std::string root_from;
  const bool from_registered = LookUpShareRoot(share_from, root_from);
  if (from_registered && IsSameOrBelow(path, root_from)) {
    return sdk::SDKShare(share_to).GetPath() + path.substr(root_from.size());
  }
  // The share was renamed where it stands: the registry already knows only
  // the new name, and full paths still name the old root beside it.
  std::string root_to;
  if (!from_registered && LookUpShareRoot(share_to, root_to) && Basename(root_to) == share_to) {
    const std::string old_root = Dirname(root_to) + "/" + share_from;
    if (IsSameOrBelow(path, old_root)) return root_to + path.substr(old_root.size());
  }
  ORVEX_CHECK(FirstComponent(path) != share_from, kErrorBadArgument,
              "Path [" + path + "] is not in share [" + share_from + "]");
  return "/" + share_to + path.substr(1 + share_from.size());
}

bool IsRecyclePath(const std::string& path) {
  size_t begin = 0;
  while (begin <= path.size()) {
    size_t end = path.find('/', begin);
    if (end == std::string::npos) end = path.size();
    if (path.compare(begin, end - begin, kRecycleBinName) == 0) return true;
    begin = end + 1;
  }
  return false;
}

}  // namespace fileindex
}  // namespace orvex
