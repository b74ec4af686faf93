// `orvex status`, `orvex pause` and `orvex resume`: the index status file
// through StatusMgr, which also tells the running indexing daemon about a
// pause or resume.
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <functional>
#include <iostream>
#include <map>
#include <optional>
#include <sstream>
#include <string>

#include "command_line.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/portable/file_descriptor.h"
#include "orvex/status/status_mgr.h"
#include "state_files.h"
#include "terminal_text.h"

namespace orvex_cli {
namespace {

using orvex::fileindex::StatusMgr;

constexpr char kStatusUsage[] =
    "usage: orvex status [--json]\n"
    "Shows whether indexing runs or is paused (and until when, in local time),\n"
    "and the status of each share that has an entry in the status file.\n"
    "  --json  print one JSON object instead\n";

constexpr char kPauseUsage[] =
    "usage: orvex pause [HOURS]\n"
    "Pauses indexing for HOURS hours, or with no end when HOURS is 0 (the default),\n"
    "saves the pause in the status file and tells the indexing daemon.\n"
    "The status file keeps the end of a pause as a 32-bit time: a pause that would\n"
    "end after 2038-01-19 03:14:07 UTC is refused (error 120).\n"
    "When the indexing daemon is not running (no socket, or nothing listening on it)\n"
    "the pause is saved all the same and the command says so and exits with status 0:\n"
    "the daemon reads the pause when it starts. Exit status 2 when the pause cannot\n"
    "be saved, or when a running daemon does not take it (it is saved then too).\n";

constexpr char kResumeUsage[] =
    "usage: orvex resume\n"
    "Resumes indexing: saves it in the status file and tells the indexing daemon.\n"
    "When the indexing daemon is not running the resume is saved all the same and\n"
    "the command says so and exits with status 0. Exit status 2 when the resume\n"
    "cannot be saved, or when a running daemon does not take it (it is saved then too).\n";

// The library reads the clock again a moment after the tool checked the
// pause's end; this much room keeps that end inside 32 bits.
constexpr int64_t kClockSlackSeconds = 60;
constexpr int64_t kSecondsPerHour = 3600;
constexpr int64_t kLatestResumeTime = INT32_MAX;
// With no daemon to wait for, the command channel's connect retries (four
// seconds) would only delay the answer. Lock retries still wait this long
// each, so that a writer holding the status lock for a moment is waited for.
constexpr unsigned long kShortWaitMicros = 10000;

std::string PauseState(int64_t resume_time) {
  if (resume_time == orvex::fileindex::kResumeTimeRunning) return "running";
  if (resume_time == orvex::fileindex::kResumeTimeNoEnd) return "paused with no end";
  std::string state = "paused until " + LocalTime(resume_time);
  if (resume_time < orvex::Now()) state += " (that time has passed)";
  return state;
}

std::string ShareState(int flags) {
  std::string text;
  if (flags & orvex::fileindex::NeedReindex) text = "needs re-index";
  const int other = flags & ~static_cast<int>(orvex::fileindex::NeedReindex);
  if (other != 0) {
    std::ostringstream hex;
    hex << "other flags 0x" << std::hex << other;
    text += (text.empty() ? "" : ", ") + hex.str();
  }
  return text.empty() ? "ok" : text;
}

void PrintStatusText(int64_t resume_time, const std::map<std::string, int>& shares) {
  size_t width = DisplayWidth("indexing:");
  for (const auto& entry : shares) width = std::max(width, DisplayWidth(entry.first + ":"));
  auto line = [width](const std::string& label, const std::string& value) {
    std::cout << PadToWidth(label + ":", width) << " " << value << "\n";
  };
  line("indexing", PauseState(resume_time));
  for (const auto& entry : shares) line(entry.first, ShareState(entry.second));
}

void PrintStatusJson(int64_t resume_time, const std::map<std::string, int>& shares) {
  Json::Value doc(Json::objectValue);
  doc["state"] = resume_time == orvex::fileindex::kResumeTimeRunning ? "running" : "paused";
  doc["resume_time"] = static_cast<Json::Int64>(resume_time);
  if (resume_time != orvex::fileindex::kResumeTimeRunning &&
      resume_time != orvex::fileindex::kResumeTimeNoEnd) {
    doc["resume_at"] = LocalTime(resume_time);
  }
  Json::Value& list = doc["shares"] = Json::Value(Json::objectValue);
  for (const auto& entry : shares) {
    Json::Value& share = list[entry.first];
    share["flags"] = entry.second;
    share["need_reindex"] = (entry.second & orvex::fileindex::NeedReindex) != 0;
  }
  std::cout << orvex::toString(doc) << "\n";
}

// The status file's pause and share flags. A member of the wrong type is
// reported by the library as "Not a string"; the tool adds where it is.
void ReadStatus(int64_t& resume_time, std::map<std::string, int>& shares) {
  ExplainStateFileErrors({StatusFile()}, "", [&] {
    const StatusMgr mgr;
    try {
      resume_time = mgr.GetPauseInfo();
      shares = mgr.GetAllShareStatus();
    } catch (const orvex::Error& e) {
      if (e.code() != orvex::kErrorBadArgument) throw;
      throw orvex::Error(e.code(), e.reason() + " (in the status file " + StatusFile().path +
                                       "); repair it: \"resume_time\" holds an integer and "
                                       "\"share\" an object of unsigned integers");
    }
  });
}

// Why the daemon is surely not running, judged from its socket file before
// anything is sent; "" when a socket is there (whether anything listens is
// then learnt by trying).
std::string SocketAbsence(const std::string& socket_path) {
  struct stat st;
  if (::lstat(socket_path.c_str(), &st) != 0) {
    return errno == ENOENT ? "no socket at " + socket_path : "";
  }
  if (!S_ISSOCK(st.st_mode)) return socket_path + " is not a socket";
  return "";
}

// After a failed exchange: "nothing listens on ..." when the socket refuses
// connections (a daemon that died left it behind), "" when something does
// listen.
std::string RefusedConnection(const std::string& socket_path) {
  const orvex::FileDescriptor fd(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  struct sockaddr_un address;
  std::memset(&address, 0, sizeof(address));
  address.sun_family = AF_UNIX;
  if (!fd || socket_path.size() >= sizeof(address.sun_path)) return "";
  std::memcpy(address.sun_path, socket_path.data(), socket_path.size());
  if (::connect(fd.get(), reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0) return "";
  if (errno == ECONNREFUSED) return "nothing listens on " + socket_path;
  return errno == ENOENT ? "no socket at " + socket_path : "";
}

orvex::SystemHooks ShortWaits() {
  orvex::SystemHooks hooks;
  hooks.sleep_for = [](unsigned long micros) { ::usleep(std::min(micros, kShortWaitMicros)); };
  return hooks;
}

// Whether the status file now holds what the failed Pause or Resume meant to
// store: then only telling the daemon failed.
bool StatusFileHolds(const std::function<bool(int64_t)>& wanted) {
  try {
    return wanted(StatusMgr().GetPauseInfo());
  } catch (const orvex::Error&) {
    return false;
  }
}

// "" when the daemon was told, else why it is not running.
std::string ChangePause(const std::function<void(StatusMgr&)>& change,
                        const std::function<bool(int64_t)>& wanted, const std::string& what) {
  const std::string socket_path = DaemonSocketPath();
  std::string not_running = SocketAbsence(socket_path);
  ExplainStateFileErrors({StatusFile()}, StatusLockPath(), [&] {
    StatusMgr mgr;
    try {
      std::optional<orvex::ScopedSystemHooks> quick;
      if (!not_running.empty()) quick.emplace(ShortWaits());
      change(mgr);
      not_running.clear();  // a daemon that came up meanwhile took it
    } catch (const orvex::Error& e) {
      if (e.code() != orvex::kErrorSystem || !StatusFileHolds(wanted)) throw;
      if (not_running.empty()) not_running = RefusedConnection(socket_path);
      if (!not_running.empty()) return;
      throw orvex::Error(e.code(), "the " + what + " is saved, but the indexing daemon on " +
                                       socket_path + " did not take it: " + e.reason() +
                                       "; restart the daemon, which reads the saved state "
                                       "when it starts");
    }
  });
  return not_running;
}

void PrintNotRunning(const std::string& why, const std::string& what) {
  if (why.empty()) return;
  std::cout << "the indexing daemon is not running (" << why << "); the " << what
            << " is saved and takes effect when it starts\n";
}

// HOURS as given; a number past the range of long long counts as huge (or
// hugely negative), which the checks below refuse as they should.
long long ParseHours(const std::string& text) {
  errno = 0;
  char* end = nullptr;
  const long long hours = std::strtoll(text.c_str(), &end, 10);
  if (text.empty() || *end != '\0' || (errno != 0 && errno != ERANGE)) {
    throw UsageError("HOURS must be a whole number of hours, not " + Quote(text), kPauseUsage);
  }
  return hours;
}

// The status file keeps the end of a pause in 32 bits: an end past 2038
// would wrap into the past and end the pause at once. The library stores
// what it computes; the tool refuses such a pause before it is made.
void CheckPauseEndFits(long long hours, const std::string& text) {
  const int64_t now = static_cast<int64_t>(orvex::Now());
  const int64_t max_hours = (kLatestResumeTime - kClockSlackSeconds - now) / kSecondsPerHour;
  if (hours <= max_hours) return;
  const std::string next_step = max_hours >= 1
                                    ? "pause for at most " + std::to_string(max_hours) +
                                          " hours, or with no end: orvex pause 0"
                                    : "only a pause with no end can be saved: orvex pause 0";
  throw orvex::Error(orvex::kErrorBadArgument,
                     "a pause of " + text + " hours would end after " +
                         LocalTime(kLatestResumeTime) +
                         ", the latest end of a pause the status file can hold; " + next_step);
}

}  // namespace

int RunStatusCommand(const Args& args) {
  if (WantsHelp(args)) {
    std::cout << kStatusUsage;
    return kExitOk;
  }
  const ParsedArgs parsed = ParseArgs(args, {"--json"}, {}, 0, kStatusUsage);
  int64_t resume_time = orvex::fileindex::kResumeTimeRunning;
  std::map<std::string, int> shares;
  ReadStatus(resume_time, shares);
  if (parsed.Has("--json")) {
    PrintStatusJson(resume_time, shares);
  } else {
    PrintStatusText(resume_time, shares);
    PrintDaemonStatus();
  }
  return kExitOk;
}

int RunPauseCommand(const Args& args) {
  if (WantsHelp(args)) {
    std::cout << kPauseUsage;
    return kExitOk;
  }
  const ParsedArgs parsed = ParseArgs(args, {}, {"HOURS"}, 0, kPauseUsage);
  const std::string text = parsed.positional.empty() ? "0" : parsed.positional[0];
  const long long asked = ParseHours(text);
  if (asked > 0) CheckPauseEndFits(asked, text);
  // Negative hours go to the library, which refuses them with its own
  // error; only their size is cut to fit.
  const int hours = static_cast<int>(std::max<long long>(asked, -1));
  const time_t before = orvex::Now();  // the library reads the clock in between
  auto wanted = [hours, before](int64_t stored) {
    return hours >= 0 && (stored == StatusMgr::ResumeTimeFor(hours, before) ||
                          stored == StatusMgr::ResumeTimeFor(hours, orvex::Now()));
  };
  std::string not_running;
  try {
    not_running = ChangePause([hours](StatusMgr& mgr) { mgr.Pause(hours); }, wanted, "pause");
  } catch (const orvex::Error& e) {
    if (e.code() != orvex::kErrorBadArgument) throw;
    throw orvex::Error(e.code(), e.reason() + "; give HOURS as 0 (no end) or more");
  }
  int64_t resume_time = orvex::fileindex::kResumeTimeRunning;
  std::map<std::string, int> shares;
  ReadStatus(resume_time, shares);
  std::cout << "indexing " << PauseState(resume_time) << "\n";
  PrintNotRunning(not_running, "pause");
  return kExitOk;
}

int RunResumeCommand(const Args& args) {
  if (WantsHelp(args)) {
    std::cout << kResumeUsage;
    return kExitOk;
  }
  ParseArgs(args, {}, {}, 0, kResumeUsage);
  auto wanted = [](int64_t stored) { return stored == orvex::fileindex::kResumeTimeRunning; };
  const std::string not_running =
      ChangePause([](StatusMgr& mgr) { mgr.Resume(); }, wanted, "resume");
  std::cout << "indexing running\n";
  PrintNotRunning(not_running, "resume");
  return kExitOk;
}

}  // namespace orvex_cli
