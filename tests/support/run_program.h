// RunProgram: starts one of the built programs as a real process, with its
// standard output and error captured, and waits for it. Everything the child
// needs is built before fork, so a test may run peer threads meanwhile.
#ifndef ORVEX_TESTS_SUPPORT_RUN_PROGRAM_H_
#define ORVEX_TESTS_SUPPORT_RUN_PROGRAM_H_

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>
#include <sstream>
#include <string>
#include <vector>

extern char** environ;

namespace orvex {
namespace testing {

struct ProgramOutcome {
  int status = -1;  // exit status, -1 when the program did not exit normally
  std::string out;
  std::string err;
  long max_rss_kb = -1;  // the child's peak resident memory
};

// The path of a program of this build.
inline std::string BuiltProgram(const std::string& name) {
  return std::string(ORVEX_BUILD_DIR) + "/" + name;
}

inline std::string ReadFileText(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::ostringstream text;
  text << in.rdbuf();
  return text.str();
}

inline std::vector<std::string> SplitLines(const std::string& text) {
  std::vector<std::string> lines;
  std::istringstream in(text);
  for (std::string line; std::getline(in, line);) lines.push_back(line);
  return lines;
}

// Runs program with args; env holds "NAME=value" entries that replace the
// same names of this process's environment. io_dir receives the captured
// output files. The child reads input_path (a file or a FIFO) as its
// standard input when one is given, else this process's.
inline ProgramOutcome RunProgram(const std::string& program, const std::vector<std::string>& args,
                                 const std::vector<std::string>& env, const std::string& io_dir,
                                 const std::string& input_path = std::string()) {
  const std::string out_path = io_dir + "/stdout";
  const std::string err_path = io_dir + "/stderr";
  std::vector<std::string> env_text = env;
  for (char** e = environ; *e != nullptr; ++e) {
    const std::string entry = *e;
    bool replaced = false;
    for (const auto& own : env) {
      replaced |= entry.compare(0, own.find('=') + 1, own, 0, own.find('=') + 1) == 0;
    }
    if (!replaced) env_text.push_back(entry);
  }
  std::vector<char*> envp;
  for (auto& e : env_text) envp.push_back(&e[0]);
  envp.push_back(nullptr);
  std::vector<std::string> argv_text{program};
  argv_text.insert(argv_text.end(), args.begin(), args.end());
  std::vector<char*> argv;
  for (auto& a : argv_text) argv.push_back(&a[0]);
  argv.push_back(nullptr);

  const pid_t pid = ::fork();
  if (pid == 0) {
    const int out = ::open(out_path.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    const int err = ::open(err_path.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    if (out < 0 || err < 0 || ::dup2(out, 1) < 0 || ::dup2(err, 2) < 0) ::_exit(127);
    if (!input_path.empty()) {
      const int in = ::open(input_path.c_str(), O_RDONLY);
      if (in < 0 || ::dup2(in, 0) < 0) ::_exit(127);
    }
    ::execve(program.c_str(), argv.data(), envp.data());
    ::_exit(127);
  }
  ProgramOutcome outcome;
  int status = 0;
  struct rusage usage {};
  if (pid < 0 || ::wait4(pid, &status, 0, &usage) != pid) return outcome;
  if (WIFEXITED(status)) outcome.status = WEXITSTATUS(status);
  outcome.max_rss_kb = usage.ru_maxrss;
  outcome.out = ReadFileText(out_path);
  outcome.err = ReadFileText(err_path);
  return outcome;
}

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_SUPPORT_RUN_PROGRAM_H_
