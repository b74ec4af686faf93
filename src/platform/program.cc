#include "platform/program.h"

#include <array>

#include "kalo/kalo_error.h"
#include "kalo/kalo_exec.h"

namespace orvex {
namespace sdk {

int RunProgram(const std::string& program, const std::vector<std::string>& args) {
  if (args.size() > kMaxProgramArgs) {
    KLIBC_ERR_SET(KLIB_ERR_BAD_PARAMETER);
    return -1;
  }
  // The platform's call takes a null-terminated list and stops at the first
  // null, so unused slots are simply passed as nulls.
  std::array<const char*, kMaxProgramArgs> a{};
  for (size_t i = 0; i < args.size(); ++i) a[i] = args[i].c_str();
  return KLIBCExecl(program.c_str(), KLIBC_EXECL_WAIT, a[0], a[1], a[2], a[3], a[4], a[5], a[6],
                    a[7], a[8], a[9], a[10], a[11], a[12], a[13], a[14], a[15],
                    static_cast<const char*>(nullptr));
}

int RunProgramShort(const std::string& program, const std::vector<std::string>& args) {
  if (args.empty() || args.size() > 4) {
    KLIBC_ERR_SET(KLIB_ERR_BAD_PARAMETER);
    return -1;
  }
  std::array<const char*, 4> a{};
  for (size_t i = 0; i < args.size(); ++i) a[i] = args[i].c_str();
  return KLIBCExec(program.c_str(), a[0], a[1], a[2], a[3]);
}

}  // namespace sdk
}  // namespace orvex
