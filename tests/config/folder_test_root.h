// FolderTestRoot: a test fixture with its own ORVEX_ROOT, share registry,
// folder configuration file, status file and share queues. One test at a
// time (it changes the process environment).
#ifndef ORVEX_TESTS_CONFIG_FOLDER_TEST_ROOT_H_
#define ORVEX_TESTS_CONFIG_FOLDER_TEST_ROOT_H_

#include <gtest/gtest.h>
#include <json/json.h>

#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include "orvex/config/folder.h"
#include "orvex/config/folder_mgr.h"
#include "orvex/foundation/json.h"
#include "platform/share_test_root.h"

namespace orvex {
namespace testing {

using fileindex::Folder;
using fileindex::FolderMgr;
using FolderPtr = std::shared_ptr<Folder>;

// A folder record's JSON, flags given as "davp" letters: "d" document,
// "a" audio, "v" video, "p" photo.
inline Json::Value FolderJson(const std::string& path, const std::string& flags,
                              const std::string& name = "", bool paused = false) {
  Json::Value folder(Json::objectValue);
  folder["path"] = path;
  folder["name"] = name.empty() ? path : name;
  folder["document"] = flags.find('d') != std::string::npos;
  folder["audio"] = flags.find('a') != std::string::npos;
  folder["video"] = flags.find('v') != std::string::npos;
  folder["photo"] = flags.find('p') != std::string::npos;
  folder["paused"] = paused;
  folder["volume_to_be_clean"] = "";
  return folder;
}

inline FolderPtr MakeFolder(const std::string& path, const std::string& flags,
                            const std::string& name = "") {
  return std::make_shared<Folder>(FolderJson(path, flags, name));
}

// The four type flags of a record as "davp" letters ("-" for off), for
// one-line comparisons of change reports.
inline std::string Flags(const FolderPtr& folder) {
  std::string flags = "----";
  if (folder->IsDocument()) flags[0] = 'd';
  if (folder->IsAudio()) flags[1] = 'a';
  if (folder->IsVideo()) flags[2] = 'v';
  if (folder->IsPhoto()) flags[3] = 'p';
  return flags;
}

inline std::vector<std::string> Paths(const std::vector<FolderPtr>& folders) {
  std::vector<std::string> paths;
  for (const FolderPtr& folder : folders) paths.push_back(folder->GetPath());
  return paths;
}

class FolderTestRoot : public ShareTestRoot {
 protected:
  std::string FoldersFile() const { return dir_.Join("var/packages/Orvex/etc/fileindex.folders"); }
  std::string StatusFile() const { return dir_.Join("var/packages/Orvex/etc/fileindex.status"); }

  void WriteFoldersText(const std::string& text) {
    std::filesystem::create_directories(dir_.Join("var/packages/Orvex/etc"));
    dir_.Write("var/packages/Orvex/etc/fileindex.folders", text);
  }
  void WriteFolders(const std::vector<Json::Value>& folders) {
    Json::Value list(Json::arrayValue);
    for (const Json::Value& folder : folders) list.append(folder);
    WriteFoldersText(toString(list));
  }
  Json::Value ReadFolders() const {
    Json::Value list;
    EXPECT_TRUE(fromFile(list, FoldersFile()));
    return list;
  }

  // The status file: resume_time and the flags of one share.
  void WriteStatus(long long resume_time, const std::string& share = "", unsigned flags = 0) {
    Json::Value status(Json::objectValue);
    status["resume_time"] = static_cast<Json::Int64>(resume_time);
    if (!share.empty()) status["share"][share] = flags;
    std::filesystem::create_directories(dir_.Join("var/packages/Orvex/etc"));
    dir_.Write("var/packages/Orvex/etc/fileindex.status", toString(status));
  }

  // Appends event lines to the share's live queue (or its snapshot).
  static void WriteQueue(const std::string& share_root, const std::vector<Json::Value>& events,
                         bool snapshot = false) {
    const std::string dir = share_root + "/@eaDir/@fileindex";
    std::filesystem::create_directories(dir);
    std::string text;
    for (const Json::Value& event : events) text += toString(event) + "\n";
    std::ofstream(dir + (snapshot ? "/queue.tmp" : "/queue"), std::ios::app) << text;
  }
  static Json::Value CreateEvent(const std::string& path, const std::string& path_old = "") {
    Json::Value event(Json::objectValue);
    event["event"] = path_old.empty() ? 64 : 256;
    event["is_dir"] = false;
    event["path"] = path;
    if (!path_old.empty()) event["path_old"] = path_old;
    return event;
  }
};

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_CONFIG_FOLDER_TEST_ROOT_H_
