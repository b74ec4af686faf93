// IndexMgrTestRoot: a fixture for the management operations. It has its own
// ORVEX_ROOT and share registry, stand-ins on real sockets for both daemons
// (the search daemon and the indexing daemon) and a recording service
// control program (systemd is absent under the root). Every daemon request
// is recorded in one timeline, in arrival order across both daemons, with a
// snapshot of the other places an operation touches as they stood when the
// request arrived: the monitor registrations, the folders file, the service
// control calls and the share queues. So a test reads the whole order of
// effects. Waits are instant (system hooks). One test at a time.
#ifndef ORVEX_TESTS_INDEX_MGR_INDEX_MGR_TEST_ROOT_H_
#define ORVEX_TESTS_INDEX_MGR_INDEX_MGR_TEST_ROOT_H_

#include <sys/stat.h>

#include <filesystem>
#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "kalo/kalo_notify.h"
#include "orvex/communication.h"
#include "orvex/config/folder_mgr.h"
#include "orvex/elastic.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/index_mgr.h"
#include "orvex/portable/root.h"
#include "orvex/status/status_mgr.h"
#include "platform/share_test_root.h"
#include "support/framed_peer.h"
#include "support/log_capture.h"
#include "support/run_program.h"

namespace orvex {
namespace testing {

// Sets an environment variable for a scope.
class ScopedEnv {
 public:
  ScopedEnv(const char* name, const std::string& value) : name_(name) {
    const char* old = std::getenv(name);
    had_ = old != nullptr;
    if (had_) old_ = old;
    ::setenv(name, value.c_str(), 1);
  }
  ScopedEnv(const ScopedEnv&) = delete;
  ScopedEnv& operator=(const ScopedEnv&) = delete;
  ~ScopedEnv() {
    if (had_) {
      ::setenv(name_, old_.c_str(), 1);
    } else {
      ::unsetenv(name_);
    }
  }

 private:
  const char* name_;
  bool had_ = false;
  std::string old_;
};

// The other places, as they stood at one moment.
struct Snapshot {
  // Registered queue path -> the full paths of its "config", in order.
  std::map<std::string, std::vector<std::string>> monitor;
  // Folder path -> paused, from the folders file ("" -> absent file).
  std::map<std::string, bool> folders;
  // Service control calls so far ("restart samba", ...).
  std::vector<std::string> services;
  // Share -> lines of its live queue.
  std::map<std::string, std::vector<std::string>> queues;
};

// The service control calls of switching the services on or off with the
// spotlight setting changing too.
inline const std::vector<std::string> kServicesOn = {"restart samba", "start kalocontentextractd",
                                                     "start pkg-Orvex-fileindexd"};
inline const std::vector<std::string> kServicesOff = {"restart samba", "stop kalocontentextractd",
                                                      "stop pkg-Orvex-fileindexd"};

// One daemon request: "elastic <command> <data.id>" or
// "fileindexd <type> <data>", with the places as they stood.
struct Step {
  std::string text;
  Json::Value request;
  Snapshot at;
};

class IndexMgrTestRoot : public ShareTestRoot {
 protected:
  IndexMgrTestRoot() {
    std::filesystem::create_directories(dir_.Join("tmp"));
    std::filesystem::create_directories(dir_.Join("var/run"));
    const std::string ctl =
        dir_.Write("servicectl", "#!/bin/sh\necho \"$1 $2\" >> \"" + ServicesLogPath() +
                                     "\"\nexit " + "$(cat \"" + dir_.Join("servicectl.status") +
                                     "\" 2>/dev/null || echo 0)\n");
    ::chmod(ctl.c_str(), 0755);
    ctl_env_ = std::make_unique<ScopedEnv>("ORVEX_SERVICE_CTL", ctl);
    elastic_.SetResponder([this](const Json::Value& request) {
      Record("elastic " + request["command"].asString() + " " + request["data"]["id"].asString(),
             request);
      return FramedPeer::Reply(FramedPeer::kSuccess);
    });
    fileindexd_.SetResponder([this](const Json::Value& request) {
      Record("fileindexd " + request["type"].asString() + " " + toString(request["data"]), request);
      return FramedPeer::Reply(FramedPeer::kSuccess);
    });
  }

  // Registers share name with an "a", "b" and "c" folder under its root.
  std::string AddShareWithDirs(const std::string& name, const std::string& subdir = "") {
    const std::string root = AddShare(name, Json::objectValue, subdir);
    MakeDirs(root, {"a", "a/sub", "b", "c"});
    share_roots_[name] = root;
    return root;
  }

  static Json::Value FolderJson(const std::string& path, const std::string& name = "n",
                                bool document = true, bool audio = true, bool video = true,
                                bool photo = true) {
    Json::Value folder(Json::objectValue);
    folder["path"] = path;
    folder["name"] = name;
    folder["document"] = document;
    folder["audio"] = audio;
    folder["video"] = video;
    folder["photo"] = photo;
    return folder;
  }

  static Json::Value Array(std::initializer_list<Json::Value> items) {
    Json::Value array(Json::arrayValue);
    for (const Json::Value& item : items) array.append(item);
    return array;
  }

