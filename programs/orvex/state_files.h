// The state files the orvex tool reaches through the library (the status
// file, the folder list, the status lock) and the indexing daemon's socket,
// resolved under ORVEX_ROOT, and the explanations the tool adds to the
// library's failures on them. The library's load and save errors (504, 505,
// 506) name the file; the tool looks at the file and adds why it failed and
// what to do, keeping the code and the library's text in front.
// Single-threaded, like the tool.
#ifndef ORVEX_PROGRAMS_ORVEX_STATE_FILES_H_
#define ORVEX_PROGRAMS_ORVEX_STATE_FILES_H_

#include <json/json.h>

#include <functional>
#include <string>
#include <vector>

namespace orvex_cli {

// A JSON state file and what it must hold.
struct StateFile {
  std::string path;         // resolved under ORVEX_ROOT
  Json::ValueType holds;    // objectValue or arrayValue
  const char* repair_step;  // what to do when its content is bad
};

StateFile StatusFile();   // /var/packages/Orvex/etc/fileindex.status
StateFile FoldersFile();  // /var/packages/Orvex/etc/fileindex.folders
std::string StatusLockPath();
std::string DaemonSocketPath();

// Runs body. An orvex::Error 504 or 505 that it throws about one of files
// comes out with the cause found on disk and the next step added to its
// reason; 506 with the lock file (lock_path, "" for none) named. Any other
// exception, or one whose cause cannot be found, passes unchanged.
void ExplainStateFileErrors(const std::vector<StateFile>& files, const std::string& lock_path,
                            const std::function<void()>& body);

}  // namespace orvex_cli

#endif  // ORVEX_PROGRAMS_ORVEX_STATE_FILES_H_
