// kalonotifyd: the file-change watcher. It follows the monitor registrations
// under /var/lib/orvex/monitor/<app>/ and appends one line per change in the
// registered folders to each registration's queue, under the queue's lock.
//
//   kalonotifyd [--foreground] [--status-interval SECONDS]
#include <fcntl.h>
#include <signal.h>
#include <sys/signalfd.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstring>
#include <ctime>
#include <string>

#include "kalo/kalo_notify.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/util.h"
#include "orvex/portable/atomic_file.h"
#include "orvex/portable/daemon_process.h"
#include "orvex/portable/file_descriptor.h"
#include "orvex/portable/root.h"
#include "orvex/version.h"
#include "watch/watcher.h"

namespace {

using orvex::portable::RootPath;

constexpr char kIdent[] = "kalonotifyd";
constexpr int kExitFailure = 1;
constexpr int kStepMs = 1000;
constexpr int kFinalRounds = 64;

constexpr char kUsage[] =
    "usage: kalonotifyd [--foreground] [--status-interval SECONDS]\n"
    "The file-change watcher: follows the monitor queue registrations under\n"
    "/var/lib/orvex/monitor/<app>/ (under ORVEX_ROOT when set), watches every\n"
    "registered folder with inotify and appends one JSON line per change to its\n"
    "queue (see doc/queue_line.md and doc/monitor_registry.md).\n"
    "  --foreground               stay in the foreground (otherwise it detaches\n"
    "                             once the registrations are watched and writes\n"
    "                             its pid to /var/run/kalonotifyd.pid)\n"
    "  --status-interval SECONDS  how often /var/run/kalonotifyd.status.json is\n"
    "                             rewritten (default 5); `orvex watch status` shows it\n"
    "  --help, --version\n"
    "Exit status: 0 after SIGTERM or SIGINT (every change read by then is written),\n"
    "1 when it cannot start, 2 on bad usage. If the log says the watch limit or the\n"
    "event queue was exceeded, raise fs.inotify.max_user_watches or\n"
    "fs.inotify.max_queued_events with sysctl.\n";

struct Options : orvex::portable::DaemonOptions {
  int status_interval_s = 5;
};

Options ParseArgs(int argc, char** argv) {
  Options opt;
  orvex::portable::DaemonFlagParser(opt)
      .Number("--status-interval", 1, 3600, opt.status_interval_s)
      .Parse(argc, argv);
  return opt;
}

void WriteStatus(const orvex::watch::Watcher& watcher, bool running) {
  Json::Value status = watcher.Status();
  status["pid"] = static_cast<Json::Int>(::getpid());
  status["version"] = ORVEX_VERSION;
  status["running"] = running;
  status["updated"] = static_cast<Json::Int64>(std::time(nullptr));
  const std::string path = RootPath(KALO::KALONOTIFYD::kNotifyStatusPath);
  // A private root starts without /var/run.
  orvex::MakeParentDirectories(path);
  if (!orvex::portable::WriteFileAtomic(path, orvex::toString(status) + "\n")) {
    syslog(LOG_WARNING, "cannot write %s: %s", path.c_str(), std::strerror(errno));
  }
}

int Serve(const Options& opt) {
  orvex::FileDescriptor ready;
  const int started = orvex::portable::DetachUnlessForeground(opt.foreground, ready);
  if (started >= 0) return started;  // the starter, told how the start went
  ::openlog(kIdent, LOG_PID, LOG_DAEMON);
  orvex::FileDescriptor stop = orvex::portable::BlockStopSignals();
  orvex::watch::WatcherOptions options;
  options.registry_dir = RootPath(KALO::KALONOTIFYD::kMonitorRegistryDir);
  orvex::watch::Watcher watcher(options);
  std::string why;
  if (!stop)
    return orvex::portable::StartFailed(kIdent,
                                        std::string("signalfd failed: ") + std::strerror(errno));
  if (!watcher.Start(why)) return orvex::portable::StartFailed(kIdent, why);
  watcher.set_wake_fd(stop.get());
  const std::string pid_path = RootPath(KALO::KALONOTIFYD::kNotifyPidPath);
  if (!orvex::portable::AnnounceReady(ready, pid_path)) return kExitFailure;
  syslog(LOG_INFO, "watching %zu directories for %s", watcher.watch_count(),
         options.registry_dir.c_str());
  WriteStatus(watcher, /*running=*/true);
  const auto interval = std::chrono::seconds(opt.status_interval_s);
  auto next_status = std::chrono::steady_clock::now() + interval;
  while (!watcher.woken()) {
    watcher.RunOnce(kStepMs);
    if (std::chrono::steady_clock::now() >= next_status) {
      WriteStatus(watcher, /*running=*/true);
      next_status = std::chrono::steady_clock::now() + interval;
    }
  }
  // The stop may have come with changes still queued in the kernel: they are
  // read and written before the daemon goes, within a bound so that a storm
  // cannot hold the stop off for ever (each step writes all that it read).
  for (int round = 0; round < kFinalRounds && watcher.RunOnce(0) > 0; ++round) {
  }
  WriteStatus(watcher, /*running=*/false);
  orvex::portable::EndServing(opt.foreground, pid_path);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return orvex::portable::DaemonMain(argc, argv, kIdent, kUsage, ParseArgs, Serve);
}
