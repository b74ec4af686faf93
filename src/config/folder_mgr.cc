// Loading and saving the folder list. The queries live in
// folder_queries.cc, the changes in folder_mutation.cc.
#include "orvex/config/folder_mgr.h"

#include <sys/stat.h>
#include <sys/types.h>

#include <cerrno>

#include "foundation/check.h"
#include "foundation/state_file.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/util.h"
#include "orvex/platform/sdk_credentials.h"
#include "platform/fixed_path.h"

namespace orvex {
namespace fileindex {
namespace {

constexpr char kLogSource[] = "folder_mgr";

std::string FoldersPath() { return sdk::FixedPath(kFileIndexFoldersCfgPath); }

}  // namespace

FolderMgr::FolderMgr() {
  const std::string path = FoldersPath();
  const std::string not_a_file = NotARegularFile(path);
  ORVEX_CHECK(!not_a_file.empty(), kErrorLoadJson, "Cannot load json: " + path + not_a_file);
  Json::Value folders(Json::arrayValue);
  ORVEX_CHECK_AS(
      IsFileExist(path) && !fromFile(folders, path),
      "IsFileExist(kFileIndexFoldersCfgPath) && !folders.fromFile(kFileIndexFoldersCfgPath)",
      kErrorLoadJson, "Cannot load json: " + path);
  // Iterating an object would read its members as records, and any other
  // value has nothing to iterate: neither is a folder list.
  ORVEX_CHECK(!folders.isArray(), kErrorLoadJson, "Folder list is not a JSON array: " + path);
  folders_.reserve(folders.size());
  for (const Json::Value& data : folders) folders_.push_back(std::make_shared<Folder>(data));
}

FolderMgr::~FolderMgr() = default;

void FolderMgr::Save() const {
  sdk::SDKCredentials creds("root");
  Json::Value folders(Json::arrayValue);
  for (const FolderPtr& folder : folders_) folders.append(folder->GetData());
  const std::string path = FoldersPath();
  MakeParentDirectories(path);
  ORVEX_CHECK_AS(!toFile(folders, path), "!folders.toFile(kFileIndexFoldersCfgPath)",
                 kErrorSaveJson, path);
  ORVEX_CHECK_AS(-1 == ::chmod(path.c_str(), 0644), "-1 == chmod(kFileIndexFoldersCfgPath, 0644)",
                 kErrorSystem, path);
}

}  // namespace fileindex
}  // namespace orvex
