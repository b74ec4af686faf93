#include "orvex/portable/daemon_process.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <cerrno>

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

}  // namespace portable
}  // namespace orvex
