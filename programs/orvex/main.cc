// orvex: the administrator's command-line tool for the file index. It manages
// the share registry, shows the index status, and pauses or resumes indexing
// (telling the indexing daemon at once). Fixed paths follow ORVEX_ROOT like
// everything else in the system.
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <iostream>
#include <new>
#include <string>

#include "command_line.h"
#include "orvex/foundation/error.h"
#include "orvex/portable/atomic_file.h"
#include "orvex/version.h"
#include "terminal_text.h"

namespace orvex_cli {
namespace {

// The command table. To add a command group, say `orvex folder ...`:
//   1. write folder_commands.cc in this directory defining
//      `int RunFolderCommand(const Args& args)`: it gets the words after
//      "folder", prints its help for "--help", returns kExitOk, and throws
//      UsageError, orvex::Error or std::exception on failure (main reports
//      them and exits with kExitFailure);
//   2. declare it in command_line.h beside the others;
//   3. add one line {"folder", "<one-line summary>", RunFolderCommand} below.
// The build picks the new file up by itself.
const CommandGroup kCommands[] = {
    {"up", "start the search, extraction, watcher and indexing daemons", RunUpCommand},
    {"down", "stop the daemons that up started", RunDownCommand},
    {"index", "make a directory searchable and wait until it is", RunIndexCommand},
    {"share", "manage the share registry and pause, resume or forget shares", RunShareCommand},
    {"status", "show whether indexing is paused and each share's status", RunStatusCommand},
    {"pause", "pause indexing for HOURS hours, or with no end", RunPauseCommand},
    {"resume", "resume indexing", RunResumeCommand},
    {"folder", "list, show, add, change, re-index or delete indexed folders", RunFolderCommand},
    {"extract", "show what content extraction gives for files", RunExtractCommand},
    {"watch", "show what the file-change watcher reports", RunWatchCommand},
    {"search", "search the indexed shares by name, text, type or folder", RunSearchCommand},
    {"stats", "show the search indexes: documents, size, paused", RunStatsCommand},
    {"volume", "pause, resume or forget the indexed shares of a volume", RunVolumeCommand},
    {"services", "start or stop the services indexing needs", RunServicesCommand},
};

std::string Usage() {
  std::string usage =
      "usage: orvex COMMAND [ARGS...]\n"
      "Manages the Orvex file index. Run `orvex COMMAND --help` for a command's help.\n"
      "Commands:\n";
  for (const CommandGroup& group : kCommands) {
    std::string name = group.name;
    name.resize(8, ' ');
    usage += "  " + name + "  " + group.summary + "\n";
  }
  usage +=
      "Options: --help (also after any command), --version.\n"
      "Fixed paths (share registry, status file, daemon sockets) are taken under\n"
      "$ORVEX_ROOT when it is set; for a user other than root it defaults to\n"
      "~/.orvex, a private root, so the whole system runs without privileges.\n"
      "Exit status: 0 on success, 2 on any failure or bad usage, which is reported\n"
      "as \"orvex: error CODE: REASON\" (code 120 for bad usage, followed by the usage).\n";
  return usage;
}

const CommandGroup* FindGroup(const std::string& name) {
  for (const CommandGroup& group : kCommands) {
    if (name == group.name) return &group;
  }
  return nullptr;
}

int Dispatch(const Args& args) {
  if (args.empty()) throw UsageError("missing command", Usage());
  if (args[0] == "--help") {
    std::cout << Usage();
    return kExitOk;
  }
  if (args[0] == "--version") {
    std::cout << "orvex " << ORVEX_VERSION << "\n";
    return kExitOk;
  }
  const CommandGroup* group = FindGroup(args[0]);
  if (group == nullptr) {
    const bool option = args[0].size() > 1 && args[0][0] == '-';
    throw UsageError((option ? "unknown option " : "unknown command ") + Quote(args[0]), Usage());
  }
  return group->run(Args(args.begin() + 1, args.end()));
}

void PrintError(int code, const std::string& reason) {
  std::cerr << "orvex: error " << code << ": " << reason << "\n";
}

// A user other than root cannot write the system's fixed paths: unless
// ORVEX_ROOT says where, such a user's whole system lives in ~/.orvex, for
// this command and the daemons it starts.
void UsePrivateRootUnlessRoot() {
  const char* root = std::getenv("ORVEX_ROOT");
  if ((root != nullptr && root[0] != '\0') || ::geteuid() == 0) return;
  const char* home = std::getenv("HOME");
  if (home == nullptr || home[0] != '/') {
    throw orvex::Error(orvex::kErrorBadArgument,
                       "set ORVEX_ROOT to a directory of yours: HOME is not set");
  }
  const std::string private_root = std::string(home) + "/.orvex";
  if (!orvex::portable::MakeDirectories(private_root)) {
    throw orvex::Error(orvex::kErrorSystem,
                       "cannot make " + private_root + ": " + std::strerror(errno));
  }
  ::setenv("ORVEX_ROOT", private_root.c_str(), /*overwrite=*/1);
}

// Exceptions stop here: each becomes one "orvex: error CODE: REASON" line on
// standard error. The commands put what, where, why and what to do into the
// reasons; what reaches this far unexplained is at least named.
int Main(const Args& args) {
  try {
    UsePrivateRootUnlessRoot();
    return Dispatch(args);
  } catch (const UsageError& e) {
    PrintError(orvex::kErrorBadArgument, e.what());
    std::cerr << e.usage();
  } catch (const orvex::Error& e) {
    PrintError(e.code(), e.reason());
  } catch (const std::bad_alloc&) {
    PrintError(orvex::kErrorSystem, "out of memory");
  } catch (const std::exception& e) {
    PrintError(orvex::kErrorSystem, e.what());
  }
  return kExitFailure;
}

}  // namespace
}  // namespace orvex_cli

int main(int argc, char** argv) {
  const int status = orvex_cli::Main(orvex_cli::Args(argv + 1, argv + argc));
  std::cout.flush();
  return std::cout ? status : orvex_cli::kExitFailure;
}
