// The indexing daemon driven step by step over real sockets and files: a
// search daemon stand-in records the document commands, the daemon's own
// socket is reached through the library's SendCommandToDaemon, and time runs
// only when a test moves the clock.
#include "index/index_daemon.h"

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdint>
#include <filesystem>
#include <future>
#include <optional>
#include <string>
#include <vector>

#include "indexd/indexd_test_root.h"
#include "orvex/communication.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/system_hooks.h"
#include "support/framed_client.h"
#include "support/framed_peer.h"
#include "support/log_capture.h"

namespace orvex {
namespace indexd {
namespace {

using testing::FramedPeer;

constexpr time_t kStart = 1700000000;
constexpr int kMaxSteps = 2000;

class IndexDaemonTest : public IndexdTestRoot {
 protected:
  IndexDaemonTest() {
    AnswerQueriesWith(Json::Value(Json::arrayValue));  // a rename's descendants: none here
  }

  SystemHooks FakeClock() {
    SystemHooks hooks;
    hooks.now = [this] { return now_; };
    hooks.sleep_for = [this](unsigned long micros) {
      now_ += static_cast<time_t>(micros / 1000000);
    };
    return hooks;
  }

  void WriteStatus(const std::string& text) {
    std::filesystem::create_directories(dir_.Join("var/packages/Orvex/etc"));
    dir_.Write("var/packages/Orvex/etc/fileindex.status", text);
  }

  // The search daemon answers document_get_by_query with docs and every
  // other request with success.
  void AnswerQueriesWith(const Json::Value& docs) {
    Json::Value answer;
    answer["success"] = true;
    answer["data"] = docs;
    const std::string text = toString(answer);
    peer_.SetResponder([text](const Json::Value& request) -> FramedPeer::Reply {
      if (request["command"] == "document_get_by_query") return text;
      return std::string(FramedPeer::kSuccess);
    });
  }

  // The document the index holds for path, as its last read left it.
  static Json::Value Known(const std::string& path, const struct stat& st, long long size) {
    Json::Value doc;
    doc["KALOMDPath"] = path;
    doc["KALOMDFSSize"] = static_cast<Json::Int64>(size);
    doc["KALOMDAttributeChangeDate"] = static_cast<Json::Int64>(st.st_ctim.tv_sec);
    doc["KALOMDFSContentChangeDate"] = static_cast<Json::Int64>(st.st_mtim.tv_sec);
    return doc;
  }

  // What a batch of changed files sends: their upserts, the directory's, a commit.
  std::vector<std::string> Upserted(const std::string& file) const {
    return {"document_upsert_by_id " + file, "document_upsert_by_id " + docs_, "commit"};
  }

  // Sends a command with the library's own client while the daemon steps.
  void Command(const std::string& type, const Json::Value& data) {
    auto sent = std::async(std::launch::async, [&] { fileindex::SendCommandToDaemon(type, data); });
    for (int i = 0;
         i < kMaxSteps && sent.wait_for(std::chrono::seconds(0)) != std::future_status::ready;
         ++i) {
      daemon_->RunOnce(10);
    }
    ASSERT_EQ(sent.wait_for(std::chrono::seconds(5)), std::future_status::ready);
    sent.get();
  }

  // One framed exchange on the daemon's socket (body as given, its length
  // word added), the answer parsed.
  Json::Value Exchange(const std::string& body) {
    const FileDescriptor fd = testing::ConnectUnix(socket_);
    EXPECT_TRUE(testing::SendBytes(fd.get(), testing::LengthWord(body.size()) + body));
    const std::optional<std::string> answer =
        testing::ReadFrame(fd.get(), [this] { daemon_->RunOnce(0); });
    EXPECT_TRUE(!answer || answer->back() == '\0');
    return testing::BodyJson(answer);
  }

  static std::string Body(const std::string& json) { return json + std::string(1, '\0'); }

  // The requests with each compound one replaced by its sub-requests (an
  // empty one stays): the document commands in the order they take effect.
  static std::vector<Json::Value> Flat(const std::vector<Json::Value>& requests) {
    std::vector<Json::Value> out;
    for (const Json::Value& r : requests) {
      if (!r.isMember("compound") || r["compound"].empty()) {
        out.push_back(r);
        continue;
      }
      for (const Json::Value& sub : r["compound"]) out.push_back(sub);
    }
    return out;
  }

