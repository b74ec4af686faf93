#include "orvex/foundation/system_hooks.h"

#include <unistd.h>

#include <cstdlib>
#include <utility>

namespace orvex {
namespace {

SystemHooks& Installed() {
  static SystemHooks hooks;
  return hooks;
}

}  // namespace

SystemHooks SetSystemHooks(SystemHooks hooks) {
  SystemHooks previous = std::move(Installed());
  Installed() = std::move(hooks);
  return previous;
}

time_t Now() {
  const SystemHooks& hooks = Installed();
  return hooks.now ? hooks.now() : ::time(nullptr);
}

void SleepMicros(unsigned long micros) {
  const SystemHooks& hooks = Installed();
  if (hooks.sleep_for) {
    hooks.sleep_for(micros);
    return;
  }
  // usleep may refuse a second or more; sleep the whole seconds first.
  if (micros >= 1000000UL) ::sleep(static_cast<unsigned>(micros / 1000000UL));
  if (micros % 1000000UL) ::usleep(static_cast<useconds_t>(micros % 1000000UL));
}

int Random() {
  const SystemHooks& hooks = Installed();
  return hooks.random ? hooks.random() : std::rand();
}

}  // namespace orvex
