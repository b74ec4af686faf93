// kaloelasticd as a real process in its own ORVEX_ROOT: started detached (the
// command returns once the socket is ready), talked to by the library's own
// search-engine client and by raw sockets, stopped with SIGTERM.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>

#include <filesystem>
#include <string>
#include <vector>

#include "orvex/elastic.h"
#include "search/search_error.h"
#include "searchd/searchd_fixture.h"
#include "support/ask_daemon.h"
#include "support/program_test.h"

namespace orvex {
namespace testing {
namespace {

constexpr char kId[] = "fileindex_s";

class KaloelasticdTest : public ProgramTest {
 protected:
  KaloelasticdTest() : ProgramTest("kaloelasticd") {}
  void TearDown() override { EXPECT_TRUE(daemon_.pid() < 0 || daemon_.Stop() == 0); }

  void Start() { StartDetached(daemon_, "kaloelasticd"); }
  std::string SocketPath() const { return root_.Join("var/run/kaloelasticd.sock"); }

  Json::Value Ok(const Json::Value& request) {
    const Json::Value answer = AskDaemon(SocketPath(), request);
    EXPECT_TRUE(answer["success"].asBool()) << toString(request) << " -> " << toString(answer);
    return answer;
  }

  // One framed answer from a raw socket.
  static Json::Value ReadAnswer(int fd) { return BodyJson(ReadFrame(fd)); }

  void CreateIndex() {
    Json::Value req = Command("index_create", kId);
    req["data"]["path"] = root_.Join("volume1/s/@eaDir/@fileindex/db");
    req["data"]["settings"] = Json::Value(Json::objectValue);
    req["data"]["mappings"] = fileindex::elastic::GetFileIndexMappings();
    Ok(req);
  }

  void StillServing() { Ok(Request("stats")); }

