// fileindexd: the indexing daemon. It serves the command socket
// /var/run/fileindexd.sock and keeps one worker per indexed share that is not
// paused, draining the share's event queue into the search daemon's index.
//
//   fileindexd [--foreground]
#include <fcntl.h>
#include <signal.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>
#include <utility>

#include "index/index_daemon.h"
#include "orvex/communication.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/portable/daemon_process.h"
#include "orvex/portable/file_descriptor.h"
#include "orvex/portable/root.h"
#include "orvex/version.h"

namespace {

constexpr char kIdent[] = "fileindexd";
constexpr int kExitFailure = 1;
// The idle poll doubles as the watch on the share queues: a change waits at
// most this long to be noticed, at the cost of one stat per share.
constexpr int kStepMs = 50;
constexpr char kPidPath[] = "/var/run/fileindexd.pid";

constexpr char kUsage[] =
    "usage: fileindexd [--foreground]\n"
    "The indexing daemon: one worker per indexed, unpaused share drains the\n"
    "share's event queue into the search daemon (kaloelasticd), and the command\n"
    "socket /var/run/fileindexd.sock (under ORVEX_ROOT when set) takes pause,\n"
    "resume, worker_create, worker_delete, notify_setting_changed and status\n"
    "(see doc/indexing_daemon.md).\n"
    "  --foreground   stay in the foreground (otherwise it detaches once the\n"
    "                 socket is listening, and writes its pid to\n"
    "                 /var/run/fileindexd.pid)\n"
    "  --help, --version\n"
    "Exit status: 0 after SIGTERM or SIGINT, 1 when it cannot start (another\n"
    "fileindexd already answers on the socket, or the socket cannot be made),\n"
    "2 on bad usage.\n";

using Options = orvex::portable::DaemonOptions;

Options ParseArgs(int argc, char** argv) {
  Options opt;
  orvex::portable::DaemonFlagParser(opt).Parse(argc, argv);
  return opt;
}

int Serve(const Options& opt) {
  orvex::FileDescriptor ready;
  const int started = orvex::portable::DetachUnlessForeground(opt.foreground, ready);
  if (started >= 0) return started;  // the starter, told how the start went
  ::openlog(kIdent, LOG_PID, LOG_DAEMON);
  orvex::FileDescriptor stop = orvex::portable::BlockStopSignals();
  orvex::indexd::IndexDaemonOptions options;
  options.server.socket_path =
      orvex::portable::RootPath(orvex::fileindex::kFileIndexDaemonSockPath);
  orvex::indexd::IndexDaemon daemon(options);
  std::string why;
  if (!stop)
    return orvex::portable::StartFailed(kIdent,
                                        std::string("signalfd failed: ") + std::strerror(errno));
  if (!daemon.Start(why)) return orvex::portable::StartFailed(kIdent, why);
  daemon.set_wake_fd(stop.get());
  // The library's long waits (a busy search daemon) keep the command socket
  // answering and end at a stop signal.
  orvex::SystemHooks hooks;
  hooks.sleep_for = [&daemon](unsigned long micros) { daemon.WaitServing(micros); };
  const orvex::ScopedSystemHooks waits(std::move(hooks));
  const std::string pid_path = orvex::portable::RootPath(kPidPath);
  if (!orvex::portable::AnnounceReady(ready, pid_path)) return kExitFailure;
  syslog(LOG_INFO, "listening on %s", options.server.socket_path.c_str());
  // A batch interrupted here is found again from its snapshot at the next
  // start: nothing is lost by stopping between steps.
  while (!daemon.woken()) daemon.RunOnce(kStepMs);
  orvex::portable::EndServing(opt.foreground, pid_path);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return orvex::portable::DaemonMain(argc, argv, kIdent, kUsage, ParseArgs, Serve);
}
