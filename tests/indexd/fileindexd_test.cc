// The real fileindexd in its own root: it indexes a queued change into a
// search daemon stand-in, takes commands from the library's client, and on
// SIGTERM exits 0 and removes its socket. Its command line is tested with
// the other daemons' (programs/daemon_usage_test.cc).
#include <gtest/gtest.h>

#include <chrono>
#include <string>

#include "indexd/indexd_test_root.h"
#include "orvex/communication.h"
#include "orvex/foundation/error.h"
#include "support/ask_daemon.h"
#include "support/daemon_process.h"
#include "support/framed_peer.h"
#include "support/run_program.h"

namespace orvex {
namespace indexd {
namespace {

using testing::FramedPeer;

class FileindexdTest : public IndexdTestRoot {
 protected:
  FileindexdTest() { Queue(Line(64, file_)); }

  void Spawn() {
    ASSERT_TRUE(fileindexd_.Spawn(testing::BuiltProgram("fileindexd"), {"--foreground"}));
  }

  // One command's whole answer (the library's client reads and drops it).
  Json::Value Ask(const std::string& type) {
    Json::Value request;
    request["type"] = type;
    return testing::AskDaemon(socket_, request);
  }

  const std::string file_ = Touch("a.bin");
  FramedPeer peer_{dir_.Join("var/run/kaloelasticd.sock")};
  testing::DaemonProcess fileindexd_;
};

TEST_F(FileindexdTest, IndexesAQueuedFileTakesCommandsAndStopsCleanly) {
  Spawn();
  ASSERT_TRUE(testing::WaitUntil([&] { return Exists(socket_); }));
  ASSERT_TRUE(testing::WaitUntil([&] {
    const auto requests = peer_.requests();
    return !requests.empty() && requests.back()["command"] == "commit";
  }));
  const auto requests = peer_.requests();
  // One compound request (the file, its directory), then the commit.
  ASSERT_EQ(requests.size(), 2u);
  ASSERT_EQ(requests[0]["compound"].size(), 2u);
  EXPECT_EQ(requests[0]["compound"][0]["command"], "document_upsert_by_id");
  EXPECT_EQ(requests[0]["compound"][0]["data"]["doc_id"], file_);
  EXPECT_TRUE(testing::WaitUntil([&] { return !Exists(queue_ + ".tmp"); }));

  Json::Value pause;
  pause["resume_time"] = 0;
  EXPECT_NO_THROW(fileindex::SendCommandToDaemon("pause", pause));
  EXPECT_NO_THROW(fileindex::SendCommandToDaemon("resume", Json::nullValue));

  EXPECT_EQ(0, fileindexd_.Stop());
  EXPECT_FALSE(Exists(socket_));
}

TEST_F(FileindexdTest, WhileTheSearchDaemonIsBusyStatusIsAnsweredAndAStopEndsTheWait) {
  peer_.SetResponder([](const Json::Value&) -> FramedPeer::Reply {
    return std::string(R"({"success": false, "error": {"code": 1400, "msg": "busy"}})");
  });
  Spawn();
  // The library now waits a quarter of an hour before it asks again.
  ASSERT_TRUE(testing::WaitUntil([&] { return !peer_.requests().empty(); }));
  EXPECT_TRUE(Ask("status")["data"]["shares"].isMember("s"));
  EXPECT_EQ(Ask("resume")["error"]["code"], kErrorSearchDaemon);

  const auto asked = std::chrono::steady_clock::now();
  EXPECT_EQ(0, fileindexd_.Stop());
  EXPECT_LT(std::chrono::steady_clock::now() - asked, std::chrono::seconds(10));
  // The batch is kept for the next start.
  EXPECT_TRUE(Exists(queue_ + ".tmp"));
}

}  // namespace
}  // namespace indexd
}  // namespace orvex
