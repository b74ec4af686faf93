#include "platform/index_paths.h"

#include "kalo/kalo_path.h"

namespace orvex {
namespace sdk {
namespace {

// Room for any composed path: the kernel refuses longer ones anyway.
constexpr size_t kPathBufferSize = 4096;

}  // namespace

int ComposeQueuePath(const std::string& share_path, std::string& out) {
  char path[kPathBufferSize] = {};
  const int ret = FILEIDXQueuePathCompose(share_path.c_str(), path, sizeof(path));
  if (ret >= 0) out = path;
  return ret;
}

int ComposeDBPath(const std::string& share_path, std::string& out) {
  char path[kPathBufferSize] = {};
  const int ret = FILEIDXDBPathCompose(share_path.c_str(), path, sizeof(path));
  if (ret >= 0) out = path;
  return ret;
}

}  // namespace sdk
}  // namespace orvex
