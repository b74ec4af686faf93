// ElasticTestRoot: a fixture with its own ORVEX_ROOT and share registry, a
// search daemon stand-in on the root's search socket, instant busy waits
// (each wait recorded, with the notices sent before it) and a notification
// tool that records its arguments. One test at a time (it changes the process
// environment and the system hooks).
#ifndef ORVEX_TESTS_ELASTIC_ELASTIC_TEST_ROOT_H_
#define ORVEX_TESTS_ELASTIC_ELASTIC_TEST_ROOT_H_

#include <sys/stat.h>

#include <filesystem>
#include <string>
#include <vector>

#include "orvex/elastic.h"
#include "orvex/foundation/system_hooks.h"
#include "platform/share_test_root.h"
#include "support/framed_peer.h"
#include "support/log_capture.h"
#include "support/run_program.h"

namespace orvex {
namespace testing {

class ElasticTestRoot : public ShareTestRoot {
 protected:
  // One busy wait: its length and how many notices had gone out before it.
  struct Wait {
    unsigned long seconds;
    size_t notices_before;
  };

  ElasticTestRoot() {
    std::filesystem::create_directories(dir_.Join("usr/kalo/bin"));
    const std::string tool = dir_.Write("usr/kalo/bin/kalopmxnotify",
                                        "#!/bin/sh\necho \"$*\" >> \"" + NoticesPath() + "\"\n");
    ::chmod(tool.c_str(), 0755);
  }

  // The notification tool's invocations, one line of arguments each.
  std::vector<std::string> Notices() const { return SplitLines(ReadFileText(NoticesPath())); }

  std::string NoticesPath() const { return dir_.Join("notices"); }

  // rand() gives 0, 1, 2, ... so the waits cycle through all five lengths.
  SystemHooks InstantWaits() {
    SystemHooks hooks;
    hooks.sleep_for = [this](unsigned long micros) {
      waits_.push_back({micros / 1000000, Notices().size()});
    };
    hooks.random = [this] { return next_random_++; };
    return hooks;
  }

  FramedPeer peer_{dir_.Join("var/run/kaloelasticd.sock")};
  std::vector<Wait> waits_;
  int next_random_ = 0;
  ScopedSystemHooks hooks_{InstantWaits()};
  LogCapture log_;
};

// A busy refusal with code (1400 or 1401).
inline std::string BusyAnswer(int code) {
  return R"({"success": false, "error": {"code": )" + std::to_string(code) +
         R"(, "msg": "too busy"}})";
}

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_ELASTIC_ELASTIC_TEST_ROOT_H_
