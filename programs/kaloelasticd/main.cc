// kaloelasticd: the search daemon. Keeps one SQLite index per share and
// carries out the search-engine client's commands and users' searches on
// /var/run/kaloelasticd.sock (under ORVEX_ROOT when set).
//
//   kaloelasticd [--foreground]
#include <fcntl.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/signalfd.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <memory>
#include <string>

#include "orvex/portable/atomic_file.h"
#include "orvex/portable/daemon_process.h"
#include "orvex/portable/file_descriptor.h"
#include "orvex/portable/root.h"
#include "orvex/version.h"
#include "search/index_registry.h"
#include "search/search_engine.h"
#include "search/search_error.h"
#include "search/search_server.h"

namespace {

using orvex::portable::RootPath;

constexpr char kIdent[] = "kaloelasticd";
constexpr char kPidPath[] = "/var/run/kaloelasticd.pid";
constexpr int kExitFailure = 1;
constexpr int kRoundMs = 60000;  // any wait ends sooner on a request or a signal

constexpr char kUsage[] =
    "usage: kaloelasticd [--foreground]\n"
    "The search daemon: one SQLite index per share, the indexer's document\n"
    "commands and users' searches on /var/run/kaloelasticd.sock (under\n"
    "ORVEX_ROOT when set; mode 0660). The set of indexes is kept in\n"
    "/var/lib/orvex/kaloelasticd/indexes.json. The protocol is described in\n"
    "doc/search_protocol.md.\n"
    "  --foreground  stay in the foreground (otherwise it detaches once its\n"
    "                socket is ready, and writes its pid to\n"
    "                /var/run/kaloelasticd.pid)\n"
    "  --help, --version\n"
    "Exit status: 0 on SIGTERM or SIGINT (the answers being written are\n"
    "finished; changes not committed are dropped), 1 when it cannot start,\n"
    "2 bad usage.\n";

using Options = orvex::portable::DaemonOptions;

Options ParseArgs(int argc, char** argv) {
  Options opt;
  orvex::portable::DaemonFlagParser(opt).Parse(argc, argv);
  return opt;
}

// Every open index holds a few descriptors and every client one: a soft
// limit of 1,024 would be reached long before the hard one.
void RaiseDescriptorLimit() {
  struct rlimit limit;
  if (::getrlimit(RLIMIT_NOFILE, &limit) == 0 && limit.rlim_cur < limit.rlim_max) {
    limit.rlim_cur = limit.rlim_max;
    ::setrlimit(RLIMIT_NOFILE, &limit);
  }
}

int Serve(const Options& opt) {
  orvex::FileDescriptor ready;
  const int started = orvex::portable::DetachUnlessForeground(opt.foreground, ready);
  if (started >= 0) return started;  // the starter, told how the start went
  ::openlog(kIdent, LOG_PID, LOG_DAEMON);
  RaiseDescriptorLimit();
  orvex::FileDescriptor stop = orvex::portable::BlockStopSignals();
  std::unique_ptr<orvex::search::SearchEngine> engine;
  try {
    engine =
        std::make_unique<orvex::search::SearchEngine>(RootPath(orvex::search::kIndexRegistryPath));
  } catch (const orvex::search::SearchError& e) {
    return orvex::portable::StartFailed(kIdent, e.what());
  }
  orvex::search::ServerOptions options;
  options.socket_path = RootPath(orvex::search::kSearchSocketPath);
  orvex::search::SearchServer server(options, *engine);
  if (!stop || !server.Start()) {
    return orvex::portable::StartFailed(
        kIdent, "cannot listen on " + options.socket_path + ": " + std::strerror(errno));
  }
  server.set_wake_fd(stop.get());
  const std::string pid_path = RootPath(kPidPath);
  if (!orvex::portable::AnnounceReady(ready, pid_path)) return kExitFailure;
  syslog(LOG_INFO, "listening on %s", options.socket_path.c_str());
  while (!server.RunOnce(kRoundMs)) {
  }
  server.Stop();
  engine.reset();  // drops what was not committed
  orvex::portable::EndServing(opt.foreground, pid_path);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return orvex::portable::DaemonMain(argc, argv, kIdent, kUsage, ParseArgs, Serve);
}
