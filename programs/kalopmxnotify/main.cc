// kalopmxnotify: the desktop notification tool. The library runs it to tell
// a group of users (normally the administrators) about a condition that
// stops indexing. Each notification goes to the system log and is appended
// as one JSON line to the notifications file that the web page shows
// (doc/notifications.md describes the file).
//
//   kalopmxnotify -c APP [-b BOOL] [-e BOOL] TARGET KEY... [LINK_OPEN LINK_CLOSE]
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <ctime>
#include <iostream>
#include <string>
#include <vector>

#include "orvex/foundation/json.h"
#include "orvex/portable/file_descriptor.h"
#include "orvex/portable/root.h"
#include "orvex/portable/utf8_text.h"
#include "orvex/version.h"

namespace {

constexpr int kExitRecordFailed = 1;
constexpr int kExitUsage = 2;
constexpr char kIdent[] = "kalopmxnotify";
constexpr char kNotificationsDir[] = "/var/lib/orvex";
constexpr char kNotificationsPath[] = "/var/lib/orvex/notifications.jsonl";

constexpr char kUsage[] =
    "usage: kalopmxnotify -c APP [-b BOOL] [-e BOOL] [--] TARGET KEY... [LINK_OPEN LINK_CLOSE]\n"
    "Sends a desktop notification from application APP to TARGET (a group such as\n"
    "@administrators, or a user). Each KEY is a string key the desktop resolves\n"
    "to text (\"app:displayname\", \"error:index_no_space\"); an optional pair of\n"
    "link tags (an opening \"<a ...>\" and a closing \"</a>\") wraps a link.\n"
    "  -c APP     the sending application (required)\n"
    "  -b BOOL    flag b, \"true\" or \"false\"\n"
    "  -e BOOL    flag e, \"true\" or \"false\"\n"
    "  --         ends the options (for a TARGET that begins with \"-\")\n"
    "  --help     print this help\n"
    "  --version  print the version\n"
    "The notification is written to the system log and appended to\n"
    "/var/lib/orvex/notifications.jsonl (under ORVEX_ROOT when set). Bytes of the\n"
    "arguments that are not UTF-8 are recorded as U+FFFD, the replacement character.\n"
    "Exit status: 0 on success, 1 when it cannot be recorded, 2 for bad usage.\n";

struct Notification {
  std::string app;
  Json::Value flags{Json::objectValue};  // "b", "e": only those given
  std::string target;
  std::vector<std::string> keys;
  std::string link_open;  // both empty: no link
  std::string link_close;
};

bool IsLinkTag(const std::string& arg) { return !arg.empty() && arg[0] == '<'; }
bool IsOptionWord(const std::string& arg) { return arg.size() > 1 && arg[0] == '-'; }

bool IsClosingTag(const std::string& arg) { return arg.compare(0, 2, "</") == 0; }

int UsageError(const std::string& why) {
  std::cerr << "kalopmxnotify: " << why << "\n" << kUsage;
  return kExitUsage;
}

// "--help" and "--version" print and end the run with status 0; -1 for any
// other word.
int InfoOption(const std::string& option) {
  if (option == "--help") {
    std::cout << kUsage;
    return 0;
  }
  if (option == "--version") {
    std::cout << kIdent << " " << ORVEX_VERSION << "\n";
    return 0;
  }
  return -1;
}

// Reads "-c APP", "-b BOOL", "-e BOOL" (and "--help", "--version", "--")
// from args[i...]; i is left at the first argument that is not an option.
// Returns -1 to go on, else the exit status.
int ParseOptions(const std::vector<std::string>& args, size_t& i, Notification& n) {
  for (; i < args.size() && IsOptionWord(args[i]); i += 2) {
    const std::string& option = args[i];
    if (option == "--") {
      ++i;
      break;
    }
    if (InfoOption(option) >= 0) return 0;
    if (option != "-c" && option != "-b" && option != "-e") {
      return UsageError("unknown option " + option);
    }
    if (i + 1 >= args.size()) return UsageError("option " + option + " needs a value");
    const std::string& value = args[i + 1];
    if (option == "-c") {
      if (value.empty()) return UsageError("empty application name");
      n.app = value;
    } else {
      if (value != "true" && value != "false") {
        return UsageError("option " + option + " takes true or false, not \"" + value + "\"");
      }
      n.flags[option.substr(1)] = value == "true";
    }
  }
  if (n.app.empty()) return UsageError("missing -c APP");
  return -1;
}

// TARGET KEY... [LINK_OPEN LINK_CLOSE] from args[i...].
int ParsePositionals(const std::vector<std::string>& args, size_t i, Notification& n) {
  if (i >= args.size() || args[i].empty() || IsLinkTag(args[i])) {
    return UsageError("missing TARGET");
  }
  n.target = args[i++];
  for (; i < args.size() && !IsLinkTag(args[i]); ++i) {
    if (args[i].empty()) return UsageError("empty string key");
    n.keys.push_back(args[i]);
  }
  if (n.keys.empty()) return UsageError("missing KEY");
  if (i == args.size()) return -1;
  if (args.size() - i != 2 || IsClosingTag(args[i]) || !IsClosingTag(args[i + 1])) {
    return UsageError("a link needs one opening and one closing tag, after the keys");
  }
  n.link_open = args[i];
  n.link_close = args[i + 1];
  return -1;
}

int ParseArgs(int argc, char** argv, Notification& n) {
  std::vector<std::string> args;
  // The notifications file is UTF-8 read by a web page, which would reject
  // a line with stray bytes, and the arguments come from whatever runs the
  // tool: each ill-formed sequence becomes one U+FFFD.
  for (int i = 1; i < argc; ++i) args.push_back(orvex::portable::ToValidUtf8(argv[i]));
  size_t i = 0;
  const int status = ParseOptions(args, i, n);
  if (status >= 0) return status;
  return ParsePositionals(args, i, n);
}

Json::Value ToJson(const Notification& n) {
  Json::Value line(Json::objectValue);
  line["time"] = static_cast<Json::Int64>(std::time(nullptr));
  line["app"] = n.app;
  line["to"] = n.target;
  Json::Value& keys = line["keys"] = Json::Value(Json::arrayValue);
  for (const auto& key : n.keys) keys.append(key);
  Json::Value link;  // null without a link
  if (!n.link_open.empty()) {
    link["open"] = n.link_open;
    link["close"] = n.link_close;
  }
  line["link"] = link;
  line["flags"] = n.flags;
  return line;
}

// mkdir -p, each new directory mode 0755.
bool MakeDirs(const std::string& dir) {
  for (size_t slash = dir.find('/', 1);; slash = dir.find('/', slash + 1)) {
    const std::string prefix = dir.substr(0, slash);
    if (::mkdir(prefix.c_str(), 0755) != 0 && errno != EEXIST) return false;
    if (slash == std::string::npos) return true;
  }
}

// Appends line under an exclusive flock, so that notifications sent at the
// same time never interleave; one write of the whole line.
bool AppendLine(const std::string& path, const std::string& line) {
  // Closing releases the lock; the descriptor keeps errno when it closes.
  const orvex::FileDescriptor fd(
      ::open(path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0644));
  if (!fd) return false;
  bool ok = ::flock(fd.get(), LOCK_EX) == 0;
  for (size_t done = 0; ok && done < line.size();) {
    const ssize_t n = ::write(fd.get(), line.data() + done, line.size() - done);
    if (n < 0 && errno == EINTR) continue;
    ok = n > 0;
    if (ok) done += static_cast<size_t>(n);
  }
  return ok;
}

void LogToSyslog(const Notification& n) {
  std::string keys;
  for (const auto& key : n.keys) keys += (keys.empty() ? "" : " ") + key;
  ::openlog(kIdent, LOG_PID, LOG_USER);
  ::syslog(LOG_NOTICE, "notification from %s to %s: %s%s", n.app.c_str(), n.target.c_str(),
           keys.c_str(), n.link_open.empty() ? "" : " (with link)");
  ::closelog();
}

int Record(const Notification& n) {
  LogToSyslog(n);
  const std::string dir = orvex::portable::RootPath(kNotificationsDir);
  const std::string path = orvex::portable::RootPath(kNotificationsPath);
  if (!MakeDirs(dir) || !AppendLine(path, orvex::toString(ToJson(n)) + "\n")) {
    std::cerr << "kalopmxnotify: cannot record the notification in " << path << ": "
              << std::strerror(errno) << "\n";
    return kExitRecordFailed;
  }
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  Notification notification;
  const int status = ParseArgs(argc, argv, notification);
  if (status >= 0) return status;
  return Record(notification);
}
