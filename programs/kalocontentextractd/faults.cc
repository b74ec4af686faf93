#include "faults.h"

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "content_extractor.h"

namespace kalocontentextractd {
namespace {

constexpr char kFaultsVariable[] = "ORVEX_EXTRACT_FAULTS";
constexpr size_t kHogStep = 1 << 20;
// Far past any sensible cap. Only a broken cap gets here, and then a crash
// (which the tests tell from "memory cap") beats taking the whole machine.
constexpr size_t kHogSafetyBlocks = 8 << 10;

bool EndsWith(const std::string& text, const char* suffix) {
  const size_t n = std::strlen(suffix);
  return text.size() >= n && text.compare(text.size() - n, n, suffix) == 0;
}

[[noreturn]] void Crash() {
  // A write to an address no process maps, as a parser's stray pointer does.
  // The address is read at run time, so the compiler cannot drop the write.
  volatile uintptr_t address = 16;
  *reinterpret_cast<volatile int*>(address) = 1;
  std::abort();
}

[[noreturn]] void Hang() {
  volatile uint64_t spins = 0;
  for (;;) spins = spins + 1;
}

// Touches every page, so the memory is really taken, and keeps it. The
// memory cap ends this.
[[noreturn]] void Hog() {
  std::vector<char*> kept;
  kept.reserve(kHogSafetyBlocks);
  for (;;) {
    if (kept.size() == kHogSafetyBlocks) std::abort();
    char* block = new char[kHogStep];
    std::memset(block, 0x5a, kHogStep);
    kept.push_back(block);
  }
}

void InjectFault(const std::string& path) {
  if (EndsWith(path, ".crash")) Crash();
  if (EndsWith(path, ".hang")) Hang();
  if (EndsWith(path, ".hog")) Hog();
}

}  // namespace

orvex::portable::Extractor MakeExtractor() {
  const char* faults = std::getenv(kFaultsVariable);
  const bool inject = faults != nullptr && std::strcmp(faults, "1") == 0;
  return [inject](const std::string& path, Json::Value& out, std::string* problem) {
    if (inject) InjectFault(path);
    return orvex::extract::ExtractMetadata(path, orvex::extract::ExtractLimits(), out, problem);
  };
}

}  // namespace kalocontentextractd