  // The search daemon's document commands, one short line each.
  std::vector<std::string> Commands() const {
    std::vector<std::string> out;
    for (const Json::Value& r : Flat(peer_.requests())) {
      const std::string command = r["command"].asString();
      if (r.isMember("compound")) {
        out.push_back("compound 0");
      } else if (command == "document_del_by_query" || command == "document_get_by_query") {
        out.push_back(command + " " + r["data"]["query"]["qsl"]["prefix"]["KALOMDPath"].asString());
      } else if (command == "commit") {
        out.push_back(command);
      } else {
        out.push_back(command + " " + r["data"]["doc_id"].asString());
      }
    }
    return out;
  }

  time_t now_ = kStart;
  ScopedSystemHooks hooks_{FakeClock()};
  FramedPeer peer_{dir_.Join("var/run/kaloelasticd.sock")};
  testing::LogCapture log_;
};

TEST_F(IndexDaemonTest, QueueBecomesDocumentCommandsInOrderThenCommitAndSnapshotGoes) {
  const std::string a = Touch("a.bin"), b = Touch("b.bin"), c = Touch("c.bin");
  const std::string e = Touch("e.bin");
  const std::string d = docs_ + "/d.bin", f = docs_ + "/f.bin";
  Queue(Line(64, a));
  Queue(Line(64, b));
  Queue(Line(2, c));
  Queue(RenameLine(d, e));
  Queue(Line(128, f));
  Start();
  Drain();
  EXPECT_EQ(Commands(),
            (std::vector<std::string>{
                "document_upsert_by_id " + a, "document_upsert_by_id " + b,
                "document_upsert_by_id " + c, "document_set_by_id " + d,
                "document_get_by_query " + d + "/", "compound 0", "document_del_by_id " + f,
                // The directory, whose times change with its entries,
                // and the moved file's change time.
                "document_upsert_by_id " + docs_, "document_set_by_id " + e, "commit"}));
  EXPECT_EQ(Flat(peer_.requests())[0]["data"]["id"], "fileindex_s");
  EXPECT_TRUE(peer_.faults().empty());
}

TEST_F(IndexDaemonTest, ChangesGoOutAsOneCompoundAndAnAttrOfAnUnknownDocumentBecomesAnUpsert) {
  const std::string a = Touch("a.bin"), b = Touch("b.bin");
  Queue(Line(4, a));  // attributes of a file the index never got
  Queue(Line(64, b));
  peer_.SetResponder([](const Json::Value& request) -> FramedPeer::Reply {
    if (!request.isMember("compound")) return std::string(FramedPeer::kSuccess);
    Json::Value answer;
    answer["success"] = true;
    answer["has_fail"] = true;
    for (const Json::Value& sub : request["compound"]) {
      Json::Value one;
      one["success"] = sub["command"] != "document_set_by_id";
      if (!one["success"].asBool()) {
        one["error"]["code"] = 1107;
        one["error"]["msg"] = "no such document";
      }
      answer["data"].append(one);
    }
    return toString(answer);
  });
  Start();
  Drain();
  EXPECT_EQ(peer_.requests().size(), 3u);  // the compound, the fallback, the commit
  EXPECT_EQ(Commands(),
            (std::vector<std::string>{"document_set_by_id " + a, "document_upsert_by_id " + b,
                                      "document_upsert_by_id " + docs_,
                                      "document_upsert_by_id " + a, "commit"}));
}

TEST_F(IndexDaemonTest, SnapshotOfAKilledRunIsProcessedBeforeTheLiveQueue) {
  const std::string a = Touch("a.bin"), b = Touch("b.bin");
  Queue(Line(64, a), ".tmp");
  Queue(Line(64, b));
  Start();
  Drain();
  std::vector<std::string> expected = Upserted(a);
  for (const std::string& command : Upserted(b)) expected.push_back(command);
  EXPECT_EQ(Commands(), expected);
}

TEST_F(IndexDaemonTest, ReindexWalksTheFolderAndUpsertsEveryFileAndDirectoryButNoMetadata) {
  const std::string x = Touch("x.bin"), y = Touch("sub/y.bin");
  Touch("@eaDir/thumb.jpg");
  Touch("sub/@eaDir/z.jpg");
  Touch("#recycle/old.bin");
  Queue(Line(0x10000, docs_));
  Start();
  Drain();
  EXPECT_EQ(Commands(),
            (std::vector<std::string>{
                "document_get_by_query " + docs_ + "/", "document_upsert_by_id " + docs_,
                "document_upsert_by_id " + docs_ + "/sub", "document_upsert_by_id " + y,
                "document_upsert_by_id " + x, "commit"}));
}

TEST_F(IndexDaemonTest, ReindexReadsOnlyChangedFilesAndDeletesDocumentsOfVanishedOnes) {
  const std::string same = Touch("same.bin"), changed = Touch("changed.bin");
  const std::string gone = docs_ + "/gone.bin";
  struct stat st;
  ASSERT_EQ(::lstat(same.c_str(), &st), 0);
  Json::Value known(Json::arrayValue);
  known.append(Known(changed, st, st.st_size + 1));  // the file grew since it was indexed
  known.append(Known(gone, st, 1));
  known.append(Known(same, st, st.st_size));
  AnswerQueriesWith(known);
  Queue(Line(0x10000, docs_));
  Start();
  Drain();
  EXPECT_EQ(Commands(),
            (std::vector<std::string>{
                "document_get_by_query " + docs_ + "/", "document_upsert_by_id " + docs_,
                "document_upsert_by_id " + changed, "document_del_by_id " + gone, "commit"}));
}

TEST_F(IndexDaemonTest, ConfigurationChangeReadsEveryFileAgain) {
  const std::string a = Touch("a.bin");
  struct stat st;
  ASSERT_EQ(::lstat(a.c_str(), &st), 0);
  Json::Value known(Json::arrayValue);
  known.append(Known(a, st, st.st_size));
  AnswerQueriesWith(known);
  Queue(R"({"event": 131072, "path": ")" + docs_ + R"(", "data": {"document": true}})");
  Start();
  Drain();
  EXPECT_EQ(Commands(), (std::vector<std::string>{"document_get_by_query " + docs_ + "/",
                                                  "document_upsert_by_id " + docs_,
                                                  "document_upsert_by_id " + a, "commit"}));
}

TEST_F(IndexDaemonTest, QueueIsTakenWhenQuietOrAfterTheLongestWaitOfASteadyStream) {
  WorkerOptions worker;
  worker.quiet_ms = 5000;
  worker.max_wait_ms = 30000;
  worker.clock_ms = [this] { return int64_t{now_} * 1000; };
  Start(worker);
  const std::string a = Touch("a.bin");
  Queue(Line(2, a));
  daemon_->RunOnce(0);
  now_ += 4;
  daemon_->RunOnce(0);
  EXPECT_TRUE(peer_.requests().empty());  // not yet quiet for long enough
  now_ += 1;
  Drain();
  EXPECT_EQ(Commands(), Upserted(a));

  // A line every few seconds: never quiet, yet taken once the first has waited 30 s.
  for (int second = 0; second < 30; second += 3) {
    Queue(Line(2, a));
    daemon_->RunOnce(0);
    EXPECT_EQ(Commands().size(), 3u) << "taken early, at second " << second;
    now_ += 3;
  }
  Queue(Line(2, a));
  Drain();
  EXPECT_EQ(Commands().size(), 6u);
}

TEST_F(IndexDaemonTest, ASearchDaemonThatIsAwayIsRetriedWithoutLosingTheBatch) {
  const std::string a = Touch("a.bin"), b = Touch("b.bin");
  Queue(Line(64, a));
  Queue(Line(64, b));
  peer_.Stop();
  Start();
  for (int i = 0; i < 20; ++i) daemon_->RunOnce(0);
  EXPECT_TRUE(Exists(queue_ + ".tmp"));
  EXPECT_EQ(daemon_->Status()["shares"]["s"]["state"], "retrying");
  EXPECT_EQ(daemon_->Status()["shares"]["s"]["todo"], 3);  // a, b, their directory
  FramedPeer back(dir_.Join("var/run/kaloelasticd.sock"));
  now_ += 30;
  Drain();
  const std::vector<Json::Value> sent = Flat(back.requests());
  ASSERT_EQ(sent.size(), 4u);
  EXPECT_EQ(sent[0]["data"]["doc_id"], a);
  EXPECT_EQ(sent[3]["command"], "commit");
}

TEST_F(IndexDaemonTest, WhatAFailedCommitMayHaveLostIsSentAgainAndANeverIndexedSourceIsSkipped) {
  const std::string a = Touch("a.bin"), b = Touch("b.bin");
  const std::string lock = docs_ + "/b.lock";  // made and renamed before it was indexed
  Queue(Line(64, a));
  Queue(RenameLine(lock, b));
  std::atomic<bool> refused{false};
  peer_.SetResponder([&](const Json::Value& request) -> FramedPeer::Reply {
    if (request["command"] == "document_set_by_id" && request["data"]["doc_id"] == lock) {
      return R"({"success": false, "error": {"code": 1107, "msg": "no document"}})";
    }
    if (request["command"] == "commit" && !refused.exchange(true)) {
      return R"({"success": false, "error": {"code": 1500, "msg": "disk I/O error"}})";
    }
    return std::string(FramedPeer::kSuccess);
  });
  Start();
  daemon_->RunOnce(0);  // the whole batch, up to its refused commit
  const std::vector<std::string> first = Commands();
  ASSERT_EQ(first.back(), "commit");
  EXPECT_NE(std::count(first.begin(), first.end(), "document_upsert_by_id " + b), 0);
  EXPECT_NE(std::count(first.begin(), first.end(), "document_del_by_query " + lock + "/"), 0);
  now_ += 30;
  Drain();
  const std::vector<std::string> all = Commands();
  const std::vector<std::string> again(all.begin() + static_cast<long>(first.size()), all.end());
  for (const std::string& command : first) {
    if (command == "document_set_by_id " + lock) continue;  // refused: its fallback stands in
    EXPECT_NE(std::count(again.begin(), again.end(), command), 0) << command << " not sent again";
  }
}

TEST_F(IndexDaemonTest, CrashMarkWalksEveryIndexedFolderOfTheShareInstead) {
  const std::string a = Touch("a.bin");
  Queue(Line(64, a));
  Queue(Line(0x200, share_));
  Queue(Line(128, docs_ + "/never-looked-at.bin"));
  Start();
  Drain();
  EXPECT_EQ(Commands(), (std::vector<std::string>{"document_get_by_query " + share_ + "/",
                                                  "document_upsert_by_id " + docs_,
                                                  "document_upsert_by_id " + a, "commit"}));
}

TEST_F(IndexDaemonTest, EventsInMetadataFoldersNeverBecomeDocuments) {
  const std::string thumb = Touch("@eaDir/t.jpg");
  const std::string kept = Touch("k.bin");
  Queue(Line(64, thumb));
  Queue(Line(64, kept));
  Start();
  Drain();
  EXPECT_EQ(Commands(), Upserted(kept));
}

TEST_F(IndexDaemonTest, NothingIsSentWhilePausedUntilTheResumeTimeComes) {
  WriteStatus(R"({"resume_time": )" + std::to_string(kStart + 3600) + "}");
  const std::string a = Touch("a.bin");
  Queue(Line(64, a));
  Start();
  for (int i = 0; i < 50; ++i) daemon_->RunOnce(0);
  EXPECT_TRUE(peer_.requests().empty());
  EXPECT_TRUE(Exists(queue_));
  EXPECT_EQ(daemon_->Status()["paused"], true);
  now_ = kStart + 3600;
  Drain();
  EXPECT_EQ(Commands(), Upserted(a));
  EXPECT_EQ(daemon_->Status()["paused"], false);
}

TEST_F(IndexDaemonTest, PauseAndResumeCommandsHoldAndReleaseTheWorkers) {
  Start();
  Json::Value pause;
  pause["resume_time"] = 0;
  Command("pause", pause);
  const std::string a = Touch("a.bin");
  Queue(Line(64, a));
  for (int i = 0; i < 50; ++i) daemon_->RunOnce(0);
  EXPECT_TRUE(peer_.requests().empty());
  Command("resume", Json::nullValue);
  Drain();
  EXPECT_EQ(Commands(), Upserted(a));
}

TEST_F(IndexDaemonTest, WorkerCreateAndDeleteOverTheDaemonSocket) {
  WriteFolders(/*paused=*/true);  // a paused share has no worker at start
  Start();
  EXPECT_FALSE(daemon_->HasWorker("s"));
  Json::Value share;
  share["share_name"] = "s";
  Command("worker_create", share);
  EXPECT_TRUE(daemon_->HasWorker("s"));
  const std::string a = Touch("a.bin");
  Queue(Line(64, a));
  Drain();
  EXPECT_EQ(Commands(), Upserted(a));

  Command("worker_delete", share);
  EXPECT_FALSE(daemon_->HasWorker("s"));
  Queue(Line(64, a));
  for (int i = 0; i < 50; ++i) daemon_->RunOnce(0);
  EXPECT_EQ(Commands().size(), 3u);
  EXPECT_TRUE(Exists(queue_));
}

TEST_F(IndexDaemonTest, SettingChangeStartsAWorkerForANewlyIndexedShare) {
  WriteFolders(/*paused=*/true);
  Start();
  Json::Value change;
  change["share_name"] = "s";
  change["is_upsert"] = true;
  Command("notify_setting_changed", change);
  EXPECT_TRUE(daemon_->HasWorker("s"));
  change["is_upsert"] = false;  // the share still has its folder: it keeps its worker
  Command("notify_setting_changed", change);
  EXPECT_TRUE(daemon_->HasWorker("s"));
  dir_.Write("var/packages/Orvex/etc/fileindex.folders", "[]");
  Command("notify_setting_changed", change);
  EXPECT_FALSE(daemon_->HasWorker("s"));
}

TEST_F(IndexDaemonTest, StatusAnswersPerShareProgressAndPauseState) {
  Start();
  const Json::Value answer = Exchange(Body(R"({"type": "status", "data": null})"));
  ASSERT_EQ(answer["success"], true) << toString(answer);
  EXPECT_EQ(answer["data"]["paused"], false);
  const Json::Value& share = answer["data"]["shares"]["s"];
  EXPECT_EQ(share["state"], "idle");
  EXPECT_EQ(share["done"], 0);
  EXPECT_EQ(share["todo"], 0);
  EXPECT_TRUE(share.isMember("rate"));
  EXPECT_TRUE(share.isMember("eta"));
}

TEST_F(IndexDaemonTest, BadFramesAreRefusedAndTheSocketIsGroupOnly) {
  Start();
  struct stat st;
  ASSERT_EQ(::stat(socket_.c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 0777, 0660u);
  EXPECT_EQ(Exchange(R"({"type": "status"})")["error"]["msg"], "request without its NUL");
  EXPECT_EQ(Exchange(Body(R"({"type": "dance"})"))["error"]["code"], 120);
  EXPECT_EQ(Exchange(Body("not json"))["success"], false);
}

TEST_F(IndexDaemonTest, OversizedFramesAndConnectionsPastTheCapAreRefused) {
  Start();
  std::string huge(70 * 1024, 'x');
  huge.back() = '\0';
  EXPECT_EQ(Exchange(huge)["error"]["msg"], "bad frame length");

  std::vector<FileDescriptor> held;
  for (int i = 0; i < 17; ++i) {
    held.push_back(testing::ConnectUnix(socket_));
    daemon_->RunOnce(0);
  }
  // The seventeenth is closed at once: it reads the end of the stream.
  pollfd last{held.back().get(), POLLIN, 0};
  ASSERT_EQ(::poll(&last, 1, 5000), 1);
  char byte = 0;
  EXPECT_EQ(::read(held.back().get(), &byte, 1), 0);
  pollfd first{held.front().get(), POLLIN, 0};
  EXPECT_EQ(::poll(&first, 1, 0), 0);  // the others stay open
}

TEST_F(IndexDaemonTest, NeedReindexFlagAtStartWalksTheShareAndIsCleared) {
  WriteStatus(R"({"share": {"s": 1}})");
  const std::string x = Touch("x.bin");
  Start();
  for (int i = 0; i < kMaxSteps && (Commands().empty() || Commands().back() != "commit"); ++i) {
    daemon_->RunOnce(0);
  }
  EXPECT_EQ(Commands(), (std::vector<std::string>{"document_get_by_query " + share_ + "/",
                                                  "document_upsert_by_id " + docs_,
                                                  "document_upsert_by_id " + x, "commit"}));
  Json::Value status;
  ASSERT_TRUE(fromFile(status, dir_.Join("var/packages/Orvex/etc/fileindex.status")));
  EXPECT_EQ(status["share"]["s"], 0);
}

}  // namespace
}  // namespace indexd
}  // namespace orvex
