// DaemonProcess: a daemon a test runs, either as a child of the test
// (Spawn) or detached, known by its pid file (Adopt). Stopping it waits until
// it is gone, without fixed sleeps; whatever still runs when the object goes
// away is killed. WaitUntil polls observable state the same way.
#ifndef ORVEX_TESTS_SUPPORT_DAEMON_PROCESS_H_
#define ORVEX_TESTS_SUPPORT_DAEMON_PROCESS_H_

#include <poll.h>
#include <signal.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <fstream>
#include <string>
#include <thread>
#include <vector>

#include "orvex/portable/file_descriptor.h"

namespace orvex {
namespace testing {

// Whether pred came to hold within patience, asking it every interval.
template <typename Pred>
bool WaitUntil(Pred pred, std::chrono::milliseconds patience = std::chrono::seconds(60),
               std::chrono::milliseconds interval = std::chrono::milliseconds(1)) {
  const auto give_up = std::chrono::steady_clock::now() + patience;
  while (!pred()) {
    if (std::chrono::steady_clock::now() >= give_up) return false;
    std::this_thread::sleep_for(interval);
  }
  return true;
}

class DaemonProcess {
 public:
  DaemonProcess() = default;
  DaemonProcess(const DaemonProcess&) = delete;
  DaemonProcess& operator=(const DaemonProcess&) = delete;
  ~DaemonProcess() {
    if (pid_ > 0) Stop(SIGKILL);
  }

  // Runs program with args as a child of this process.
  bool Spawn(const std::string& program, const std::vector<std::string>& args) {
    std::vector<std::string> text{program};
    text.insert(text.end(), args.begin(), args.end());
    std::vector<char*> argv;
    for (std::string& arg : text) argv.push_back(&arg[0]);
    argv.push_back(nullptr);
    const pid_t pid = ::fork();
    if (pid == 0) {
      ::execv(program.c_str(), argv.data());
      ::_exit(127);
    }
    child_ = true;
    return Track(pid);
  }

  // Takes on the detached daemon whose pid is in pid_file.
  bool Adopt(const std::string& pid_file) {
    pid_t pid = -1;
    std::ifstream(pid_file) >> pid;
    child_ = false;
    return Track(pid);
  }

  pid_t pid() const { return pid_; }

  bool Signal(int sig) const { return pid_ > 0 && ::kill(pid_, sig) == 0; }

  // Waits until the daemon is gone. A child's exit status (-1 when a signal
  // ended it); 0 for an adopted daemon; -1 when it is still there after ten
  // seconds.
  int Wait() {
    if (pid_ <= 0) return -1;
    pollfd gone = {pidfd_.get(), POLLIN, 0};
    const bool ended = ::poll(&gone, 1, 10000) == 1;
    int status = 0;
    if (ended && child_ && ::waitpid(pid_, &status, 0) != pid_) status = -1;
    pid_ = -1;
    pidfd_.reset();
    if (!ended) return -1;
    if (!child_) return 0;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  }

  int Stop(int sig = SIGTERM) {
    Signal(sig);
    return Wait();
  }

 private:
  bool Track(pid_t pid) {
    if (pid <= 0) return false;
    pid_ = pid;
    pidfd_.reset(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0)));
    return pidfd_.valid();
  }

  pid_t pid_ = -1;
  FileDescriptor pidfd_;
  bool child_ = false;
};

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_SUPPORT_DAEMON_PROCESS_H_