  DaemonProcess daemon_;
};

TEST_F(KaloelasticdTest, SocketIsMode0660AndASecondDaemonIsRefused) {
  Start();
  struct stat st;
  ASSERT_EQ(0, ::stat(SocketPath().c_str(), &st));
  EXPECT_TRUE(S_ISSOCK(st.st_mode));
  EXPECT_EQ(0660u, st.st_mode & 07777);
  const ProgramOutcome second = Run({});
  EXPECT_EQ(1, second.status);
  StillServing();
}

// A directory rename through the library's own IndexRename: one set, one
// query, one compound of 1,000 sets.
TEST_F(KaloelasticdTest, DirectoryRenameThroughTheLibraryMovesEveryDescendant) {
  Start();
  CreateIndex();
  Json::Value compound;
  auto dir = [](const std::string& path) {
    Json::Value doc = FileDoc(path);
    doc["KALOMDIsDir"] = true;
    return doc;
  };
  compound["compound"].append(Upsert(kId, dir("/v/s/a")));
  compound["compound"].append(Upsert(kId, dir("/v/s/ab")));
  compound["compound"].append(Upsert(kId, FileDoc("/v/s/ab/keep.txt")));
  for (int d = 0; d < 10; ++d) {
    compound["compound"].append(Upsert(kId, dir("/v/s/a/d" + std::to_string(d))));
  }
  for (int i = 0; i < 990; ++i) {
    compound["compound"].append(Upsert(
        kId, FileDoc("/v/s/a/d" + std::to_string(i % 10) + "/f" + std::to_string(i) + ".txt")));
  }
  EXPECT_FALSE(Ok(compound)["has_fail"].asBool());
  Ok(Command("commit", kId));

  fileindex::elastic::IndexRename("s", "/v/s/a", "/v/s/b");
  fileindex::elastic::IndexCommit("s");

  const Json::Value moved = Ok(PrefixQuery("document_get_by_query", kId, "/v/s/b/"))["data"];
  EXPECT_EQ(1000u, moved.size());
  for (const Json::Value& doc : moved) {
    const std::string path = doc["KALOMDPath"].asString();
    EXPECT_EQ(path.substr(0, path.rfind('/')), doc["KALOMDParent"].asString()) << path;
  }
  EXPECT_EQ(0u, Ok(PrefixQuery("document_get_by_query", kId, "/v/s/a/"))["data"].size());
  EXPECT_EQ((std::vector<std::string>{"/v/s/ab/keep.txt"}),
            DocPaths(Ok(PrefixQuery("document_get_by_query", kId, "/v/s/ab/"))));
  EXPECT_EQ(std::vector<std::string>{"/v/s/b/d7/f987.txt"},
            HitPaths(Ok(Request("search", R"({"name": "f987.txt"})"))));
  EXPECT_EQ(0, Ok(Request("search", R"({"folder": "/v/s/a"})"))["data"]["total"].asInt());
  EXPECT_EQ((std::vector<std::string>{"/v/s/ab", "/v/s/b", "/v/s/b/d0", "/v/s/b/d1", "/v/s/b/d2",
                                      "/v/s/b/d3", "/v/s/b/d4", "/v/s/b/d5", "/v/s/b/d6",
                                      "/v/s/b/d7", "/v/s/b/d8", "/v/s/b/d9"}),
            HitPaths(Ok(Request("search", R"({"folder": "/v/s", "type": "dir"})"))));
}

// What was committed outlives a stop and a kill; what was not is dropped.
TEST_F(KaloelasticdTest, TheNextDaemonHasTheLastCommitAfterAStopOrAKill) {
  Start();
  CreateIndex();
  std::vector<std::string> kept;
  for (const int sig : {SIGTERM, SIGKILL}) {
    SCOPED_TRACE(sig);
    kept.push_back("/v/s/kept" + std::to_string(sig));  // 15, then 9: in path order
    Ok(Upsert(kId, FileDoc(kept.back())));
    Ok(Command("commit", kId));
    Ok(Upsert(kId, FileDoc("/v/s/lost" + std::to_string(sig))));
    ASSERT_EQ(0, daemon_.Stop(sig));
    // A stopped daemon removes its socket; the next one takes over a killed one's.
    EXPECT_EQ(sig == SIGKILL, std::filesystem::exists(SocketPath()));
    Start();
    EXPECT_EQ(kept, DocPaths(Ok(PrefixQuery("document_get_by_query", kId, "/v/s/"))));
  }
}

// When the file was last written, to the nanosecond.
struct timespec ModTime(const std::string& path) {
  struct stat st = {};
  ::stat(path.c_str(), &st);
  return st.st_mtim;
}

// A kill -9 while the last commit of a 100,000-document load is being
// written: the next daemon opens the index and holds exactly one of the two
// states that commit divides, whole.
TEST_F(KaloelasticdTest, AKillDuringALoadLeavesExactlyTheLastCommittedState) {
  Start();
  CreateIndex();
  constexpr int kDocuments = 100000, kCompound = 1000, kCommitEvery = 10000;
  const std::string log = root_.Join("volume1/s/@eaDir/@fileindex/db-wal");
  // A folder of each thousand: d0 to d99.
  auto path_of = [](int i) {
    return "/v/s/d" + std::to_string(i / kCompound) + "/f" + std::to_string(i);
  };
  for (int first = 0; first < kDocuments; first += kCompound) {
    Json::Value compound;
    for (int i = first; i < first + kCompound; ++i) {
      compound["compound"].append(Upsert(kId, FileDoc(path_of(i))));
    }
    Ok(compound);
    if ((first + kCompound) % kCommitEvery != 0) continue;
    if (first + kCompound < kDocuments) {
      Ok(Command("commit", kId));
      continue;
    }
    // The log's first new page marks the commit under way.
    const struct timespec before = ModTime(log);
    FileDescriptor committing = ConnectUnix(SocketPath());
    ASSERT_TRUE(SendBytes(committing.get(), Framed(toString(Command("commit", kId)))));
    WaitUntil(
        [&] {
          const struct timespec now = ModTime(log);
          return now.tv_sec != before.tv_sec || now.tv_nsec != before.tv_nsec;
        },
        std::chrono::seconds(30), std::chrono::milliseconds(0));
    daemon_.Stop(SIGKILL);
  }
  Start();
  const int64_t documents = Ok(Request("stats"))["data"]["indexes"][0]["documents"].asInt64();
  ASSERT_TRUE(documents == kDocuments - kCommitEvery || documents == kDocuments) << documents;
  // Every folder of the commits kept is whole, and none after them is there.
  for (const int folder : {0, 89, 90, 99}) {
    const std::string filter = R"({"folder": "/v/s/d)" + std::to_string(folder) + R"("})";
    const int expected = folder * kCompound < documents ? kCompound : 0;
    EXPECT_EQ(expected, Ok(Request("search", filter))["data"]["total"].asInt()) << folder;
  }
  // And the index takes writes again.
  Ok(Upsert(kId, FileDoc("/v/s/after")));
  Ok(Command("commit", kId));
  EXPECT_EQ(documents + 1, Ok(Request("stats"))["data"]["indexes"][0]["documents"].asInt64());
}

TEST_F(KaloelasticdTest, BadFramesGetClearErrorsAndTheDaemonGoesOn) {
  Start();
  CreateIndex();
  const struct {
    const char* what;
    std::string bytes;
    bool shut_write;  // the client stops sending after these bytes
    int code;
  } cases[] = {
      {"length 0", LengthWord(0), false, search::kBadFrame},
      {"length 4 GiB", LengthWord(0xFFFFFFFFu), false, search::kBadFrame},
      {"shorter than announced", LengthWord(100) + "{\"command\"", true, search::kBadFrame},
      {"half a length word", std::string("\x10\x00", 2), true, search::kBadFrame},
      {"not JSON", Framed("this is not json"), false, search::kBadJson},
      {"no NUL at the end", LengthWord(2) + "{}", false, search::kBadJson},
      {"a NUL inside", LengthWord(6) + std::string("{}\0{}\0", 6), false, search::kBadJson},
      {"unknown command", Framed(R"({"command": "explode", "data": {}})"), false,
       search::kUnknownCommand},
      {"id with ..", Framed(R"({"command": "commit", "data": {"id": "fileindex_.."}})"), false,
       search::kBadIndexId},
  };
  for (const auto& c : cases) {
    FileDescriptor fd = ConnectUnix(SocketPath());
    ASSERT_TRUE(SendBytes(fd.get(), c.bytes)) << c.what;
    if (c.shut_write) ::shutdown(fd.get(), SHUT_WR);
    const Json::Value answer = ReadAnswer(fd.get());
    EXPECT_FALSE(answer["success"].asBool()) << c.what << ": " << toString(answer);
    EXPECT_EQ(c.code, answer["error"]["code"].asInt()) << c.what << ": " << toString(answer);
    EXPECT_FALSE(answer["error"]["msg"].asString().empty()) << c.what;
    StillServing();
  }
  // After a bad request (not a bad frame) the same connection serves on.
  FileDescriptor fd = ConnectUnix(SocketPath());
  ASSERT_TRUE(SendBytes(fd.get(), Framed("{oops")));
  EXPECT_EQ(search::kBadJson, ReadAnswer(fd.get())["error"]["code"].asInt());
  ASSERT_TRUE(SendBytes(fd.get(), Framed(toString(Command("commit", kId)))));
  EXPECT_TRUE(ReadAnswer(fd.get())["success"].asBool());
}

TEST_F(KaloelasticdTest, SilentAndHalfSentClientsHoldUpNobody) {
  Start();
  CreateIndex();
  FileDescriptor silent = ConnectUnix(SocketPath());
  FileDescriptor half = ConnectUnix(SocketPath());
  ASSERT_TRUE(SendBytes(half.get(), LengthWord(1000) + "{\"command\": "));
  std::vector<FileDescriptor> crowd;
  for (int i = 0; i < 50; ++i) crowd.push_back(ConnectUnix(SocketPath()));
  Ok(Upsert(kId, FileDoc("/v/s/meanwhile")));
  Ok(Command("commit", kId));
  StillServing();
}

TEST_F(KaloelasticdTest, SigtermFinishesTheAnswerBeingWritten) {
  Start();
  CreateIndex();
  Json::Value compound;
  for (int i = 0; i < 4000; ++i) {
    Json::Value doc = FileDoc("/v/s/dir/file-" + std::to_string(i));
    doc["KALOMDTitle"] = std::string(500, 'x');
    compound["compound"].append(Upsert(kId, doc));
  }
  Ok(compound);
  // An answer of about 2 MB, far more than the socket holds: the daemon is
  // still writing it when the signal comes.
  FileDescriptor fd = ConnectUnix(SocketPath());
  ASSERT_TRUE(
      SendBytes(fd.get(), Framed(toString(PrefixQuery("document_get_by_query", kId, "/v/s/")))));
  struct pollfd p = {fd.get(), POLLIN, 0};
  ASSERT_EQ(1, ::poll(&p, 1, 10000));
  ASSERT_TRUE(daemon_.Signal(SIGTERM));
  const Json::Value answer = ReadAnswer(fd.get());
  EXPECT_TRUE(answer["success"].asBool());
  EXPECT_EQ(4000u, answer["data"].size());
  EXPECT_EQ(0, daemon_.Wait());
  EXPECT_FALSE(std::filesystem::exists(SocketPath()));
}

TEST_F(KaloelasticdTest, TheToolSearchesAndShowsStats) {
  auto tool = [&](const std::vector<std::string>& args) {
    return RunIn(BuiltProgram("orvex"), args);
  };
  ProgramOutcome run = tool({"stats"});
  EXPECT_EQ(2, run.status);
  EXPECT_NE(std::string::npos, run.err.find("error 913")) << run.err;
  Start();
  CreateIndex();
  Ok(Upsert(kId, DocWith("/v/s/Straße.txt",
                         R"({"KALOMDFSSize": 42, "KALOMDTextContent": "a wonderful day"})")));
  Ok(Upsert(kId, FileDoc("/v/s/other.txt")));
  Ok(Command("commit", kId));
  run = tool({"search", "--name", "STRASSE"});
  EXPECT_EQ(0, run.status) << run.err;
  EXPECT_EQ("document\t42\t/v/s/Straße.txt\n1 of 1 hits\n", run.out);
  run = tool({"search", "wonder*", "--json"});
  EXPECT_EQ(0, run.status) << run.err;
  EXPECT_EQ("a [wonderful] day", ParseJson(run.out)["hits"][0]["snippet"].asString());
  run = tool({"search", "wonderful", "day"});
  EXPECT_EQ(2, run.status);
  EXPECT_NE(std::string::npos, run.err.find("quote a QUERY of several words")) << run.err;
  run = tool({"stats"});
  EXPECT_EQ(0, run.status) << run.err;
  EXPECT_EQ("fileindex_s\t2 documents\t", run.out.substr(0, 24)) << run.out;
  EXPECT_NE(std::string::npos, run.out.find("\tlast commit 20")) << run.out;
  run = tool({"search", "--sort", "colour"});
  EXPECT_EQ(2, run.status);
  EXPECT_NE(std::string::npos, run.err.find("error 1103")) << run.err;
}

}  // namespace
}  // namespace testing
}  // namespace orvex
