// The process's clock, sleep and random source, replaceable so that tests of
// waits measured in seconds or minutes (lock retries, connect retries, busy
// retries, pause deadlines) run at once. The defaults are time(nullptr),
// usleep and rand(). SetSystemHooks is not thread-safe: install hooks before
// starting threads.
#ifndef ORVEX_FOUNDATION_SYSTEM_HOOKS_H_
#define ORVEX_FOUNDATION_SYSTEM_HOOKS_H_

#include <ctime>
#include <functional>

#include "orvex/export.h"

namespace orvex {

struct SystemHooks {
  std::function<time_t()> now;                          // empty: time(nullptr)
  std::function<void(unsigned long micros)> sleep_for;  // empty: usleep/sleep
  std::function<int()> random;                          // empty: rand()
};

// Installs hooks and returns the previous set.
ORVEX_EXPORT SystemHooks SetSystemHooks(SystemHooks hooks);

ORVEX_EXPORT time_t Now();
ORVEX_EXPORT void SleepMicros(unsigned long micros);
ORVEX_EXPORT int Random();

// Installs hooks for a scope and restores the previous set on exit.
class ScopedSystemHooks {
 public:
  explicit ScopedSystemHooks(SystemHooks hooks) : previous_(SetSystemHooks(std::move(hooks))) {}
  ScopedSystemHooks(const ScopedSystemHooks&) = delete;
  ScopedSystemHooks& operator=(const ScopedSystemHooks&) = delete;
  ~ScopedSystemHooks() { SetSystemHooks(std::move(previous_)); }

 private:
  SystemHooks previous_;
};

}  // namespace orvex

#endif  // ORVEX_FOUNDATION_SYSTEM_HOOKS_H_
