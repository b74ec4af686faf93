// The daemons' command lines, run for real: --help and --version, and each
// kind of bad usage named on the first line of standard error, with the usage
// after it and exit status 2, before anything is started.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "orvex/version.h"
#include "support/run_program.h"
#include "support/temp_dir.h"

namespace orvex {
namespace testing {
namespace {

ProgramOutcome RunDaemon(const std::string& daemon, const std::vector<std::string>& args,
                         const TempDir& io) {
  return RunProgram(std::string(ORVEX_BUILD_DIR) + "/" + daemon, args, {}, io.path());
}

TEST(DaemonUsageTest, HelpAndVersion) {
  const struct {
    const char* daemon;
    const char* help_text;  // a text the help must hold
  } cases[] = {
      {"kalonotifyd", "fs.inotify.max_user_watches"},
      {"kalocontentextractd", "ORVEX_EXTRACT_FAULTS"},
      {"fileindexd", "/var/run/fileindexd.pid"},
      {"kaloelasticd", "/var/run/kaloelasticd.pid"},
  };
  TempDir io;
  for (const auto& c : cases) {
    SCOPED_TRACE(c.daemon);
    const ProgramOutcome help = RunDaemon(c.daemon, {"--help"}, io);
    EXPECT_EQ(0, help.status);
    EXPECT_EQ(0u, help.out.rfind(std::string("usage: ") + c.daemon + " [--foreground]", 0));
    EXPECT_NE(std::string::npos, help.out.find(c.help_text));
    EXPECT_EQ("", help.err);
    const ProgramOutcome version = RunDaemon(c.daemon, {"--version"}, io);
    EXPECT_EQ(0, version.status);
    EXPECT_EQ(std::string(c.daemon) + " " + ORVEX_VERSION + "\n", version.out);
  }
}

TEST(DaemonUsageTest, BadUsageIsNamedBeforeTheUsage) {
  const struct {
    const char* daemon;
    std::vector<std::string> args;
    const char* reason;
  } cases[] = {
      {"kalonotifyd", {"--bogus"}, "unknown argument --bogus"},
      {"fileindexd", {"--bogus"}, "unknown argument --bogus"},
      {"kaloelasticd", {"--bogus"}, "unknown argument --bogus"},
      {"kalonotifyd", {"--foreground", "extra"}, "unknown argument extra"},
      {"kalonotifyd", {"--status-interval"}, "--status-interval needs a value"},
      {"kalonotifyd",
       {"--status-interval", "0"},
       "--status-interval takes a number from 1 to 3600, not \"0\""},
      {"kalonotifyd",
       {"--status-interval", "99999999999999999999"},
       "--status-interval takes a number from 1 to 3600, not \"99999999999999999999\""},
      {"kalocontentextractd", {"--extract"}, "--extract needs a value"},
      {"kalocontentextractd", {"--extract", "", "--bogus"}, "--extract needs a path"},
      {"kalocontentextractd",
       {"--workers", "17"},
       "--workers takes a number from 1 to 16, not \"17\""},
      {"kalocontentextractd",
       {"--deadline-ms", "soon"},
       "--deadline-ms takes a number from 1 to 86400000, not \"soon\""},
      {"kalocontentextractd",
       {"--memory-mb", ""},
       "--memory-mb takes a number from 1 to 1048576, not \"\""},
      {"kalocontentextractd", {"--workers", "2", "--help", "--x"}, "unknown argument --x"},
  };
  TempDir io;
  for (const auto& c : cases) {
    SCOPED_TRACE(std::string(c.daemon) + ": " + c.reason);
    const ProgramOutcome run = RunDaemon(c.daemon, c.args, io);
    EXPECT_EQ(2, run.status);
    const std::vector<std::string> lines = SplitLines(run.err);
    ASSERT_LE(2u, lines.size()) << run.err;
    EXPECT_EQ(std::string(c.daemon) + ": " + c.reason, lines[0]);
    EXPECT_EQ(0u, lines[1].rfind(std::string("usage: ") + c.daemon, 0)) << lines[1];
    EXPECT_EQ("", run.out);
  }
}

}  // namespace
}  // namespace testing
}  // namespace orvex
