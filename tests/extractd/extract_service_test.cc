// The extraction daemon's loop driven step by step: real worker processes
// forked from this test, real faults in them (a crash, an endless loop, an
// endless allocation), and clients that misbehave on the real socket.
#include "extract_service.h"

#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "orvex/portable/file_descriptor.h"
#include "support/framed_client.h"
#include "support/sanitizer.h"
#include "support/temp_dir.h"

namespace orvex {
namespace portable {
namespace {

using testing::kSanitized;

constexpr int kDeadlineMs = 300;
constexpr int kMemoryMb = 64;

// A text as a parser may give it: UTF-8 beyond ASCII, quotes, a backslash
// and a NUL, none of which may be escaped on its way to the caller.
constexpr char kText[] = "caf\xc3\xa9 \"\xe4\xbc\x9a\xe8\xad\xb0\"\\\n\0end";

bool EndsWith(const std::string& text, const std::string& suffix) {
  return text.size() >= suffix.size() &&
         text.compare(text.size() - suffix.size(), suffix.size(), suffix) == 0;
}

// Runs in the workers. A parser's faults, chosen by name; otherwise it
// reports the file's first line as a title.
bool TestExtractor(const std::string& path, Json::Value& out, std::string* problem) {
  if (EndsWith(path, ".crash")) ::raise(SIGSEGV);
  if (EndsWith(path, ".hang")) {
    for (volatile int spin = 0;; spin = spin + 1) {
    }
  }
  if (EndsWith(path, ".hog")) {
    std::vector<char*> kept;
    for (size_t i = 0; i < 4096; ++i) {  // 4 GiB: far past the cap
      kept.push_back(new char[1 << 20]);
      std::memset(kept.back(), 1, 1 << 20);
    }
    ::_exit(99);  // the cap did not stop it
  }
  if (EndsWith(path, ".text")) {
    out["KALOMDTitle"] = "with text";
    out["KALOMDTextContent"] = std::string(kText, sizeof(kText) - 1);
    return true;
  }
  if (EndsWith(path, ".bad")) {
    out["KALOMDTitle"] = "partial";
    *problem = "test parser: corrupt";
    return false;
  }
  out["KALOMDTitle"] = path.substr(path.rfind('/') + 1);
  return true;
}

class ExtractServiceTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ExtractServiceOptions options;
    options.socket_path = dir_.Join("run/extract.sock");
    options.workers = 1;
    options.deadline_ms = kDeadlineMs;
    options.memory_mb = kMemoryMb;
    options.max_request_bytes = 4096;
    options.idle_ms = 200;
    service_ = std::make_unique<ExtractService>(options, TestExtractor);
    ASSERT_TRUE(service_->Start()) << std::strerror(errno);
  }

  FileDescriptor Connect() { return testing::ConnectUnix(dir_.Join("run/extract.sock")); }

  static void SendRaw(const FileDescriptor& fd, const std::string& bytes) {
    ASSERT_TRUE(testing::SendBytes(fd.get(), bytes));
  }

  // One answer's body without its final NUL, stepping the service while it
  // comes; nullopt when the service closed the connection instead.
  std::optional<std::string> ReceiveBody(const FileDescriptor& fd) {
    std::optional<std::string> body =
        testing::ReadFrame(fd.get(), [this] { service_->RunOnce(50); });
    char byte;
    if (!body) {
      EXPECT_EQ(0, ::recv(fd.get(), &byte, 1, MSG_DONTWAIT)) << "no answer, yet not closed";
    } else if (!body->empty() && body->back() == '\0') {
      body->pop_back();
    }
    return body;
  }

  // One answer's JSON text (up to the NUL that a text may follow), parsed;
  // null when the service closed the connection instead.
  Json::Value Receive(const FileDescriptor& fd) { return testing::BodyJson(ReceiveBody(fd)); }

  Json::Value Ask(const std::string& path) {
    const FileDescriptor fd = Connect();
    Json::Value request;
    request["path"] = path;
    SendRaw(fd, testing::Framed(Json::writeString(Json::StreamWriterBuilder(), request)));
    return Receive(fd);
  }

  std::string File(const std::string& name) { return dir_.Write(name, "some text\n"); }

