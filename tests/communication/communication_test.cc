#include "orvex/communication.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

#include "foundation/fault_helpers.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/portable/root.h"
#include "support/framed_peer.h"
#include "support/log_capture.h"
#include "support/sanitizer.h"
#include "support/temp_dir.h"

namespace orvex {
namespace fileindex {
namespace {

class SendCommandTest : public ::testing::Test {
 protected:
  SendCommandTest() { std::filesystem::create_directories(temp_.Join("var/run")); }

  std::string FailureReason() {
    try {
      SendCommandToDaemon("resume", Json::Value());
    } catch (const Error& e) {
      EXPECT_EQ(e.code(), kErrorSystem);
      return e.reason();
    }
    return "(no error)";
  }

  testing::TempDir temp_;
  testing::ScopedOrvexRoot root_{temp_.path()};
  const std::string socket_path_ = portable::RootPath(kFileIndexDaemonSockPath);
  std::vector<unsigned long> sleeps_;
};

TEST_F(SendCommandTest, FramesTypeAndDataAsNulTerminatedJson) {
  Json::Value data(Json::objectValue);
  data["share_name"] = std::string(5000, 's');  // several write chunks
  {
    testing::FramedPeer daemon(socket_path_);
    ASSERT_TRUE(daemon.listening());
    SendCommandToDaemon("worker_create", data);
    SendCommandToDaemon("resume", Json::Value());
    ASSERT_EQ(daemon.requests().size(), 2u);
    EXPECT_TRUE(daemon.faults().empty());
    EXPECT_EQ(daemon.requests()[0]["data"], data);
    EXPECT_EQ(toString(daemon.requests()[1]), R"({"data":null,"type":"resume"})");
  }
}

TEST_F(SendCommandTest, RetriesOnlyWhileTheSocketIsMissingAndLeavesSigpipeIgnored) {
  ::signal(SIGPIPE, SIG_DFL);
  ScopedSystemHooks hooks(
      SystemHooks{nullptr, [this](unsigned long micros) { sleeps_.push_back(micros); }, nullptr});
  EXPECT_EQ(FailureReason().rfind("write failed, reason=", 0), 0u);
  EXPECT_EQ(sleeps_, std::vector<unsigned long>(4, 1000000));
  struct sigaction current;
  ASSERT_EQ(::sigaction(SIGPIPE, nullptr, &current), 0);
  EXPECT_EQ(current.sa_handler, SIG_IGN);
  sleeps_.clear();
  temp_.Write("var/run/fileindexd.sock", "not a socket");  // refused, not missing
  EXPECT_EQ(FailureReason().rfind("write failed, reason=", 0), 0u);
  EXPECT_TRUE(sleeps_.empty());
}

TEST_F(SendCommandTest, SocketCreationFailureIsLoggedAndThrown) {
  if (testing::kSanitized) {
    // The sanitizers open descriptors of their own; with none left they report false errors.
    GTEST_SKIP() << "needs free descriptors under the sanitizers";
  }
  const int next_fd = ::dup(0);  // a descriptor limit at the next free number
  ASSERT_GE(next_fd, 0);
  ::close(next_fd);
  testing::LogCapture log;
  std::string reason;
  {
    testing::ScopedRlimit no_descriptors(RLIMIT_NOFILE, static_cast<rlim_t>(next_fd));
    ASSERT_TRUE(no_descriptors.ok());
    reason = FailureReason();
  }
  const std::string text = std::strerror(EMFILE);
  EXPECT_EQ(reason, "socket failed, reason=" + text);
  ASSERT_EQ(log.lines().size(), 1u);
  EXPECT_EQ(testing::WithoutLineNumber(log.lines()[0]),
            testing::CheckLine("communication", "0 > (fd_socket = socket(PF_UNIX, SOCK_STREAM, 0))",
                               reason) +
                " [err: " + text + "]");
}

// SOCK_SEQPACKET keeps each write as one record and hands out at most one
// record per read, which makes the chunking and the short reads visible.
class BufferTest : public ::testing::Test {
 protected:
  void SetUp() override { ASSERT_EQ(::socketpair(AF_UNIX, SOCK_SEQPACKET, 0, fds_), 0); }
  void TearDown() override {
    for (int fd : fds_) ::close(fd);
  }

  int fds_[2] = {-1, -1};
  const std::string data_ = std::string(1500, 'a') + std::string(1500, 'b');
};

TEST_F(BufferTest, WriteSplitsIntoChunksOf1024AndReadGathersShortReads) {
  BufferWrite(fds_[0], static_cast<unsigned int>(data_.size()),
              reinterpret_cast<const unsigned char*>(data_.data()));
  std::vector<size_t> records;
  std::string received;
  char buf[4096];
  while (received.size() < data_.size()) {
    const ssize_t n = ::recv(fds_[1], buf, sizeof(buf), 0);
    ASSERT_GT(n, 0);
    records.push_back(static_cast<size_t>(n));
    received.append(buf, static_cast<size_t>(n));
  }
  EXPECT_EQ(records, (std::vector<size_t>{1024, 1024, 952}));
  EXPECT_EQ(received, data_);
  for (size_t offset = 0; offset < data_.size(); offset += 300) {
    if (offset == 600) ::send(fds_[1], "", 0, 0);  // a read that returns 0
    ASSERT_EQ(::send(fds_[1], data_.data() + offset, 300, 0), 300);
  }
  received.assign(data_.size(), '\0');
  BufferRead(fds_[0], static_cast<unsigned int>(received.size()),
             reinterpret_cast<unsigned char*>(received.data()));
  EXPECT_EQ(received, data_);
}

TEST_F(BufferTest, FailuresCarryTheSystemReason) {
  unsigned char buf[16] = {};
  EXPECT_NO_THROW(BufferRead(-1, 0, nullptr));
  try {
    BufferRead(-1, sizeof(buf), buf);
    ADD_FAILURE() << "read from a closed descriptor";
  } catch (const Error& e) {
    EXPECT_EQ(e.code(), kErrorSystem);
    EXPECT_EQ(e.reason(), std::string("read failed, reason=") + std::strerror(EBADF));
  }
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
