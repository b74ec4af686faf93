// Running a program and waiting for it, the platform way: fork and execv,
// no shell, no PATH search (a program path is used exactly as given). The
// child inherits the caller's descriptors, environment and working directory
// and starts with an empty signal mask. The caller must not have SIGCHLD set
// to SIG_IGN, or the exit status is lost. Thread-safe: the child runs only
// async-signal-safe code between fork and exec.
// Who may include it: in the library, only the platform layer (src/platform/),
// the one door through which every subsystem reaches the platform, and the
// foundation beneath it; the programs and the tests may include it freely.
#ifndef KALO_KALO_EXEC_H_
#define KALO_KALO_EXEC_H_

// KLIBCExecl option word: run the program and wait for it to end.
constexpr int KLIBC_EXECL_WAIT = 0xBB;

// Runs prog with up to four arguments; the list ends at the first null
// argument (KLIBCExec("/bin/rm", "-rf", path) runs "rm -rf path"). Returns
// the program's exit status (0-255). Returns -1 with KLIB_ERR_BAD_PARAMETER
// for a null or empty prog, and with KLIB_ERR_EXEC when the program cannot be
// started (fork or exec failed; the child then exits 127) or was ended by a
// signal.
int KLIBCExec(const char* prog, const char* arg1, const char* arg2 = nullptr,
              const char* arg3 = nullptr, const char* arg4 = nullptr);

// Runs prog with the arguments that follow options, a list of const char*
// ended by a null pointer. options must be KLIBC_EXECL_WAIT; any other value
// fails with KLIB_ERR_BAD_PARAMETER. Returns as KLIBCExec.
int KLIBCExecl(const char* prog, int options, ...) __attribute__((sentinel));

#endif  // KALO_KALO_EXEC_H_