  // The folders file as the operations see it; {} when absent.
  std::map<std::string, bool> Folders() const {
    std::map<std::string, bool> folders;
    Json::Value stored;
    if (!fromFile(stored, FoldersPath())) return folders;
    for (const Json::Value& folder : stored) {
      folders[folder["path"].asString()] = folder["paused"].asBool();
    }
    return folders;
  }

  std::string FoldersPath() const {
    return portable::RootPath(fileindex::kFileIndexFoldersCfgPath);
  }
  std::string ServicesLogPath() const { return dir_.Join("services.log"); }
  std::vector<std::string> Services() const { return SplitLines(ReadFileText(ServicesLogPath())); }
  void ForgetServices() const { std::filesystem::remove(ServicesLogPath()); }
  void FailServices(int status) const { dir_.Write("servicectl.status", std::to_string(status)); }

  std::string QueuePath(const std::string& share) const {
    return share_roots_.at(share) + "/@eaDir/@fileindex/queue";
  }
  std::string DBPath(const std::string& share) const {
    return share_roots_.at(share) + "/@eaDir/@fileindex/db";
  }
  std::vector<std::string> QueueLines(const std::string& share) const {
    return SplitLines(ReadFileText(QueuePath(share)));
  }

  // The queue's lines parsed.
  std::vector<Json::Value> QueueEvents(const std::string& share) const {
    std::vector<Json::Value> events;
    for (const std::string& line : QueueLines(share)) {
      Json::Value event;
      EXPECT_TRUE(fromString(event, line)) << line;
      events.push_back(event);
    }
    return events;
  }

  // Each configuration-change line of the share's queue: its event, path and
  // four flags ("131072 /v/s/a DA-P").
  std::vector<std::string> CfgEvents(const std::string& share) const {
    std::vector<std::string> events;
    for (const Json::Value& event : QueueEvents(share)) {
      const Json::Value& d = event["data"];
      events.push_back(std::to_string(event["event"].asInt()) + " " + event["path"].asString() +
                       " " + (d["document"].asBool() ? "D" : "-") +
                       (d["audio"].asBool() ? "A" : "-") + (d["video"].asBool() ? "V" : "-") +
                       (d["photo"].asBool() ? "P" : "-"));
    }
    return events;
  }

  // How many captured log lines hold text.
  size_t Logged(const std::string& text) const { return log_.Matching(text).size(); }

  // The full paths registered for the share's queue; empty when none.
  std::vector<std::string> Registered(const std::string& share) const {
    Snapshot now = Take();
    auto it = now.monitor.find(QueuePath(share));
    return it == now.monitor.end() ? std::vector<std::string>() : it->second;
  }
  bool IsRegistered(const std::string& share) const {
    return Take().monitor.count(QueuePath(share)) != 0;
  }
  Json::Value RegistrationOf(const std::string& share) const {
    Json::Value value;
    fromFile(value,
             KALO::KALONOTIFYD::MonitorRegistrationPath(QueuePath(share), fileindex::kAppName));
    return value;
  }

  Snapshot Take() const {
    Snapshot s;
    const std::string dir =
        portable::RootPath(KALO::KALONOTIFYD::kMonitorRegistryDir) + "/" + fileindex::kAppName;
    if (std::filesystem::is_directory(dir)) {
      for (const auto& entry : std::filesystem::directory_iterator(dir)) {
        Json::Value registration;
        if (!fromFile(registration, entry.path().string())) continue;
        std::vector<std::string>& paths = s.monitor[registration["queue"].asString()];
        for (const Json::Value& config : registration["config"]) {
          paths.push_back(config["path"].asString());
        }
      }
    }
    s.folders = Folders();
    s.services = Services();
    for (const auto& [share, root] : share_roots_) {
      (void)root;
      s.queues[share] = QueueLines(share);
    }
    return s;
  }

  std::vector<Step> Timeline() const {
    std::lock_guard<std::mutex> hold(mutex_);
    return timeline_;
  }
  std::vector<std::string> Requests() const {
    std::vector<std::string> texts;
    for (const Step& step : Timeline()) texts.push_back(step.text);
    return texts;
  }

  void Record(const std::string& text, const Json::Value& request) {
    Snapshot at = Take();
    std::lock_guard<std::mutex> hold(mutex_);
    timeline_.push_back({text, request, std::move(at)});
  }

  std::map<std::string, std::string> share_roots_;
  std::unique_ptr<ScopedEnv> ctl_env_;
  mutable std::mutex mutex_;
  std::vector<Step> timeline_;
  FramedPeer elastic_{dir_.Join("var/run/kaloelasticd.sock")};
  FramedPeer fileindexd_{dir_.Join("var/run/fileindexd.sock")};
  std::vector<unsigned long> sleeps_;
  ScopedSystemHooks hooks_{
      SystemHooks{nullptr, [this](unsigned long micros) { sleeps_.push_back(micros); }, nullptr}};
  LogCapture log_;
};

// The Error an operation throws; code 0 when it returns.
struct Outcome {
  int code = 0;
  std::string reason;
};

template <typename Call>
Outcome OutcomeOf(Call call) {
  Outcome outcome;
  try {
    call();
  } catch (const Error& e) {
    outcome.code = e.code();
    outcome.reason = e.reason();
  }
  return outcome;
}

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_INDEX_MGR_INDEX_MGR_TEST_ROOT_H_
