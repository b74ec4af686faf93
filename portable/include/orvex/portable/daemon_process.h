// What every daemon of the system does around its loop: take SIGTERM and
// SIGINT as a descriptor its loop waits on, detach from whoever started it
// once it is ready to serve, and keep a pid file. One thread at a time: these
// change process-wide state (the signal mask, the session, descriptors 0-2).
#ifndef ORVEX_PORTABLE_DAEMON_PROCESS_H_
#define ORVEX_PORTABLE_DAEMON_PROCESS_H_

#include <functional>
#include <iostream>
#include <stdexcept>
#include <string>
#include <vector>

#include "orvex/portable/file_descriptor.h"
#include "orvex/version.h"

namespace orvex {
namespace portable {

// Blocks SIGTERM and SIGINT and returns a non-blocking signalfd that becomes
// readable when one arrives, so a stop is seen at once and never between a
// check and a wait. SIGPIPE is ignored: a peer that goes away fails a write
// instead of killing the daemon. An invalid descriptor (errno set) when the
// signalfd cannot be made.
FileDescriptor BlockStopSignals();

// Unless foreground, forks. The starting process waits until the daemon says
// it is ready (AnnounceReady) or fails before that, and returns the exit
// status it should end with: 0 when ready, 1 otherwise, so that whoever
// started the daemon can use it as soon as the command returns. The daemon
// process (and a foreground run) gets -1 and goes on: it has left the
// terminal's session, its working directory is "/" and descriptors 0-2 are
// /dev/null; ready holds the descriptor that AnnounceReady writes to.
int DetachUnlessForeground(bool foreground, FileDescriptor& ready);

// Writes pid_path (creating its directory) and tells the waiting starter
// that the daemon serves. Nothing to do for a foreground run (ready is
// invalid). False with errno set when the starter could not be told.
bool AnnounceReady(FileDescriptor& ready, const std::string& pid_path);

// A daemon that cannot start says why in the system log (opened by the
// caller) and on standard error, which a foreground run still has; returns
// the exit status for it, 1.
int StartFailed(const char* ident, const std::string& why);

// A daemon's orderly end: the pid file a detached run wrote is removed and
// the stop is logged.
void EndServing(bool foreground, const std::string& pid_path);

// Bad usage of a daemon's command line: DaemonMain prints it with the usage.
class DaemonUsageError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// The options every daemon takes; a daemon's own options derive from it.
struct DaemonOptions {
  bool help = false;
  bool version = false;
  bool foreground = false;
};

// A daemon's command line: --help, --version and --foreground, and the
// options with a value that the daemon declares, each given as "--name
// VALUE". Parse throws DaemonUsageError for "unknown argument ARG", "ARG
// needs a value" and a value the option refuses. The parser refers to the
// options and values it fills: they must outlive it.
class DaemonFlagParser {
 public:
  explicit DaemonFlagParser(DaemonOptions& options) : options_(options) {}

  // name takes a whole number from low to high, stored in value; any other
  // is refused as "NAME takes a number from LOW to HIGH, not "TEXT"".
  DaemonFlagParser& Number(const std::string& name, int low, int high, int& value);
  // name takes a text, stored in value; an empty text is refused with
  // if_empty as the reason, unless that is null.
  DaemonFlagParser& Text(const std::string& name, std::string& value, const char* if_empty);

  // Reads argv[1] to argv[argc - 1] in order.
  void Parse(int argc, char** argv) const;

 private:
  struct Valued {
    std::string name;
    std::function<void(const std::string& text)> take;  // throws DaemonUsageError
  };

  DaemonOptions& options_;
  std::vector<Valued> valued_;
};

// The main of every daemon program. parse(argc, argv) gives the options,
// which have `help` and `version` members, or throws DaemonUsageError (then
// "IDENT: reason" and the usage go to standard error, exit status 2).
// --help prints the usage and --version "IDENT VERSION" (status 0);
// otherwise run(options) runs the daemon and gives the exit status.
template <typename Parse, typename Run>
int DaemonMain(int argc, char** argv, const char* ident, const char* usage, Parse parse, Run run) {
  decltype(parse(argc, argv)) options;
  try {
    options = parse(argc, argv);
  } catch (const DaemonUsageError& e) {
    std::cerr << ident << ": " << e.what() << "\n" << usage;
    return 2;
  }
  if (options.help) {
    std::cout << usage;
    return 0;
  }
  if (options.version) {
    std::cout << ident << " " << ORVEX_VERSION << "\n";
    return 0;
  }
  return run(options);
}

}  // namespace portable
}  // namespace orvex

#endif  // ORVEX_PORTABLE_DAEMON_PROCESS_H_
