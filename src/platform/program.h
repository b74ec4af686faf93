// Running one of the platform's programs and waiting for it: no shell, no
// PATH search, the program path used exactly as given. Safe for concurrent
// use (each call forks its own child).
#ifndef ORVEX_SRC_PLATFORM_PROGRAM_H_
#define ORVEX_SRC_PLATFORM_PROGRAM_H_

#include <string>
#include <vector>

namespace orvex {
namespace sdk {

// The most arguments RunProgram passes; the platform's programs take fewer.
constexpr size_t kMaxProgramArgs = 16;

// Runs program with args and waits for it to end. Returns its exit status
// (0-255), or -1 when it could not be started, was ended by a signal, or
// args holds more than kMaxProgramArgs entries; the platform's error is then
// available through PlatformErrorText(). Never throws; logs nothing.
int RunProgram(const std::string& program, const std::vector<std::string>& args);

// Runs program with up to four arguments through the platform's short exec
// call (KLIBCExec), as RunProgram otherwise: "rm -rf path" is
// RunProgramShort("/bin/rm", {"-rf", path}).
int RunProgramShort(const std::string& program, const std::vector<std::string>& args);

}  // namespace sdk
}  // namespace orvex

#endif  // ORVEX_SRC_PLATFORM_PROGRAM_H_
