// kalocontentextractd: the content-extraction service. The parsers of
// untrusted files run only in its worker processes, each with a deadline per
// file and a memory cap, so that a file that crashes, hangs or eats memory
// costs one worker (replaced at once) and never the caller.
//
//   kalocontentextractd [--foreground] [--workers N] [--deadline-ms MS] [--memory-mb MB]
//   kalocontentextractd --extract PATH [--deadline-ms MS] [--memory-mb MB]
#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>

#include "extract_service.h"
#include "faults.h"
#include "orvex/portable/atomic_file.h"
#include "orvex/portable/daemon_process.h"
#include "orvex/portable/file_descriptor.h"
#include "orvex/portable/root.h"
#include "orvex/version.h"

namespace {

using orvex::portable::ExtractService;
using orvex::portable::ExtractServiceOptions;
using orvex::portable::RootPath;

constexpr char kIdent[] = "kalocontentextractd";
constexpr int kExitFailure = 1;
constexpr int kRoundMs = 60000;  // any wait ends sooner at a deadline or a signal

constexpr char kUsage[] =
    "usage: kalocontentextractd [--foreground] [--workers N] [--deadline-ms MS] [--memory-mb MB]\n"
    "       kalocontentextractd --extract PATH [--deadline-ms MS] [--memory-mb MB]\n"
    "The content-extraction service: reads the metadata and text of files in\n"
    "isolated worker processes and answers on /var/run/kalocontentextractd.sock\n"
    "(under ORVEX_ROOT when set; mode 0660). A worker that crashes, passes the\n"
    "deadline or the memory cap is replaced and the caller told why.\n"
    "  --foreground     stay in the foreground (otherwise it detaches once its\n"
    "                   socket is ready, and writes its pid to\n"
    "                   /var/run/kalocontentextractd.pid)\n"
    "  --workers N      worker processes, 1 to 16 (default 2)\n"
    "  --deadline-ms MS time allowed per file (default 10000)\n"
    "  --memory-mb MB   memory a worker may take beyond its start (default 512)\n"
    "  --extract PATH   extract one file in this process and print its properties\n"
    "                   as one JSON object: the one-shot mode used when no daemon runs\n"
    "  --help, --version\n"
    "Exit status of --extract: 0 done, 10 the file is corrupt (what was read is\n"
    "printed, the reason goes to standard error), 11 the memory cap was reached,\n"
    "12 not a regular file, 2 bad usage. The daemon exits 0 on SIGTERM, 1 when it\n"
    "cannot start. Test facility: ORVEX_EXTRACT_FAULTS=1 makes files named *.crash,\n"
    "*.hang and *.hog crash, hang and exhaust memory in the worker.\n";

struct Options : orvex::portable::DaemonOptions {
  std::string extract;  // one-shot mode when not empty
  int workers = 2;
  int deadline_ms = orvex::portable::kDefaultExtractDeadlineMs;
  int memory_mb = orvex::portable::kDefaultExtractMemoryMb;
};

Options ParseArgs(int argc, char** argv) {
  Options opt;
  orvex::portable::DaemonFlagParser(opt)
      .Text("--extract", opt.extract, "--extract needs a path")
      .Number("--workers", 1, 16, opt.workers)
      .Number("--deadline-ms", 1, 24 * 3600 * 1000, opt.deadline_ms)
      .Number("--memory-mb", 1, 1 << 20, opt.memory_mb)
      .Parse(argc, argv);
  return opt;
}

bool WriteAll(int fd, const std::string& text) {
  for (size_t done = 0; done < text.size();) {
    const ssize_t n = ::write(fd, text.data() + done, text.size() - done);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) return false;
    done += static_cast<size_t>(n);
  }
  return true;
}

int ExtractOne(const Options& opt) {
  std::string out;
  std::string err;
  const int status = orvex::portable::RunOneShot(opt.extract, opt.deadline_ms, opt.memory_mb,
                                                 kalocontentextractd::MakeExtractor(), out, err);
  if (!err.empty()) WriteAll(STDERR_FILENO, std::string(kIdent) + ": " + err + "\n");
  if (!WriteAll(STDOUT_FILENO, out)) return kExitFailure;
  return status;
}

int Serve(const Options& opt) {
  orvex::FileDescriptor ready;
  const int started = orvex::portable::DetachUnlessForeground(opt.foreground, ready);
  if (started >= 0) return started;  // the starter, told how the start went
  ::openlog(kIdent, LOG_PID, LOG_DAEMON);
  orvex::FileDescriptor stop = orvex::portable::BlockStopSignals();
  ExtractServiceOptions options;
  options.socket_path = RootPath(orvex::portable::kExtractSocketPath);
  options.workers = opt.workers;
  options.deadline_ms = opt.deadline_ms;
  options.memory_mb = opt.memory_mb;
  ExtractService service(options, kalocontentextractd::MakeExtractor());
  if (!stop || !service.Start()) {
    return orvex::portable::StartFailed(
        kIdent, "cannot listen on " + options.socket_path + ": " + std::strerror(errno));
  }
  service.set_wake_fd(stop.get());
  const std::string pid_path = RootPath(orvex::portable::kExtractPidPath);
  if (!orvex::portable::AnnounceReady(ready, pid_path)) return kExitFailure;
  syslog(LOG_INFO, "listening on %s with %d workers", options.socket_path.c_str(), opt.workers);
  while (!service.RunOnce(kRoundMs)) {
  }
  service.Stop();
  orvex::portable::EndServing(opt.foreground, pid_path);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return orvex::portable::DaemonMain(argc, argv, kIdent, kUsage, ParseArgs, [](const Options& opt) {
    return opt.extract.empty() ? Serve(opt) : ExtractOne(opt);
  });
}
