// Runs the built kalocontentextractd: its options, the one-shot mode on
// normal, faulty and special files (the test facility's faults), the daemon
// on its socket against misbehaving clients, its clean stop on SIGTERM; and
// `orvex extract` on top of it.
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <string>
#include <vector>

#include "orvex/portable/extract_protocol.h"
#include "support/framed_client.h"
#include "support/program_test.h"
#include "support/sanitizer.h"

namespace orvex {
namespace testing {
namespace {

class KalocontentextractdTest : public ProgramTest {
 protected:
  KalocontentextractdTest() : ProgramTest("kalocontentextractd") {}

  ProgramOutcome RunWithFaults(const std::vector<std::string>& args) {
    return RunIn(program_, args, {"ORVEX_EXTRACT_FAULTS=1"});
  }
  std::string SocketPath() const { return root_.Join("var/run/kalocontentextractd.sock"); }

  void StartDaemon() {
    StartDetached(daemon_, "kalocontentextractd",
                  {"--workers", "1", "--deadline-ms", "300", "--memory-mb", "64"},
                  {"ORVEX_EXTRACT_FAULTS=1"});
  }

  Json::Value Ask(const std::string& path) {
    const FileDescriptor fd = SendRaw(Framed(R"({"path": ")" + path + "\"}"));
    std::string message = ReadFrame(fd.get()).value_or("");
    EXPECT_FALSE(message.empty()) << path;
    if (!message.empty()) message.pop_back();  // the NUL that ends every message
    // A text travels after the JSON text's NUL, announced by "text_bytes".
    Json::Value answer = BodyJson(message);
    const size_t nul = message.find('\0');
    if (nul != std::string::npos) {
      EXPECT_EQ(message.size() - nul - 1, answer["text_bytes"].asUInt64()) << message;
      answer["data"][orvex::portable::kExtractTextMember] = message.substr(nul + 1);
    }
    return answer;
  }

  // Raw bytes on a fresh connection, left open.
  FileDescriptor SendRaw(const std::string& bytes) {
    FileDescriptor fd = ConnectUnix(SocketPath());
    EXPECT_TRUE(SendBytes(fd.get(), bytes));
    return fd;
  }

  DaemonProcess daemon_;
};

TEST_F(KalocontentextractdTest, OneShotPrintsTheMetadataObject) {
  const std::string path = Write("files/notes.txt", "hello\n");
  const ProgramOutcome run = Run({"--extract", path});
  ASSERT_EQ(0, run.status) << run.err;
  EXPECT_TRUE(Parse(run.out).isObject()) << run.out;
}

TEST_F(KalocontentextractdTest, OneShotEndsEachFaultWithItsOwnStatus) {
  ProgramOutcome run = RunWithFaults({"--extract", Write("files/a.crash", "x")});
  EXPECT_EQ(kSanitized ? 1 : -1, run.status);  // killed by its signal
  EXPECT_TRUE(run.out.empty());
  run = RunWithFaults(
      {"--extract", Write("files/a.hog", "x"), "--memory-mb", "64", "--deadline-ms", "300"});
  if (kSanitized) {
    EXPECT_NE(0, run.status);  // the sanitizer's own way of running out, or the alarm
  } else {
    EXPECT_EQ(orvex::portable::kExtractExitMemoryCap, run.status);
  }
  EXPECT_TRUE(run.out.empty());
  // The backstop alarm ends a loop whose caller is no longer there to kill it.
  run = RunWithFaults({"--extract", Write("files/a.hang", "x"), "--deadline-ms", "100"});
  EXPECT_EQ(-1, run.status);
  const std::string fifo = root_.Join("files/pipe");
  ASSERT_EQ(0, ::mkfifo(fifo.c_str(), 0600));
  run = RunWithFaults({"--extract", fifo});
  EXPECT_EQ(orvex::portable::kExtractExitNotRegular, run.status);
}

TEST_F(KalocontentextractdTest, DaemonAnswersOnA0660SocketAndStopsCleanlyOnSigterm) {
  StartDaemon();
  struct stat st;
  ASSERT_EQ(0, ::stat(SocketPath().c_str(), &st));
  EXPECT_EQ(0660u, st.st_mode & 07777);
  EXPECT_TRUE(Ask(Write("files/ok.txt", "text"))["ok"].asBool());
  EXPECT_EQ(0, daemon_.Stop());
  EXPECT_NE(0, ::access(SocketPath().c_str(), F_OK));
  EXPECT_NE(0, ::access(PidFile("kalocontentextractd").c_str(), F_OK));
}

TEST_F(KalocontentextractdTest, DaemonSurvivesGarbageHugeLengthsAndFaultyFiles) {
  StartDaemon();
  const FileDescriptor garbage = SendRaw("GET / HTTP/1.1\r\n\r\n");
  const FileDescriptor huge = SendRaw(std::string("\xff\xff\xff\xff", 4));
  const FileDescriptor half = SendRaw(std::string("\x10\x00", 2));
  EXPECT_EQ("crash", Ask(Write("files/b.crash", "x"))["fault"].asString());
  EXPECT_EQ("timeout", Ask(Write("files/b.hang", "x"))["fault"].asString());
  EXPECT_TRUE(Ask(Write("files/b.hog", "x"))["fault"].isString());
  const Json::Value fine = Ask(Write("files/fine.txt", "text"));
  EXPECT_TRUE(fine["ok"].asBool()) << fine;
  EXPECT_NE(std::string::npos, fine["data"]["KALOMDTextContent"].asString().find("text")) << fine;
  // The huge length was refused with an answer, then the connection closed.
  char buffer[256];
  const ssize_t n = ::recv(huge.get(), buffer, sizeof(buffer), 0);
  ASSERT_GT(n, 4);
  EXPECT_NE(std::string::npos, std::string(buffer + 4, n - 4).find("request longer than"));
  EXPECT_EQ(0, ::recv(huge.get(), buffer, sizeof(buffer), 0));
}

TEST_F(KalocontentextractdTest, OrvexExtractPrintsAttributesAndMetadata) {
  const std::string orvex_tool = BuiltProgram("orvex");
  std::filesystem::create_directories(root_.Join("usr/kalo/bin"));
  std::filesystem::create_symlink(program_, root_.Join("usr/kalo/bin/kalocontentextractd"));
  const std::string good = Write("files/report.txt", "hello");
  const std::string bad = Write("files/report.crash", "boom");
  const ProgramOutcome run =
      RunIn(orvex_tool, {"extract", good, bad, "--meta", "--json"}, {"ORVEX_EXTRACT_FAULTS=1"});
  ASSERT_EQ(0, run.status) << run.err;
  const Json::Value files = Parse(run.out);
  ASSERT_EQ(2u, files.size());
  EXPECT_EQ("report.txt", files[0]["properties"]["KALOMDFSName"].asString());
  EXPECT_EQ(5, files[0]["properties"]["KALOMDFSSize"].asInt64());
  EXPECT_EQ("report.crash", files[1]["properties"]["KALOMDFSName"].asString());
  const Json::Value record = Parse(ReadFileText(root_.Join("var/lib/orvex/extract_failures.json")));
  EXPECT_TRUE(record["files"].isMember(bad));
  EXPECT_FALSE(record["files"].isMember(good));

  const ProgramOutcome text = RunIn(orvex_tool, {"extract", root_.Join("files/missing")});
  EXPECT_EQ(2, text.status);
  EXPECT_NE(std::string::npos, text.err.find("orvex: error 914: cannot examine")) << text.err;
}

}  // namespace
}  // namespace testing
}  // namespace orvex
