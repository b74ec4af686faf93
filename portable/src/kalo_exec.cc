#include "kalo/kalo_exec.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <vector>

#include "kalo/kalo_error.h"
#include "orvex/portable/file_descriptor.h"

namespace {

constexpr int kExecFailedStatus = 127;

// A pipe whose write end closes at the child's exec: the child reports an
// exec failure by writing its errno, and the parent reads end-of-file when
// the exec succeeded.
struct ExecPipe {
  ExecPipe() {
    int fds[2];
    if (::pipe2(fds, O_CLOEXEC) != 0) return;
    read_end.reset(fds[0]);
    write_end.reset(fds[1]);
  }
  bool ok() const { return read_end.valid(); }

  orvex::FileDescriptor read_end;
  orvex::FileDescriptor write_end;
};

// Runs in the child between fork and exec: only async-signal-safe calls,
// and never a return into the caller's code.
[[noreturn]] void ExecChild(const char* prog, char* const argv[], int report_fd) {
  sigset_t empty;
  sigemptyset(&empty);
  sigprocmask(SIG_SETMASK, &empty, nullptr);
  ::execv(prog, argv);
  int error = errno;
  ssize_t ignored = ::write(report_fd, &error, sizeof(error));
  (void)ignored;
  ::_exit(kExecFailedStatus);
}

// The child's errno when its exec failed; 0 when the exec succeeded.
int ReadExecError(int fd) {
  int error = 0;
  ssize_t n;
  do {
    n = ::read(fd, &error, sizeof(error));
  } while (n < 0 && errno == EINTR);
  return n == static_cast<ssize_t>(sizeof(error)) ? error : 0;
}

int WaitChild(pid_t pid, int& status) {
  pid_t done;
  do {
    done = ::waitpid(pid, &status, 0);
  } while (done < 0 && errno == EINTR);
  return done == pid ? 0 : -1;
}

int RunAndWait(const char* prog, const std::vector<const char*>& args) {
  if (prog == nullptr || prog[0] == '\0') {
    KLIBC_ERR_SET(KLIB_ERR_BAD_PARAMETER);
    return -1;
  }
  // Everything the child needs is built before fork: it may not allocate.
  std::vector<char*> argv;
  argv.reserve(args.size() + 2);
  argv.push_back(const_cast<char*>(prog));
  for (const char* arg : args) argv.push_back(const_cast<char*>(arg));
  argv.push_back(nullptr);

  ExecPipe pipe;
  if (!pipe.ok()) {
    KLIBC_ERR_SET(KLIB_ERR_EXEC);
    return -1;
  }
  pid_t pid = ::fork();
  if (pid == 0) ExecChild(prog, argv.data(), pipe.write_end.get());
  if (pid < 0) {
    KLIBC_ERR_SET(KLIB_ERR_EXEC);
    return -1;
  }
  pipe.write_end.reset();
  int exec_error = ReadExecError(pipe.read_end.get());
  int status = 0;
  if (WaitChild(pid, status) != 0 || exec_error != 0 || !WIFEXITED(status)) {
    if (exec_error != 0) errno = exec_error;
    KLIBC_ERR_SET(KLIB_ERR_EXEC);
    return -1;
  }
  return WEXITSTATUS(status);
}

}  // namespace

int KLIBCExec(const char* prog, const char* arg1, const char* arg2, const char* arg3,
              const char* arg4) {
  std::vector<const char*> args;
  for (const char* arg : {arg1, arg2, arg3, arg4}) {
    if (arg == nullptr) break;
    args.push_back(arg);
  }
  return RunAndWait(prog, args);
}

int KLIBCExecl(const char* prog, int options, ...) {
  std::vector<const char*> args;
  va_list list;
  va_start(list, options);
  for (const char* arg = va_arg(list, const char*); arg != nullptr;
       arg = va_arg(list, const char*)) {
    args.push_back(arg);
  }
  va_end(list);
  if (options != KLIBC_EXECL_WAIT) {
    KLIBC_ERR_SET(KLIB_ERR_BAD_PARAMETER);
    return -1;
  }
  return RunAndWait(prog, args);
}
