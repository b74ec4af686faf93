#include "kalo/kalo_path.h"

#include <cstring>
#include <string>

#include "kalo/kalo_error.h"

namespace {

constexpr char kQueueSuffix[] = "/@eaDir/@fileindex/queue";
constexpr char kDBSuffix[] = "/@eaDir/@fileindex/db";

int Compose(const char* share_path, const char* suffix, char* buf, size_t size) {
  if (buf != nullptr && size > 0) buf[0] = '\0';
  if (share_path == nullptr || share_path[0] != '/' || buf == nullptr) {
    KLIBC_ERR_SET(KLIB_ERR_BAD_PARAMETER);
    return -1;
  }
  size_t length = std::strlen(share_path);
  // "/volume1/photo/" and "/volume1/photo" are the same share root; the root
  // directory "/" itself leaves nothing before the suffix.
  while (length > 0 && share_path[length - 1] == '/') --length;
  std::string composed(share_path, length);
  composed += suffix;
  if (composed.size() + 1 > size) {
    KLIBC_ERR_SET(KLIB_ERR_BUFFER_TOO_SMALL);
    return -1;
  }
  std::memcpy(buf, composed.c_str(), composed.size() + 1);
  return 0;
}

}  // namespace

int FILEIDXQueuePathCompose(const char* share_path, char* buf, size_t size) {
  return Compose(share_path, kQueueSuffix, buf, size);
}

int FILEIDXDBPathCompose(const char* share_path, char* buf, size_t size) {
  return Compose(share_path, kDBSuffix, buf, size);
}