  // A fault answer for file, then the next file through a fresh worker.
  Json::Value ExpectFaultThenRecovery(const std::string& name) {
    const uint64_t started = service_->workers_started();
    const Json::Value answer = Ask(File(name));
    EXPECT_FALSE(answer["ok"].asBool()) << answer;
    const Json::Value next = Ask(File("after.txt"));
    EXPECT_TRUE(next["ok"].asBool()) << next;
    EXPECT_EQ("after.txt", next["data"]["KALOMDTitle"].asString());
    EXPECT_EQ(started + 1, service_->workers_started());
    EXPECT_EQ(1u, service_->live_workers());
    return answer;
  }

  testing::TempDir dir_;
  std::unique_ptr<ExtractService> service_;
};

// A file the parser read gives its properties; a corrupt one what was read
// and why, but no fault.
TEST_F(ExtractServiceTest, AnswersWithTheParsersPropertiesAndProblem) {
  const Json::Value answer = Ask(File("report.txt"));
  EXPECT_TRUE(answer["ok"].asBool()) << answer;
  EXPECT_EQ("report.txt", answer["data"]["KALOMDTitle"].asString());
  EXPECT_FALSE(answer.isMember("fault"));
  const Json::Value corrupt = Ask(File("x.bad"));
  EXPECT_FALSE(corrupt["ok"].asBool());
  EXPECT_EQ("partial", corrupt["data"]["KALOMDTitle"].asString());
  EXPECT_EQ("test parser: corrupt", corrupt["reason"].asString());
  EXPECT_FALSE(corrupt.isMember("fault"));
}

TEST_F(ExtractServiceTest, TextFollowsTheAnswersJsonTextAsItsOwnBytes) {
  const FileDescriptor fd = Connect();
  SendRaw(fd, testing::Framed("{\"path\": \"" + File("long.text") + "\"}"));
  const std::string body = ReceiveBody(fd).value_or("");
  const size_t nul = body.find('\0');
  ASSERT_NE(std::string::npos, nul) << body;
  const Json::Value answer = testing::BodyJson(body);
  EXPECT_TRUE(answer["ok"].asBool()) << answer;
  EXPECT_EQ("with text", answer["data"]["KALOMDTitle"].asString());
  EXPECT_FALSE(answer["data"].isMember("KALOMDTextContent"));
  const std::string text(kText, sizeof(kText) - 1);
  EXPECT_EQ(text.size(), answer["text_bytes"].asUInt64());
  EXPECT_EQ(text, body.substr(nul + 1));
  // The same connection carries the next request, without a text.
  SendRaw(fd, testing::Framed("{\"path\": \"" + File("next.txt") + "\"}"));
  const std::string next = ReceiveBody(fd).value_or("");
  EXPECT_EQ(std::string::npos, next.find('\0')) << next;
}

// A crash, an endless loop and an endless allocation each cost one worker,
// replaced at once, and the caller is told which fault it was.
TEST_F(ExtractServiceTest, FaultyWorkerIsReplacedAndTheNextFileExtracts) {
  const struct {
    const char* name;
    const char* fault;
    const char* reason;  // nullptr: not checked
  } cases[] = {
      {"a.crash", "crash", nullptr},
      {"a.hang", "timeout", "took longer than the deadline of 300 ms"},
      {"a.hog", "memory", "exceeded the memory cap of 64 MiB"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    const Json::Value answer = ExpectFaultThenRecovery(c.name);
    if (kSanitized && std::string(c.fault) == "memory") {
      EXPECT_TRUE(answer["fault"].isString()) << answer;  // its allocator may die first
      continue;
    }
    EXPECT_EQ(c.fault, answer["fault"].asString()) << answer;
    if (c.reason != nullptr) {
      EXPECT_EQ(c.reason, answer["reason"].asString());
    }
  }
}

TEST_F(ExtractServiceTest, NonRegularFilesAreRefusedUnopened) {
  const std::string fifo = dir_.Join("pipe");
  ASSERT_EQ(0, ::mkfifo(fifo.c_str(), 0600));
  const std::string link = dir_.Join("zero.crash");  // would crash if parsed
  ASSERT_EQ(0, ::symlink("/dev/zero", link.c_str()));
  for (const std::string& path : {fifo, link, std::string("/dev/zero")}) {
    const Json::Value answer = Ask(path);
    EXPECT_FALSE(answer["ok"].asBool()) << path;
    EXPECT_TRUE(answer["not_regular"].asBool()) << path;
  }
  EXPECT_EQ(1u, service_->workers_started());
}

TEST_F(ExtractServiceTest, GarbageGetsAnErrorAndTheConnectionStaysUsable) {
  const FileDescriptor fd = Connect();
  SendRaw(fd, testing::Framed("this is not json"));
  const Json::Value answer = Receive(fd);
  EXPECT_FALSE(answer["ok"].asBool());
  EXPECT_EQ(0u, answer["reason"].asString().rfind("bad request", 0)) << answer;
  SendRaw(fd, testing::Framed("{\"path\": \"" + File("ok.txt") + "\"}"));
  EXPECT_EQ("ok.txt", Receive(fd)["data"]["KALOMDTitle"].asString());
}

TEST_F(ExtractServiceTest, RequestsSentTogetherAreAnsweredOneByOneInOrder) {
  const FileDescriptor fd = Connect();
  std::string burst;
  for (int i = 0; i < 200; ++i) burst += testing::Framed("not json " + std::to_string(i));
  burst += testing::Framed("{\"path\": \"" + File("last.txt") + "\"}");
  SendRaw(fd, burst);
  for (int i = 0; i < 200; ++i) {
    EXPECT_EQ(0u, Receive(fd)["reason"].asString().rfind("bad request", 0)) << i;
  }
  EXPECT_EQ("last.txt", Receive(fd)["data"]["KALOMDTitle"].asString());
}

TEST_F(ExtractServiceTest, HugeLengthIsRefusedAndClosedWhileOthersAreServed) {
  const FileDescriptor liar = Connect();
  SendRaw(liar, std::string("\xff\xff\xff\x7f", 4) + "{\"path\"");
  const Json::Value answer = Receive(liar);
  EXPECT_EQ("request longer than 4096 bytes", answer["reason"].asString()) << answer;
  EXPECT_TRUE(Receive(liar).isNull());  // closed
  EXPECT_TRUE(Ask(File("fine.txt"))["ok"].asBool());
}

TEST_F(ExtractServiceTest, StalledClientIsDroppedAndDoesNotDelayOthers) {
  const FileDescriptor stalled = Connect();
  SendRaw(stalled, std::string("\x20\x00", 2));  // half a length word, then nothing
  EXPECT_TRUE(Ask(File("fine.txt"))["ok"].asBool());
  EXPECT_TRUE(Receive(stalled).isNull());  // dropped after the idle time
  EXPECT_EQ(0u, service_->connections());
}

TEST_F(ExtractServiceTest, ClientThatLeavesBeforeItsAnswerCostsNothing) {
  {
    const FileDescriptor gone = Connect();
    SendRaw(gone, testing::Framed("{\"path\": \"" + File("slow.hang") + "\"}"));
    for (int round = 0; round < 3; ++round) service_->RunOnce(0);  // accept, read, dispatch
  }
  // Whether the abandoned file reached the only worker depends on how fast
  // that worker started. If it did, the next file may wait in the queue past
  // its own deadline and be answered busy, but never more than once: the
  // hung worker is stopped at its deadline and replaced.
  Json::Value next = Ask(File("next.txt"));
  if (next["busy"].asBool()) next = Ask(File("next.txt"));
  EXPECT_TRUE(next["ok"].asBool()) << next;
  EXPECT_EQ("next.txt", next["data"]["KALOMDTitle"].asString());
}

TEST_F(ExtractServiceTest, SecondDaemonOnTheSameSocketIsRefused) {
  ExtractServiceOptions options;
  options.socket_path = dir_.Join("run/extract.sock");
  ExtractService second(options, TestExtractor);
  EXPECT_FALSE(second.Start());
  EXPECT_EQ(EADDRINUSE, errno);
  EXPECT_TRUE(Ask(File("still.txt"))["ok"].asBool());
}

TEST_F(ExtractServiceTest, TheSocketIsMode0660UntilStopRemovesItAndTheWorkers) {
  struct stat st;
  ASSERT_EQ(0, ::stat(dir_.Join("run/extract.sock").c_str(), &st));
  EXPECT_TRUE(S_ISSOCK(st.st_mode));
  EXPECT_EQ(0660u, st.st_mode & 07777);
  ASSERT_EQ(1u, service_->live_workers());
  service_->Stop();
  EXPECT_EQ(0u, service_->live_workers());
  EXPECT_NE(0, ::access(dir_.Join("run/extract.sock").c_str(), F_OK));
}

}  // namespace
}  // namespace portable
}  // namespace orvex
