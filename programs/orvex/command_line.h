// What the orvex tool's command groups share: the group entry points listed
// in main.cc's command table, the usage error, and the small argument parser.
// Every failure reaches the administrator as one line,
// "orvex: error CODE: REASON", where REASON names what is at fault, why, and
// what to do about it. The tool is single-threaded.
#ifndef ORVEX_PROGRAMS_ORVEX_COMMAND_LINE_H_
#define ORVEX_PROGRAMS_ORVEX_COMMAND_LINE_H_

#include <set>
#include <stdexcept>
#include <string>
#include <vector>

namespace orvex_cli {

constexpr int kExitOk = 0;
// Every failure, bad usage included, exits with this status.
constexpr int kExitFailure = 2;

using Args = std::vector<std::string>;

// Bad usage of a command: main prints "orvex: error 120: <message>", then
// usage, to standard error and exits with kExitFailure.
class UsageError : public std::runtime_error {
 public:
  UsageError(const std::string& message, std::string usage)
      : std::runtime_error(message), usage_(std::move(usage)) {}
  const std::string& usage() const { return usage_; }

 private:
  std::string usage_;
};

// One command group: `orvex <name> ...`. run receives the arguments after
// the name, prints its own help when they hold "--help", and returns the exit
// status or throws (UsageError, orvex::Error, std::exception) for main to
// report.
struct CommandGroup {
  const char* name;
  const char* summary;  // one line for `orvex --help`
  int (*run)(const Args& args);
};

// One subcommand of a group: `orvex <group> <name> ...`; run receives the
// arguments after the name.
struct Subcommand {
  const char* name;
  int (*run)(const Args& args);
};

// Runs the subcommand that args[0] names; "--help" there prints usage.
// Throws UsageError (carrying usage) for a missing or unknown subcommand,
// naming the subcommands there are.
int RunSubcommand(const Args& args, const std::string& group,
                  const std::vector<Subcommand>& subcommands, const std::string& usage);

// Entry points, one group per file (see the command table in main.cc).
int RunShareCommand(const Args& args);   // share_commands.cc
int RunStatusCommand(const Args& args);  // status_commands.cc
int RunPauseCommand(const Args& args);   // status_commands.cc
int RunResumeCommand(const Args& args);  // status_commands.cc
int RunFolderCommand(const Args& args);  // folder_commands.cc

int RunExtractCommand(const Args& args);  // extract_commands.cc
int RunWatchCommand(const Args& args);    // watch_commands.cc
int RunSearchCommand(const Args& args);   // search_commands.cc
int RunStatsCommand(const Args& args);    // search_commands.cc
int RunUpCommand(const Args& args);       // system_commands.cc
int RunDownCommand(const Args& args);     // system_commands.cc
int RunIndexCommand(const Args& args);    // system_commands.cc
// Each daemon, running or not, and each share's indexing progress.
void PrintDaemonStatus();  // system_commands.cc

// The management commands (manage_commands.cc): two groups of their own and
// the changing subcommands of the folder and share groups.
int RunVolumeCommand(const Args& args);
int RunServicesCommand(const Args& args);
int FolderAddCommand(const Args& args);
int FolderSetCommand(const Args& args);
int FolderReindexCommand(const Args& args);
int FolderDeleteCommand(const Args& args);
int SharePauseCommand(const Args& args);
int ShareResumeCommand(const Args& args);
int ShareForgetCommand(const Args& args);
int ShareRenameCommand(const Args& args);
int ShareMigrateCommand(const Args& args);
int ShareCheckRecycleCommand(const Args& args);

// Arguments split into options ("--name") and positional words. "--" ends
// the options; a word such as "-2" is positional, so that numbers may be
// negative and reach the library's own check.
struct ParsedArgs {
  std::vector<std::string> positional;
  std::set<std::string> options;

  bool Has(const std::string& option) const { return options.count(option) != 0; }
};

// True when args hold "--help" before any "--".
bool WantsHelp(const Args& args);

// Parses args, allowing only the given options and the positional words
// named in positional (as the usage names them, "NAME", "PATH"), of which
// the first `required` must be given. Throws UsageError (carrying usage) for
// an unknown option, a missing or an unexpected word, naming it.
ParsedArgs ParseArgs(const Args& args, const std::set<std::string>& allowed,
                     const std::vector<std::string>& positional, size_t required,
                     const std::string& usage);

// reason, then "; " and next_step when there is one.
std::string WithNextStep(const std::string& reason, const std::string& next_step);

}  // namespace orvex_cli

#endif  // ORVEX_PROGRAMS_ORVEX_COMMAND_LINE_H_
