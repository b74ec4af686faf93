#include "state_files.h"

#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <cerrno>

#include "command_line.h"
#include "orvex/communication.h"
#include "orvex/config/folder_mgr.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/portable/atomic_file.h"
#include "orvex/portable/root.h"
#include "orvex/status/status_mgr.h"
#include "terminal_text.h"

namespace orvex_cli {
namespace {

using orvex::portable::RootPath;

// What is wrong with a file, as the end of a sentence that names it
// (" is a directory"), and what to do; cause "" when nothing is.
struct Diagnosis {
  std::string cause;
  std::string next_step;
};

Diagnosis FromErrno(const std::string& failed, int err) {
  return {" " + failed + ": " + Cause(err), NextStep(err)};
}

// A state file must be the file itself; missing is fine.
Diagnosis DiagnoseKind(const std::string& path) {
  struct stat st;
  if (::lstat(path.c_str(), &st) != 0) {
    return errno == ENOENT ? Diagnosis{} : FromErrno("cannot be examined", errno);
  }
  if (S_ISLNK(st.st_mode)) return {" is a symbolic link", NextStep(ELOOP)};
  if (S_ISDIR(st.st_mode)) return {" is a directory", NextStep(EISDIR)};
  if (!S_ISREG(st.st_mode)) return {" is not a regular file", "move it out of the way"};
  return {};
}

Diagnosis DiagnoseLoad(const StateFile& file) {
  Diagnosis kind = DiagnoseKind(file.path);
  if (!kind.cause.empty()) return kind;
  std::string text;
  if (!orvex::portable::ReadWholeFile(file.path, text)) {
    return errno == ENOENT ? Diagnosis{} : FromErrno("cannot be read", errno);
  }
  Json::Value value;
  if (!orvex::fromString(value, text)) return {" is not valid JSON", file.repair_step};
  if (value.type() != file.holds) {
    const char* wanted = file.holds == Json::objectValue ? "an object" : "an array";
    return {std::string(" holds JSON that is not ") + wanted, file.repair_step};
  }
  return {};
}

std::string ParentOf(const std::string& path) {
  const size_t slash = path.rfind('/');
  return slash == 0 || slash == std::string::npos ? "/" : path.substr(0, slash);
}

Diagnosis DiagnoseSave(const StateFile& file) {
  Diagnosis kind = DiagnoseKind(file.path);
  if (!kind.cause.empty()) return kind;
  const std::string dir = ParentOf(file.path);
  if (::access(dir.c_str(), W_OK) != 0) return FromErrno("cannot be written", errno);
  struct statvfs fs;
  if (::statvfs(dir.c_str(), &fs) == 0) {
    if (fs.f_flag & ST_RDONLY) return FromErrno("cannot be written", EROFS);
    if (fs.f_bavail == 0) return FromErrno("cannot be written", ENOSPC);
  }
  return {};
}

bool EndsWith(const std::string& text, const std::string& end) {
  return text.size() >= end.size() && text.compare(text.size() - end.size(), end.size(), end) == 0;
}

// The library's reason, then the cause unless the library gave it already
// (it names links and directories itself), then the next step.
[[noreturn]] void Explain(const orvex::Error& e, const Diagnosis& found) {
  std::string reason = e.reason();
  if (!EndsWith(reason, found.cause)) reason += found.cause;
  throw orvex::Error(e.code(), WithNextStep(reason, found.next_step));
}

[[noreturn]] void ExplainLock(const orvex::Error& e, const std::string& lock_path) {
  std::string next_step = "another orvex or the web API holds it: try again in a moment";
  const std::string probe =
      ::access(lock_path.c_str(), F_OK) == 0 ? lock_path : ParentOf(lock_path);
  if (::access(probe.c_str(), W_OK) != 0 && errno != ENOENT) next_step = NextStep(errno);
  throw orvex::Error(e.code(),
                     WithNextStep(e.reason() + " (lock file " + lock_path + ")", next_step));
}

}  // namespace

StateFile StatusFile() {
  return {RootPath(orvex::fileindex::kFileIndexStatusCfgPath), Json::objectValue,
          "repair it, or move it away: indexing then counts as running, with no share flags"};
}

StateFile FoldersFile() {
  return {RootPath(orvex::fileindex::kFileIndexFoldersCfgPath), Json::arrayValue,
          "repair it (moving it away would leave no folder indexed)"};
}

std::string StatusLockPath() { return RootPath(orvex::fileindex::kFileIndexStatusLockPath); }

std::string DaemonSocketPath() { return RootPath(orvex::fileindex::kFileIndexDaemonSockPath); }

void ExplainStateFileErrors(const std::vector<StateFile>& files, const std::string& lock_path,
                            const std::function<void()>& body) {
  try {
    body();
  } catch (const orvex::Error& e) {
    if (e.code() == orvex::kErrorLockFile && !lock_path.empty()) ExplainLock(e, lock_path);
    if (e.code() != orvex::kErrorLoadJson && e.code() != orvex::kErrorSaveJson) throw;
    for (const StateFile& file : files) {
      const Diagnosis found =
          e.code() == orvex::kErrorLoadJson ? DiagnoseLoad(file) : DiagnoseSave(file);
      if (!found.cause.empty()) Explain(e, found);
    }
    throw;
  }
}

}  // namespace orvex_cli
