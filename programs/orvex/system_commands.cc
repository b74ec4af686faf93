// `orvex up`, `orvex down` and `orvex index`: the whole system in one root.
// up starts the four daemons (search, extraction, watcher, indexing) from the
// directory the tool itself is in, each detaching once it serves; down stops
// them by their pid files; index makes a plain directory searchable and
// waits, with a progress bar, until it is.
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <chrono>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iostream>
#include <string>
#include <thread>
#include <vector>

#include "command_line.h"
#include "daemon_client.h"
#include "foundation/path_prefix.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/util.h"
#include "orvex/index_mgr.h"
#include "orvex/platform/sdk_share.h"
#include "orvex/portable/atomic_file.h"
#include "orvex/portable/root.h"
#include "orvex/portable/share_registry.h"
#include "platform/program.h"
#include "terminal_text.h"

namespace orvex_cli {
namespace {

constexpr char kUpUsage[] =
    "usage: orvex up\n"
    "Starts the search daemon (kaloelasticd), the content-extraction service\n"
    "(kalocontentextractd), the file-change watcher (kalonotifyd) and the indexing\n"
    "daemon (fileindexd), in that order, from the directory this tool is in, under\n"
    "$ORVEX_ROOT. A daemon already running is left as it is. `orvex down` stops them.\n";

constexpr char kDownUsage[] =
    "usage: orvex down\n"
    "Stops the daemons that `orvex up` started (by their pid files under\n"
    "$ORVEX_ROOT/var/run), the indexing daemon first, and waits until each is gone.\n";

constexpr char kIndexUsage[] =
    "usage: orvex index PATH [--timeout SECONDS]\n"
    "Makes the directory PATH searchable: registers a share for it when no\n"
    "registered share holds it (named after the directory), adds it as an indexed\n"
    "folder, and waits with a progress bar until the indexing daemon has indexed\n"
    "it. The daemons must be running (orvex up). --timeout gives up waiting after\n"
    "SECONDS (the indexing goes on). Then: orvex search --name FRAGMENT, orvex\n"
    "search WORDS.\n";

constexpr char kIndexSocketPath[] = "/var/run/fileindexd.sock";
constexpr char kIndexDaemon[] = "the indexing daemon fileindexd";
constexpr auto kPollInterval = std::chrono::milliseconds(200);
constexpr auto kStopWait = std::chrono::seconds(30);

struct Daemon {
  const char* name;
  const char* pid_path;
};

// Started in this order, stopped in the reverse one: the indexing daemon
// needs the search daemon and the extraction service, and the watcher feeds
// it.
constexpr Daemon kDaemons[] = {
    {"kaloelasticd", "/var/run/kaloelasticd.pid"},
    {"kalocontentextractd", "/var/run/kalocontentextractd.pid"},
    {"kalonotifyd", "/var/run/kalonotifyd.pid"},
    {"fileindexd", "/var/run/fileindexd.pid"},
};

// The tools the library runs from the platform's fixed place.
constexpr const char* kPlatformTools[] = {"kalocontentextractd", "kalopmxnotify"};
constexpr char kPlatformToolDir[] = "/usr/kalo/bin";

std::string ProgramDir() {
  char path[PATH_MAX];
  const ssize_t n = ::readlink("/proc/self/exe", path, sizeof(path) - 1);
  if (n <= 0) throw orvex::Error(orvex::kErrorSystem, "cannot find the orvex program's directory");
  path[n] = '\0';
  return orvex::Dirname(path);
}

// True while pid runs. A daemon that has exited stays a zombie until its
// parent (init, for a detached daemon) reaps it, which some inits do only
// every few seconds: a zombie counts as gone.
bool Running(pid_t pid) {
  if (::kill(pid, 0) != 0) return false;
  std::ifstream stat("/proc/" + std::to_string(pid) + "/stat");
  std::string text;
  if (!std::getline(stat, text)) return true;
  const size_t name_end = text.rfind(')');  // the name may hold spaces and ')'
  return name_end == std::string::npos || name_end + 2 >= text.size() || text[name_end + 2] != 'Z';
}

// The daemon's pid when its pid file names a live process of that program;
// 0 otherwise (no file, a stale file, a reused pid).
pid_t RunningPid(const Daemon& daemon) {
  std::ifstream pid_file(orvex::portable::RootPath(daemon.pid_path));
  long pid = 0;
  if (!(pid_file >> pid) || pid <= 0 || !Running(static_cast<pid_t>(pid))) return 0;
  std::ifstream comm("/proc/" + std::to_string(pid) + "/comm");
  std::string name;
  std::getline(comm, name);
  // The kernel keeps the first 15 bytes of a program's name.
  return std::string(daemon.name).compare(0, name.size(), name) == 0 && !name.empty()
             ? static_cast<pid_t>(pid)
             : 0;
}

// In a private root the library still runs its tools from the platform's
// fixed place: point that place at the programs beside this one.
void LinkPlatformTools(const std::string& program_dir) {
  const std::string dir = orvex::portable::RootPath(kPlatformToolDir);
  if (dir == kPlatformToolDir) return;  // the real system: installed there
  orvex::portable::MakeDirectories(dir);
  for (const char* tool : kPlatformTools) {
    const std::string link = dir + "/" + tool;
    struct stat st;
    if (::lstat(link.c_str(), &st) == 0) continue;
    if (::symlink((program_dir + "/" + tool).c_str(), link.c_str()) != 0) {
      throw orvex::Error(orvex::kErrorSystem, "cannot link " + link + ": " + std::strerror(errno));
    }
  }
}

int Up(const Args& args) {
  ParseArgs(args, {}, {}, 0, kUpUsage);
  const std::string dir = ProgramDir();
  LinkPlatformTools(dir);
  for (const Daemon& daemon : kDaemons) {
    if (const pid_t pid = RunningPid(daemon)) {
      std::cout << daemon.name << ": already running (pid " << pid << ")\n";
      continue;
    }
    // Each daemon returns once it serves, so the next one finds it ready.
    const int status = orvex::sdk::RunProgram(dir + "/" + daemon.name, {});
    if (status != 0) {
      throw orvex::Error(
          orvex::kErrorSystem,
          WithNextStep(std::string("cannot start ") + daemon.name + " from " + dir +
                           " (exit status " + std::to_string(status) + ")",
                       "see the system log (journalctl -t " + std::string(daemon.name) + ")"));
    }
    std::cout << daemon.name << ": started (pid " << RunningPid(daemon) << ")\n";
  }
  std::cout << "root: " << orvex::portable::RootPath("/") << "\n";
  return kExitOk;
}

bool WaitGone(pid_t pid) {
  const auto give_up = std::chrono::steady_clock::now() + kStopWait;
  while (Running(pid)) {
    if (std::chrono::steady_clock::now() >= give_up) return false;
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
  }
  return true;
}

int Down(const Args& args) {
  ParseArgs(args, {}, {}, 0, kDownUsage);
  for (auto it = std::rbegin(kDaemons); it != std::rend(kDaemons); ++it) {
    const pid_t pid = RunningPid(*it);
    if (pid == 0) {
      std::cout << it->name << ": not running\n";
      continue;
    }
    if (::kill(pid, SIGTERM) != 0 || !WaitGone(pid)) {
      throw orvex::Error(orvex::kErrorSystem, std::string(it->name) + " (pid " +
                                                  std::to_string(pid) +
                                                  ") did not stop: " + std::strerror(errno));
    }
    std::cout << it->name << ": stopped\n";
  }
  return kExitOk;
}

// A share name for a directory: its own name, with anything a share name
// may not hold replaced, made unique among the registered shares.
std::string NewShareName(const std::string& dir,
                         const std::vector<orvex::portable::ShareRecord>& shares) {
  std::string base;
  for (char c : orvex::Basename(dir)) {
    const bool plain = std::isalnum(static_cast<unsigned char>(c)) || c == '-' || c == '_';
    base += plain ? c : '_';
  }
  if (base.empty()) base = "share";
  auto taken = [&shares](const std::string& name) {
    for (const auto& share : shares) {
      if (share.name == name) return true;
    }
    return false;
  };
  std::string name = base;
  for (int n = 2; taken(name); ++n) name = base + "-" + std::to_string(n);
  return name;
}

struct ShareOf {
  std::string name;
  std::string root;
};

// The registered share that holds dir, registering one for dir when none
// does.
ShareOf FindOrRegisterShare(const std::string& dir) {
  const std::vector<orvex::portable::ShareRecord> shares = orvex::portable::LoadShares();
  const orvex::portable::ShareRecord* best = nullptr;
  for (const auto& share : shares) {
    if (!orvex::IsSameOrBelow(dir, share.path)) continue;
    if (best == nullptr || share.path.size() > best->path.size()) best = &share;
  }
  if (best != nullptr) return {best->name, best->path};
  orvex::portable::ShareRecord share;
  share.name = NewShareName(dir, shares);
  share.path = dir;
  orvex::portable::AddShare(share);
  std::cout << "registered share " << share.name << " at " << dir << "\n";
  return {share.name, dir};
}

std::string RealDirectory(const std::string& path) {
  char real[PATH_MAX];
  if (::realpath(path.c_str(), real) == nullptr) {
    throw orvex::Error(orvex::kErrorBadArgument, path + ": " + std::strerror(errno));
  }
  struct stat st;
  if (::stat(real, &st) != 0 || !S_ISDIR(st.st_mode)) {
    throw orvex::Error(orvex::kErrorBadArgument, path + " is not a directory");
  }
  return real;
}

void AddFolder(const std::string& folder) {
  Json::Value record(Json::objectValue);
  record["path"] = folder;
  record["name"] = orvex::Basename(folder);
  for (const char* type : {"document", "audio", "video", "photo"}) record[type] = true;
  Json::Value request(Json::arrayValue);
  request.append(record);
  try {
    orvex::fileindex::FolderAdd(request, /*updater=*/false);
    std::cout << "indexing " << folder << "\n";
  } catch (const orvex::Error& e) {
    if (e.code() != orvex::kErrorFolderExists) throw;
    std::cout << folder << " is indexed already; waiting for what is pending\n";
  }
}

bool FileHasBytes(const std::string& path) {
  struct stat st;
  return ::stat(path.c_str(), &st) == 0 && st.st_size > 0;
}

struct Progress {
  bool idle = false;
  long long done = 0;
  long long todo = 0;
  double rate = 0;
};

Progress AskProgress(const std::string& share) {
  Json::Value request(Json::objectValue);
  request["type"] = "status";
  request["data"] = Json::Value();
  const Json::Value status = AskDaemon(kIndexSocketPath, kIndexDaemon, request);
  const Json::Value& entry = status["shares"][share];
  Progress progress;
  progress.idle = entry.isObject() && entry["state"].asString() == "idle";
  progress.done = entry["total_done"].asInt64();
  progress.todo = entry["todo"].asInt64();
  progress.rate = entry["rate"].asDouble();
  return progress;
}

void ShowProgress(const Progress& p, bool final_line) {
  static const bool tty = ::isatty(STDERR_FILENO) != 0;
  if (!tty && !final_line) return;
  constexpr int kWidth = 30;
  const long long all = p.done + p.todo;
  const int filled = all > 0 ? static_cast<int>(kWidth * p.done / all) : 0;
  std::string bar(static_cast<size_t>(filled), '#');
  bar.resize(kWidth, '.');
  std::cerr << "\r[" << bar << "] " << p.done << " documents";
  if (p.todo > 0 && p.rate > 0) {
    std::cerr << ", " << static_cast<long long>(p.rate) << "/s, about "
              << static_cast<long long>(p.todo / p.rate) + 1 << " s left";
  }
  std::cerr << "    " << (final_line ? "\n" : "") << std::flush;
}

// Done when nothing waits in the share's queue or its snapshot and the
// share's worker is idle with nothing to do.
bool WaitIndexed(const std::string& share, int timeout_s) {
  const std::string queue = orvex::sdk::SDKShare(share).GetQueuePath();
  const auto start = std::chrono::steady_clock::now();
  for (;;) {
    const Progress progress = AskProgress(share);
    const bool pending = FileHasBytes(queue) || FileHasBytes(queue + ".tmp");
    if (progress.idle && progress.todo == 0 && !pending) {
      ShowProgress(progress, /*final_line=*/true);
      return true;
    }
    ShowProgress(progress, /*final_line=*/false);
    if (timeout_s > 0 &&
        std::chrono::steady_clock::now() - start >= std::chrono::seconds(timeout_s)) {
      ShowProgress(progress, /*final_line=*/true);
      return false;
    }
    std::this_thread::sleep_for(kPollInterval);
  }
}

int TimeoutSeconds(const Args& args, Args& rest) {
  int timeout = 0;
  for (size_t i = 0; i < args.size(); ++i) {
    if (args[i] != "--timeout") {
      rest.push_back(args[i]);
      continue;
    }
    if (i + 1 >= args.size()) throw UsageError("--timeout needs SECONDS", kIndexUsage);
    char* end = nullptr;
    const long value = std::strtol(args[++i].c_str(), &end, 10);
    if (*end != '\0' || value < 1 || value > 86400) {
      throw UsageError("--timeout takes 1 to 86400 seconds, not " + Quote(args[i]), kIndexUsage);
    }
    timeout = static_cast<int>(value);
  }
  return timeout;
}

int Index(const Args& args) {
  if (WantsHelp(args)) {
    std::cout << kIndexUsage;
    return kExitOk;
  }
  Args rest;
  const int timeout = TimeoutSeconds(args, rest);
  const ParsedArgs parsed = ParseArgs(rest, {}, {"PATH"}, 1, kIndexUsage);
  const std::string dir = RealDirectory(parsed.positional[0]);
  // Ask before changing anything: without the daemons nothing would follow.
  AskProgress("");
  const ShareOf share = FindOrRegisterShare(dir);
  AddFolder("/" + share.name + dir.substr(share.root.size()));
  if (!WaitIndexed(share.name, timeout)) {
    std::cout << "still indexing after " << timeout << " s; `orvex index " << dir
              << "` waits again\n";
    return kExitOk;
  }
  std::cout << dir << " is searchable: orvex search --name FRAGMENT, orvex search WORDS\n";
  return kExitOk;
}

std::string ShareProgress(const Json::Value& share) {
  std::string text = share["state"].asString() + ", " +
                     std::to_string(share["total_done"].asInt64()) + " documents indexed";
  const long long todo = share["todo"].asInt64();
  const double rate = share["rate"].asDouble();
  if (todo > 0) text += ", " + std::to_string(todo) + " to do";
  if (todo > 0 && rate > 0) {
    text += " at " + std::to_string(static_cast<long long>(rate)) + "/s, about " +
            std::to_string(static_cast<long long>(todo / rate) + 1) + " s left";
  }
  const std::string error = share["last_error"].asString();
  if (!error.empty()) text += "; last error: " + error;
  return text;
}

}  // namespace

void PrintDaemonStatus() {
  bool any = false;
  for (const Daemon& daemon : kDaemons) any = any || RunningPid(daemon) != 0;
  if (!any) {
    std::cout << "daemons: none running (start them: orvex up)\n";
    return;
  }
  for (const Daemon& daemon : kDaemons) {
    const pid_t pid = RunningPid(daemon);
    std::cout << daemon.name << ": "
              << (pid != 0 ? "running (pid " + std::to_string(pid) + ")"
                           : std::string("not running"))
              << "\n";
  }
  Json::Value request(Json::objectValue);
  request["type"] = "status";
  request["data"] = Json::Value();
  Json::Value status;
  try {
    status = AskDaemon(kIndexSocketPath, kIndexDaemon, request);
  } catch (const orvex::Error& e) {
    std::cout << "progress: unknown (" << e.reason() << ")\n";
    return;
  }
  const Json::Value& shares = status["shares"];
  for (const std::string& name : shares.getMemberNames()) {
    std::cout << "share " << name << ": " << ShareProgress(shares[name]) << "\n";
  }
}

int RunUpCommand(const Args& args) {
  if (WantsHelp(args)) {
    std::cout << kUpUsage;
    return kExitOk;
  }
  return Up(args);
}

int RunDownCommand(const Args& args) {
  if (WantsHelp(args)) {
    std::cout << kDownUsage;
    return kExitOk;
  }
  return Down(args);
}

int RunIndexCommand(const Args& args) { return Index(args); }

}  // namespace orvex_cli
