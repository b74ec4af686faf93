#include "orvex/policy/indexability.h"

#include <algorithm>
#include <iterator>
#include <vector>

#include "orvex/foundation/error.h"
#include "orvex/foundation/util.h"
#include "orvex/platform/sdk_share.h"

namespace orvex {
namespace fileindex {
namespace {

// Folders the platform keeps for itself anywhere in a share: per-directory
// metadata, snapshots and the recycle bin. Their content is not the user's.
constexpr const char* kSystemFolders[] = {"@eaDir", "#snapshot", "#recycle"};

bool IsSystemFolder(const std::string& component) {
  return std::any_of(std::begin(kSystemFolders), std::end(kSystemFolders),
                     [&component](const char* name) { return component == name; });
}

// The components of an absolute path after the leading "/"; "/a//b/" gives
// "a", "", "b", "".
std::vector<std::string> SplitComponents(const std::string& path) {
  std::vector<std::string> components;
  size_t begin = 1;
  while (begin <= path.size()) {
    size_t end = path.find('/', begin);
    if (end == std::string::npos) end = path.size();
    components.push_back(path.substr(begin, end - begin));
    begin = end + 1;
  }
  return components;
}

// The rules that need only the text of the path. components[0] is the share.
bool IsAcceptableName(const std::vector<std::string>& components) {
  for (size_t i = 0; i < components.size(); ++i) {
    const std::string& component = components[i];
    if (component.empty() || component == "." || component == "..") return false;
    if (i == 0) continue;
    if (IsSystemFolder(component)) return false;
    // Names beginning with "@" directly under a share root belong to the
    // platform and other packages; deeper down they are ordinary names.
    if (i == 1 && component[0] == '@') return false;
  }
  return true;
}

}  // namespace

bool CanPathBeIndexed(const std::string& share_relative_path) {
  const std::string& path = share_relative_path;
  if (path.empty() || path[0] != '/') return false;
  const std::vector<std::string> components = SplitComponents(path);
  if (!IsAcceptableName(components)) return false;
  const std::string& share_name = components[0];
  try {
    sdk::SDKShare share(share_name);
    if (!share.CanBeIndexed()) return false;
    const std::string full_path = share.GetPath() + path.substr(1 + share_name.size());
    return IsDirExist(full_path, /*follow_link=*/true);
  } catch (const Error&) {
    // An unknown share or a share the platform cannot answer for is simply
    // not indexable; the failure has been logged where it happened.
    return false;
  }
}

}  // namespace fileindex
}  // namespace orvex
