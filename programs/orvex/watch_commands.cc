// `orvex watch status [--json]`: what the file-change watcher (kalonotifyd)
// last said about itself in its status file: whether it runs, the folders it
// watches, its inotify watches and the lines it has written to each queue.
#include <signal.h>

#include <cerrno>
#include <ctime>
#include <iostream>
#include <string>
#include <vector>

#include "command_line.h"
#include "kalo/kalo_notify.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/portable/root.h"
#include "terminal_text.h"

namespace orvex_cli {
namespace {

constexpr char kWatchUsage[] =
    "usage: orvex watch status [--json]\n"
    "Shows what the file-change watcher kalonotifyd reports in its status file\n"
    "/var/run/kalonotifyd.status.json (rewritten every few seconds and when it\n"
    "stops): whether it runs, each registered folder, the number of inotify\n"
    "watches, and the lines written to each queue.\n"
    "  --json  print the status file's object as it stands\n";

std::string Count(const Json::Value& v) { return std::to_string(v.asUInt64()); }

// "running (pid N)", or why not: a status file outlives its daemon.
std::string State(const Json::Value& status) {
  const int pid = status["pid"].asInt();
  if (!status["running"].asBool()) return "stopped";
  if (pid > 0 && (::kill(pid, 0) == 0 || errno == EPERM)) {
    return "running (pid " + std::to_string(pid) + ")";
  }
  return "not running (pid " + std::to_string(pid) + " ended without a clean stop)";
}

void PrintStatus(const Json::Value& status) {
  const long long age = static_cast<long long>(std::time(nullptr)) - status["updated"].asInt64();
  std::cout << "kalonotifyd: " << State(status) << ", status written " << age << " s ago\n"
            << "watches: " << Count(status["watches"])
            << ", kernel queue overflows: " << Count(status["overflows"])
            << ", watch limit reached: " << Count(status["watch_limit_hits"]) << "\n";
  std::vector<std::vector<std::string>> folders = {{"FOLDER", "STATE", "QUEUE"}};
  for (const Json::Value& f : status["folders"]) {
    folders.push_back({Quote(f["path"].asString()), f["watched"].asBool() ? "watched" : "missing",
                       Quote(f["queue"].asString())});
  }
  std::cout << "\n" << FormatTable(folders);
  std::vector<std::vector<std::string>> queues = {
      {"QUEUE", "WRITTEN", "WAITING", "CRASH MARKS", "FAILED APPENDS"}};
  for (const Json::Value& q : status["queues"]) {
    queues.push_back({Quote(q["queue"].asString()), Count(q["lines_written"]),
                      Count(q["lines_waiting"]), Count(q["crash_marks"]),
                      Count(q["failed_appends"])});
  }
  std::cout << "\n" << FormatTable(queues);
}

int Status(const Args& args) {
  if (WantsHelp(args)) {
    std::cout << kWatchUsage;
    return kExitOk;
  }
  const ParsedArgs parsed = ParseArgs(args, {"--json"}, {}, 0, kWatchUsage);
  const std::string path = orvex::portable::RootPath(KALO::KALONOTIFYD::kNotifyStatusPath);
  Json::Value status;
  if (!orvex::fromFile(status, path) || !status.isObject()) {
    const int err = errno;
    throw orvex::Error(orvex::kErrorLoadJson,
                       "cannot read " + path + (err ? ": " + Cause(err) : ": not a JSON object") +
                           "; kalonotifyd writes it while it runs: start it with `kalonotifyd`");
  }
  if (parsed.Has("--json")) {
    std::cout << orvex::toString(status) << "\n";
  } else {
    PrintStatus(status);
  }
  return kExitOk;
}

}  // namespace

int RunWatchCommand(const Args& args) {
  static const std::vector<Subcommand> kSubcommands = {
      {"status", Status},
  };
  return RunSubcommand(args, "watch", kSubcommands, kWatchUsage);
}

}  // namespace orvex_cli
