#include "kalo/kalo_exec.h"

#include <fcntl.h>
#include <unistd.h>

#include <string>

#include "kalo/kalo_error.h"
#include "kalo_test_root.h"

namespace orvex {
namespace portable {
namespace {

class KaloExecTest : public TempRootTest {
 protected:
  // A script that writes each of its arguments on a line of its own to
  // out_, so the test sees exactly what argv the program received.
  std::string ArgsScript() {
    out_ = root_ + "/args.txt";
    std::string script = root_ + "/print_args";
    WriteText(script, "#!/bin/sh\nfor a in \"$@\"; do printf '%s\\n' \"$a\"; done > " + out_ +
                          "\nexit 7\n");
    EXPECT_EQ(::chmod(script.c_str(), 0755), 0);
    return script;
  }

  std::string out_;
};

TEST_F(KaloExecTest, ReturnsTheProgramsExitStatus) {
  EXPECT_EQ(KLIBCExec("/bin/true", nullptr), 0);
  EXPECT_EQ(KLIBCExec("/bin/false", nullptr), 1);
  EXPECT_EQ(KLIBCExec("/bin/sh", "-c", "exit 3"), 3);
  EXPECT_EQ(KLIBCExec("/bin/sh", "-c", "exit 255"), 255);
  EXPECT_EQ(KLIBCExecl("/bin/sh", KLIBC_EXECL_WAIT, "-c", "exit 42", nullptr), 42);
}

TEST_F(KaloExecTest, PassesArgumentsVerbatimWithoutAShell) {
  std::string script = ArgsScript();
  EXPECT_EQ(KLIBCExec(script.c_str(), "a b", "$HOME", "*"), 7);
  EXPECT_EQ(ReadText(out_), "a b\n$HOME\n*\n");

  EXPECT_EQ(KLIBCExec(script.c_str(), "one", nullptr, "ignored after the first null"), 7);
  EXPECT_EQ(ReadText(out_), "one\n");

  EXPECT_EQ(KLIBCExecl(script.c_str(), KLIBC_EXECL_WAIT, "-c", "KALO.Orvex.Application", "",
                       "<a data-kalo-fn=\"preference\">", "</a>", "6", "7", "8", "9", "10", "11",
                       "12", nullptr),
            7);
  EXPECT_EQ(ReadText(out_),
            "-c\nKALO.Orvex.Application\n\n<a data-kalo-fn=\"preference\">\n</a>\n6\n7\n8\n9\n"
            "10\n11\n12\n");

  EXPECT_EQ(KLIBCExecl(script.c_str(), KLIBC_EXECL_WAIT, nullptr), 7);
  EXPECT_EQ(ReadText(out_), "");
}

TEST_F(KaloExecTest, ChildInheritsTheCallersDescriptors) {
  std::string file = root_ + "/inherited.txt";
  int fd = ::open(file.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
  ASSERT_GE(fd, 0);
  std::string command = "echo through >&" + std::to_string(fd);
  EXPECT_EQ(KLIBCExec("/bin/sh", "-c", command.c_str()), 0);
  ::close(fd);
  EXPECT_EQ(ReadText(file), "through\n");
}

TEST_F(KaloExecTest, ProgramThatCannotRunFailsInTheCallerOnly) {
  const pid_t self = ::getpid();
  KLIBCErrClear();
  EXPECT_LT(KLIBCExec("/nonexistent/orvex/program", "x"), 0);
  EXPECT_EQ(::getpid(), self) << "the failed child must never come back here";
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_EXEC);

  std::string not_executable = root_ + "/plain.txt";
  WriteText(not_executable, "#!/bin/sh\nexit 0\n");
  EXPECT_LT(KLIBCExecl(not_executable.c_str(), KLIBC_EXECL_WAIT, nullptr), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_EXEC);
}

TEST_F(KaloExecTest, KilledProgramAndBadArgumentsFail) {
  EXPECT_LT(KLIBCExec("/bin/sh", "-c", "kill -9 $$"), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_EXEC);
  EXPECT_LT(KLIBCExec(nullptr, "x"), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
  EXPECT_LT(KLIBCExec("", nullptr), 0);
  EXPECT_LT(KLIBCExecl("/bin/true", 0, nullptr), 0) << "only the run-and-wait option word";
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
}

}  // namespace
}  // namespace portable
}  // namespace orvex
