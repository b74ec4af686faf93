// The real fileindexd in its own root: it indexes a queued change into a
// search daemon stand-in, takes commands from the library's client, and on
// SIGTERM exits 0 and removes its socket.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>

#include "orvex/communication.h"
#include "orvex/foundation/error.h"
#include "support/ask_daemon.h"
#include "support/framed_peer.h"
#include "support/run_program.h"
#include "support/temp_dir.h"

namespace orvex {
namespace indexd {
namespace {

namespace fs = std::filesystem;

const std::string kProgram = std::string(ORVEX_BUILD_DIR) + "/fileindexd";

class FileindexdTest : public ::testing::Test {
 protected:
  FileindexdTest() {
    fs::create_directories(docs_);
    fs::create_directories(share_ + "/@eaDir/@fileindex");
    fs::create_directories(dir_.Join("etc/orvex"));
    dir_.Write("etc/orvex/shares.json", R"([{"name": "s", "path": ")" + share_ + "\"}]");
    fs::create_directories(dir_.Join("var/packages/Orvex/etc"));
    dir_.Write("var/packages/Orvex/etc/fileindex.folders",
               R"([{"path": "/s/docs", "name": "docs", "document": false, "audio": false, )"
               R"("video": false, "photo": false}])");
  }

  void TearDown() override {
    if (pid_ > 0) {
      ::kill(pid_, SIGKILL);
      ::waitpid(pid_, nullptr, 0);
    }
  }

  void Start() {
    pid_ = ::fork();
    ASSERT_GE(pid_, 0);
    if (pid_ == 0) {
      ::execl(kProgram.c_str(), kProgram.c_str(), "--foreground", static_cast<char*>(nullptr));
      ::_exit(127);
    }
  }

  template <typename Pred>
  static bool WaitFor(Pred pred) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(30);
    while (std::chrono::steady_clock::now() < deadline) {
      if (pred()) return true;
      std::this_thread::yield();
    }
    return false;
  }

  int Stop() {
    ::kill(pid_, SIGTERM);
    int status = 0;
    ::waitpid(pid_, &status, 0);
    pid_ = -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  }

  // One command's whole answer (the library's client reads and drops it).
  Json::Value Ask(const std::string& type) {
    Json::Value request;
    request["type"] = type;
    return testing::AskDaemon(socket_, request);
  }

  testing::TempDir dir_;
  testing::ScopedOrvexRoot orvex_root_{dir_.path()};
  const std::string share_ = dir_.Join("volume1/s");
  const std::string docs_ = share_ + "/docs";
  const std::string socket_ = dir_.Join("var/run/fileindexd.sock");
  testing::FramedPeer peer_{dir_.Join("var/run/kaloelasticd.sock")};
  pid_t pid_ = -1;
};

TEST_F(FileindexdTest, IndexesAQueuedFileTakesCommandsAndStopsCleanly) {
  const std::string file = docs_ + "/a.bin";
  std::ofstream(file) << "a";
  std::ofstream(share_ + "/@eaDir/@fileindex/queue")
      << R"({"event": 64, "is_dir": false, "path": ")" << file << "\"}\n";
  Start();
  ASSERT_TRUE(WaitFor([&] { return fs::exists(socket_); }));
  ASSERT_TRUE(WaitFor([&] {
    const auto requests = peer_.requests();
    return !requests.empty() && requests.back()["command"] == "commit";
  }));
  const auto requests = peer_.requests();
  // One compound request (the file, its directory), then the commit.
  ASSERT_EQ(requests.size(), 2u);
  ASSERT_EQ(requests[0]["compound"].size(), 2u);
  EXPECT_EQ(requests[0]["compound"][0]["command"], "document_upsert_by_id");
  EXPECT_EQ(requests[0]["compound"][0]["data"]["doc_id"], file);
  EXPECT_TRUE(WaitFor([&] { return !fs::exists(share_ + "/@eaDir/@fileindex/queue.tmp"); }));

  Json::Value pause;
  pause["resume_time"] = 0;
  EXPECT_NO_THROW(fileindex::SendCommandToDaemon("pause", pause));
  EXPECT_NO_THROW(fileindex::SendCommandToDaemon("resume", Json::nullValue));

  EXPECT_EQ(0, Stop());
  EXPECT_FALSE(fs::exists(socket_));
}

TEST_F(FileindexdTest, WhileTheSearchDaemonIsBusyStatusIsAnsweredAndAStopEndsTheWait) {
  const std::string file = docs_ + "/a.bin";
  std::ofstream(file) << "a";
  std::ofstream(share_ + "/@eaDir/@fileindex/queue")
      << R"({"event": 64, "is_dir": false, "path": ")" << file << "\"}\n";
  peer_.SetResponder([](const Json::Value&) -> testing::FramedPeer::Reply {
    return std::string(R"({"success": false, "error": {"code": 1400, "msg": "busy"}})");
  });
  Start();
  // The library now waits a quarter of an hour before it asks again.
  ASSERT_TRUE(WaitFor([&] { return !peer_.requests().empty(); }));
  EXPECT_TRUE(Ask("status")["data"]["shares"].isMember("s"));
  EXPECT_EQ(Ask("resume")["error"]["code"], kErrorSearchDaemon);

  const auto asked = std::chrono::steady_clock::now();
  EXPECT_EQ(0, Stop());
  EXPECT_LT(std::chrono::steady_clock::now() - asked, std::chrono::seconds(10));
  // The batch is kept for the next start.
  EXPECT_TRUE(fs::exists(share_ + "/@eaDir/@fileindex/queue.tmp"));
}

TEST(FileindexdProgramTest, HelpVersionAndBadUsage) {
  testing::TempDir io;
  const testing::ProgramOutcome help = testing::RunProgram(kProgram, {"--help"}, {}, io.path());
  EXPECT_EQ(0, help.status);
  EXPECT_NE(std::string::npos, help.out.find("--foreground"));
  const testing::ProgramOutcome version =
      testing::RunProgram(kProgram, {"--version"}, {}, io.path());
  EXPECT_EQ(0, version.status);
  EXPECT_EQ(0u, version.out.rfind("fileindexd ", 0));
  const testing::ProgramOutcome bad = testing::RunProgram(kProgram, {"--bogus"}, {}, io.path());
  EXPECT_EQ(2, bad.status);
  EXPECT_NE(std::string::npos, bad.err.find("unknown argument --bogus"));
}

}  // namespace
}  // namespace indexd
}  // namespace orvex
