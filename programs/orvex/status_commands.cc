// `orvex status`, `orvex pause` and `orvex resume`: the index status file
// through StatusMgr, which also tells the running indexing daemon about a
// pause or resume.
#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdint>
#include <cstdlib>
#include <ctime>
#include <functional>
#include <iostream>
#include <map>
#include <sstream>
#include <string>

#include "command_line.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/status/status_mgr.h"

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
    "and tells the indexing daemon. When the daemon is not running the pause is\n"
    "still saved and takes effect when it starts, but the command fails (status 2).\n";

constexpr char kResumeUsage[] =
    "usage: orvex resume\n"
    "Resumes indexing and tells the indexing daemon. When the daemon is not running\n"
    "the resume is still saved, but the command fails (status 2).\n";

std::string LocalTime(int64_t seconds) {
  const time_t t = static_cast<time_t>(seconds);
  struct tm local;
  char text[64];
  if (::localtime_r(&t, &local) == nullptr ||
      std::strftime(text, sizeof(text), "%Y-%m-%d %H:%M:%S %Z", &local) == 0) {
    return std::to_string(seconds);
  }
  return text;
}

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
  size_t width = sizeof("indexing:") - 1;
  for (const auto& entry : shares) width = std::max(width, entry.first.size() + 1);
  auto line = [width](std::string label, const std::string& value) {
    label += ":";
    label.resize(std::max(width, label.size()), ' ');
    std::cout << label << " " << value << "\n";
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

// Whether the status file now holds what the failed Pause or Resume meant to
// store: then only telling the daemon failed.
bool StatusFileHolds(const std::function<bool(int64_t)>& wanted) {
  try {
    return wanted(StatusMgr().GetPauseInfo());
  } catch (const orvex::Error&) {
    return false;
  }
}

// Runs a pause or resume. An error of the daemon channel after the file was
// saved is reported as such, so the administrator knows the change stands.
int ChangePause(const std::function<void(StatusMgr&)>& change,
                const std::function<bool(int64_t)>& wanted, const std::string& what) {
  StatusMgr mgr;
  try {
    change(mgr);
  } catch (const orvex::Error& e) {
    if (e.code() != orvex::kErrorSystem || !StatusFileHolds(wanted)) throw;
    std::cerr << "orvex: indexing daemon not reachable (code " << e.code() << ": " << e.reason()
              << "); the " << what << " is saved and takes effect when it starts\n";
    return kExitFailure;
  }
  return kExitOk;
}

int ParseHours(const std::string& text) {
  errno = 0;
  char* end = nullptr;
  const long hours = std::strtol(text.c_str(), &end, 10);
  if (text.empty() || *end != '\0' || errno != 0 || hours < INT_MIN || hours > INT_MAX) {
    throw UsageError("HOURS must be a whole number: " + text, kPauseUsage);
  }
  return static_cast<int>(hours);
}

}  // namespace

int RunStatusCommand(const Args& args) {
  if (WantsHelp(args)) {
    std::cout << kStatusUsage;
    return kExitOk;
  }
  const ParsedArgs parsed = ParseArgs(args, {"--json"}, 0, 0, kStatusUsage);
  const StatusMgr mgr;
  const int64_t resume_time = mgr.GetPauseInfo();
  const std::map<std::string, int> shares = mgr.GetAllShareStatus();
  if (parsed.Has("--json")) {
    PrintStatusJson(resume_time, shares);
  } else {
    PrintStatusText(resume_time, shares);
  }
  return kExitOk;
}

int RunPauseCommand(const Args& args) {
  if (WantsHelp(args)) {
    std::cout << kPauseUsage;
    return kExitOk;
  }
  const ParsedArgs parsed = ParseArgs(args, {}, 0, 1, kPauseUsage);
  const int hours = parsed.positional.empty() ? 0 : ParseHours(parsed.positional[0]);
  // The stored time is taken inside Pause; it lies between these two.
  const time_t before = orvex::Now();
  auto wanted = [hours, before](int64_t stored) {
    return hours >= 0 && (stored == StatusMgr::ResumeTimeFor(hours, before) ||
                          stored == StatusMgr::ResumeTimeFor(hours, orvex::Now()));
  };
  const int status = ChangePause([hours](StatusMgr& mgr) { mgr.Pause(hours); }, wanted, "pause");
  if (status != kExitOk) return status;
  const int64_t resume_time = StatusMgr().GetPauseInfo();
  std::cout << "indexing " << PauseState(resume_time) << "\n";
  return kExitOk;
}

int RunResumeCommand(const Args& args) {
  if (WantsHelp(args)) {
    std::cout << kResumeUsage;
    return kExitOk;
  }
  ParseArgs(args, {}, 0, 0, kResumeUsage);
  auto wanted = [](int64_t stored) { return stored == orvex::fileindex::kResumeTimeRunning; };
  const int status = ChangePause([](StatusMgr& mgr) { mgr.Resume(); }, wanted, "resume");
  if (status != kExitOk) return status;
  std::cout << "indexing running\n";
  return kExitOk;
}

}  // namespace orvex_cli
