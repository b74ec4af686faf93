// Runs the built kalocontentextractd: its options, the one-shot mode on
// normal, faulty and special files (the test facility's faults), the daemon
// on its socket against misbehaving clients, its clean stop on SIGTERM; and
// `orvex extract` on top of it.
#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

#include "kalo/kalo_sock.h"
#include "orvex/portable/extract_protocol.h"
#include "orvex/portable/file_descriptor.h"
#include "support/program_test.h"
#include "support/sanitizer.h"

namespace orvex {
namespace testing {
namespace {

class KalocontentextractdTest : public ProgramTest {
 protected:
  KalocontentextractdTest() : ProgramTest("kalocontentextractd") {}
  void TearDown() override {
    if (daemon_pid_ > 0) StopDaemon();
  }

  ProgramOutcome RunWithFaults(const std::vector<std::string>& args) {
    return RunProgram(program_, args, {"ORVEX_ROOT=" + root_.path(), "ORVEX_EXTRACT_FAULTS=1"},
                      io_.path());
  }
  std::string SocketPath() const { return root_.Join("var/run/kalocontentextractd.sock"); }

  // Detached: the command returns once the socket is ready.
  void StartDaemon() {
    const ProgramOutcome started =
        RunWithFaults({"--workers", "1", "--deadline-ms", "300", "--memory-mb", "64"});
    ASSERT_EQ(0, started.status) << started.err;
    daemon_pid_ = std::stoi(ReadFileText(root_.Join("var/run/kalocontentextractd.pid")));
  }
  // SIGTERM, then wait for the daemon (not our child) to be gone.
  void StopDaemon() {
    const int pidfd = static_cast<int>(::syscall(SYS_pidfd_open, daemon_pid_, 0));
    ASSERT_GE(pidfd, 0);
    ASSERT_EQ(0, ::kill(daemon_pid_, SIGTERM));
    struct pollfd pfd = {pidfd, POLLIN, 0};
    EXPECT_EQ(1, ::poll(&pfd, 1, 10000));
    ::close(pidfd);
    daemon_pid_ = -1;
  }

  Json::Value Ask(const std::string& path) {
    kalodaemon::DomainSockConnection connection(SocketPath());
    EXPECT_TRUE(connection.Connect()) << std::strerror(errno);
    Json::Value request;
    request["path"] = path;
    EXPECT_TRUE(connection.Send(toString(request)));
    std::string message;
    EXPECT_TRUE(connection.Recv(message));
    // A text travels after the JSON text's NUL, announced by "text_bytes".
    const size_t nul = message.find('\0');
    Json::Value answer = Parse(message.substr(0, nul));
    if (nul != std::string::npos) {
      EXPECT_EQ(message.size() - nul - 1, answer["text_bytes"].asUInt64()) << message;
      answer["data"][orvex::portable::kExtractTextMember] = message.substr(nul + 1);
    }
    return answer;
  }

  // Raw bytes on a fresh connection, left open.
  FileDescriptor SendRaw(const std::string& bytes) {
    FileDescriptor fd(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    struct sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, SocketPath().c_str(), sizeof(address.sun_path) - 1);
    EXPECT_EQ(0,
              ::connect(fd.get(), reinterpret_cast<struct sockaddr*>(&address), sizeof(address)));
    EXPECT_EQ(static_cast<ssize_t>(bytes.size()),
              ::send(fd.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL));
    return fd;
  }

  pid_t daemon_pid_ = -1;
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
  StopDaemon();
  EXPECT_NE(0, ::access(SocketPath().c_str(), F_OK));
  EXPECT_NE(0, ::access(root_.Join("var/run/kalocontentextractd.pid").c_str(), F_OK));
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
  const std::string orvex_tool = std::string(ORVEX_BUILD_DIR) + "/orvex";
  std::filesystem::create_directories(root_.Join("usr/kalo/bin"));
  std::filesystem::create_symlink(program_, root_.Join("usr/kalo/bin/kalocontentextractd"));
  const std::string good = Write("files/report.txt", "hello");
  const std::string bad = Write("files/report.crash", "boom");
  const ProgramOutcome run =
      RunProgram(orvex_tool, {"extract", good, bad, "--meta", "--json"},
                 {"ORVEX_ROOT=" + root_.path(), "ORVEX_EXTRACT_FAULTS=1"}, io_.path());
  ASSERT_EQ(0, run.status) << run.err;
  const Json::Value files = Parse(run.out);
  ASSERT_EQ(2u, files.size());
  EXPECT_EQ("report.txt", files[0]["properties"]["KALOMDFSName"].asString());
  EXPECT_EQ(5, files[0]["properties"]["KALOMDFSSize"].asInt64());
  EXPECT_EQ("report.crash", files[1]["properties"]["KALOMDFSName"].asString());
  const Json::Value record = Parse(ReadFileText(root_.Join("var/lib/orvex/extract_failures.json")));
  EXPECT_TRUE(record["files"].isMember(bad));
  EXPECT_FALSE(record["files"].isMember(good));

  const ProgramOutcome text = RunProgram(orvex_tool, {"extract", root_.Join("files/missing")},
                                         {"ORVEX_ROOT=" + root_.path()}, io_.path());
  EXPECT_EQ(2, text.status);
  EXPECT_NE(std::string::npos, text.err.find("orvex: error 914: cannot examine")) << text.err;
}

}  // namespace
}  // namespace testing
}  // namespace orvex
