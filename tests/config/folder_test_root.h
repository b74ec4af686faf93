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
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "platform/share_test_root.h"
#include "support/error_code.h"

namespace orvex {
namespace testing {

using fileindex::Folder;
using fileindex::FolderMgr;
using FolderPtr = std::shared_ptr<Folder>;

constexpr const char* kTypeKeys[] = {"document", "audio", "video", "photo"};

// A folder record's JSON, flags as letters of "davp": document, audio,
// video, photo.
inline Json::Value FolderJson(const std::string& path, const std::string& flags,
                              const std::string& name = "", bool paused = false) {
  Json::Value folder(Json::objectValue);
  folder["path"] = path;
  folder["name"] = name.empty() ? path : name;
  for (int i = 0; i < 4; ++i) folder[kTypeKeys[i]] = flags.find("davp"[i]) != std::string::npos;
  folder["paused"] = paused;
  folder["volume_to_be_clean"] = "";
  return folder;
}

inline FolderPtr MakeFolder(const std::string& path, const std::string& flags,
                            const std::string& name = "", bool paused = false) {
  return std::make_shared<Folder>(FolderJson(path, flags, name, paused));
}

// The four type flags as "davp" letters, "-" for off.
inline std::string Flags(const FolderPtr& folder) {
  const bool on[] = {folder->IsDocument(), folder->IsAudio(), folder->IsVideo(), folder->IsPhoto()};
  std::string flags = "----";
  for (int i = 0; i < 4; ++i) flags[i] = on[i] ? "davp"[i] : '-';
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

  void WriteEtc(const std::string& name, const std::string& text) {
    std::filesystem::create_directories(dir_.Join("var/packages/Orvex/etc"));
    dir_.Write("var/packages/Orvex/etc/" + name, text);
  }
  void WriteFolders(const std::vector<Json::Value>& folders) {
    Json::Value list(Json::arrayValue);
    for (const Json::Value& folder : folders) list.append(folder);
    WriteEtc("fileindex.folders", toString(list));
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
    WriteEtc("fileindex.status", toString(status));
  }

  // Appends a file's create event to the share's live queue.
  static void QueueCreate(const std::string& share_root, const std::string& path) {
    Json::Value event(Json::objectValue);
    event["event"] = 64;
    event["is_dir"] = false;
    event["path"] = path;
    std::filesystem::create_directories(share_root + "/@eaDir/@fileindex");
    std::ofstream(share_root + "/@eaDir/@fileindex/queue", std::ios::app)
        << toString(event) << "\n";
  }
};

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_CONFIG_FOLDER_TEST_ROOT_H_
