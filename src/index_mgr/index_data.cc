#include "index_mgr/index_data.h"

#include "foundation/check.h"
#include "index_mgr/log_util.h"
#include "orvex/status/status_mgr.h"
#include "platform/index_paths.h"
#include "platform/program.h"

namespace orvex {
namespace fileindex {
namespace {

constexpr char kRemoveProgram[] = "/bin/rm";
constexpr char kTmpSuffix[] = ".tmp";

// rm -rf: the database is a directory on some platforms, and a path that
// is already gone is no failure.
void RemoveTree(const std::string& path) { sdk::RunProgramShort(kRemoveProgram, {"-rf", path}); }

}  // namespace

void RemoveShareIndexData(const std::string& share, const std::string& share_path) {
  std::string path;
  ORVEX_CHECK_AS(0 > sdk::ComposeQueuePath(share_path, path),
                 "0 > FILEIDXQueuePathCompose(share_path.c_str(), path, sizeof(path))",
                 kErrorSystem, "FILEIDXQueuePathCompose failed, share_path=" + share_path);
  RemoveTree(path);
  RemoveTree(path + kTmpSuffix);
  ORVEX_CHECK_AS(0 > sdk::ComposeDBPath(share_path, path),
                 "0 > FILEIDXDBPathCompose(share_path.c_str(), path, sizeof(path))", kErrorSystem,
                 "FILEIDXDBPathCompose failed, share_path=" + share_path);
  RemoveTree(path);
  StatusMgr().ClearShareStatus(share);
}

}  // namespace fileindex
}  // namespace orvex
