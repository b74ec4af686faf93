#include "orvex/portable/daemon_process.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/signalfd.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <iostream>

#include "orvex/portable/atomic_file.h"

namespace orvex {
namespace portable {
namespace {

constexpr int kStartFailed = 1;

// Waits for the daemon's one byte; an empty close means it failed first.
int WaitForReady(const FileDescriptor& read_end) {
  char byte = 0;
  ssize_t n;
  while ((n = ::read(read_end.get(), &byte, 1)) < 0 && errno == EINTR) {
  }
  return n == 1 ? 0 : kStartFailed;
}

}  // namespace

FileDescriptor BlockStopSignals() {
  sigset_t stop;
  sigemptyset(&stop);
  sigaddset(&stop, SIGTERM);
  sigaddset(&stop, SIGINT);
  ::sigprocmask(SIG_BLOCK, &stop, nullptr);
  ::signal(SIGPIPE, SIG_IGN);
  return FileDescriptor(::signalfd(-1, &stop, SFD_CLOEXEC | SFD_NONBLOCK));
}

int DetachUnlessForeground(bool foreground, FileDescriptor& ready) {
  if (foreground) return -1;
  int fds[2];
  if (::pipe2(fds, O_CLOEXEC) != 0) return kStartFailed;
  FileDescriptor read_end(fds[0]);
  ready.reset(fds[1]);
  const pid_t pid = ::fork();
  if (pid < 0) return kStartFailed;
  if (pid > 0) {
    ready.reset();
    return WaitForReady(read_end);
  }
  ::setsid();
  if (::chdir("/") != 0) return kStartFailed;
  const FileDescriptor null(::open("/dev/null", O_RDWR | O_CLOEXEC));
  for (int fd = 0; fd <= 2; ++fd) ::dup2(null.get(), fd);
  return -1;
}

bool AnnounceReady(FileDescriptor& ready, const std::string& pid_path) {
  if (!ready) return true;
  // A private root starts without /var/run; a pid file that cannot be
  // written only costs the stop command its shortcut, not the start.
  MakeDirectories(pid_path.substr(0, pid_path.rfind('/')));
  WriteFileAtomic(pid_path, std::to_string(::getpid()) + "\n");
  const char byte = 'r';
  const bool told = ::write(ready.get(), &byte, 1) == 1;
  ready.reset();
  return told;
}

DaemonFlagParser& DaemonFlagParser::Number(const std::string& name, int low, int high, int& value) {
  valued_.push_back(
      {name, [name, low, high, &value](const std::string& text) {
         char* end = nullptr;
         errno = 0;
         const long number = std::strtol(text.c_str(), &end, 10);
         if (text.empty() || *end != '\0' || errno != 0 || number < low || number > high) {
           throw DaemonUsageError(name + " takes a number from " + std::to_string(low) + " to " +
                                  std::to_string(high) + ", not \"" + text + "\"");
         }
         value = static_cast<int>(number);
       }});
  return *this;
}

DaemonFlagParser& DaemonFlagParser::Text(const std::string& name, std::string& value,
                                         const char* if_empty) {
  valued_.push_back({name, [&value, if_empty](const std::string& text) {
                       if (text.empty() && if_empty != nullptr) throw DaemonUsageError(if_empty);
                       value = text;
                     }});
  return *this;
}

void DaemonFlagParser::Parse(int argc, char** argv) const {
  for (int i = 1; i < argc; ++i) {
    const std::string arg = argv[i];
    if (arg == "--help") {
      options_.help = true;
      continue;
    }
    if (arg == "--version") {
      options_.version = true;
      continue;
    }
    if (arg == "--foreground") {
      options_.foreground = true;
      continue;
    }
    const Valued* option = nullptr;
    for (const Valued& valued : valued_) {
      if (valued.name == arg) option = &valued;
    }
    if (option == nullptr) throw DaemonUsageError("unknown argument " + arg);
    if (i + 1 >= argc) throw DaemonUsageError(arg + " needs a value");
    option->take(argv[++i]);
  }
}

int StartFailed(const char* ident, const std::string& why) {
  syslog(LOG_ERR, "%s", why.c_str());
  std::cerr << ident << ": " << why << "\n";
  return 1;
}

void EndServing(bool foreground, const std::string& pid_path) {
  if (!foreground) ::unlink(pid_path.c_str());
  syslog(LOG_INFO, "stopped");
}

}  // namespace portable
}  // namespace orvex
