#include "orvex/communication.h"

#include <gtest/gtest.h>
#include <pthread.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "foundation/fault_helpers.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/portable/root.h"
#include "support/log_capture.h"
#include "support/temp_dir.h"

namespace orvex {
namespace fileindex {
namespace {

bool Whole(ssize_t done, size_t size) { return done == static_cast<ssize_t>(size); }

// A stand-in for fileindexd serving one connection: it reads one framed
// request, answers with a framed reply of reply_size bytes, then records
// whether the client had read the whole reply before hanging up.
class DaemonPeer {
 public:
  DaemonPeer(const std::string& path, uint32_t reply_size) : path_(path) {
    listen_fd_ = ::socket(AF_UNIX, SOCK_STREAM, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path.c_str(), sizeof(address.sun_path) - 1);
    bound_ = ::bind(listen_fd_, reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0 &&
             ::listen(listen_fd_, 4) == 0;
    if (bound_) thread_ = std::thread([this, reply_size] { Serve(reply_size); });
  }
  ~DaemonPeer() {
    ::shutdown(listen_fd_, SHUT_RDWR);  // wakes an accept that no client will answer
    Join();
    ::close(listen_fd_);
    if (bound_) ::unlink(path_.c_str());
  }

  bool bound() const { return bound_; }
  void Join() {
    if (thread_.joinable()) thread_.join();
  }

  // The request's body as received; valid after Join().
  std::string body;
  bool reply_fully_read = false;

 private:
  void Serve(uint32_t reply_size) {
    const int fd = ::accept(listen_fd_, nullptr, nullptr);
    if (fd < 0) return;
    uint32_t length = 0;
    const std::string reply(reply_size, 'r');
    if (Whole(::recv(fd, &length, sizeof(length), MSG_WAITALL), sizeof(length))) {
      body.resize(length);
      if (Whole(::recv(fd, body.data(), length, MSG_WAITALL), length) &&
          Whole(::send(fd, &reply_size, sizeof(reply_size), MSG_NOSIGNAL), sizeof(reply_size)) &&
          Whole(::send(fd, reply.data(), reply.size(), MSG_NOSIGNAL), reply.size())) {
        // A client that closes with part of the reply unread resets the
        // connection instead of ending it cleanly.
        char c;
        reply_fully_read = ::read(fd, &c, 1) == 0;
      }
    }
    ::close(fd);
  }

  const std::string path_;
  int listen_fd_ = -1;
  bool bound_ = false;
  std::thread thread_;
};

class SendCommandTest : public ::testing::Test {
 protected:
  SendCommandTest() { std::filesystem::create_directories(temp_.Join("var/run")); }

  // Records each sleep, then runs on_sleep.
  ScopedSystemHooks RecordingSleeps(std::function<void()> on_sleep = [] {}) {
    SystemHooks hooks;
    hooks.sleep_for = [this, on_sleep](unsigned long micros) {
      sleeps_.push_back(micros);
      on_sleep();
    };
    return ScopedSystemHooks(std::move(hooks));
  }

  // Sends and returns the request the peer received, parsed.
  Json::Value SendAndReceive(const std::string& command, const Json::Value& data,
                             uint32_t reply_size = 2) {
    DaemonPeer peer(socket_path_, reply_size);
    EXPECT_TRUE(peer.bound());
    SendCommandToDaemon(command, data);
    peer.Join();
    EXPECT_TRUE(peer.reply_fully_read) << reply_size;
    // The length counts the text and its NUL, which comes last and only there.
    EXPECT_EQ(peer.body.find('\0'), peer.body.size() - 1) << peer.body;
    Json::Value request;
    EXPECT_TRUE(fromString(request, peer.body.c_str())) << peer.body;
    return request;
  }

  void ExpectWriteFailure() {
    try {
      SendCommandToDaemon("resume", Json::Value());
      ADD_FAILURE() << "sent without a daemon";
    } catch (const Error& e) {
      EXPECT_EQ(e.code(), kErrorSystem);
      EXPECT_EQ(e.reason().rfind("write failed, reason=", 0), 0u) << e.reason();
    }
  }

  testing::TempDir temp_;
  testing::ScopedOrvexRoot root_{temp_.path()};
  const std::string socket_path_ = portable::RootPath(kFileIndexDaemonSockPath);
  std::vector<unsigned long> sleeps_;
};

TEST_F(SendCommandTest, FramesTypeAndDataAsNulTerminatedJsonAndReadsWholeReplies) {
  Json::Value data(Json::objectValue);
  data["resume_time"] = 1700000000;
  Json::Value expected(Json::objectValue);
  expected["type"] = "pause";
  expected["data"] = data;
  EXPECT_EQ(SendAndReceive("pause", data), expected);
  expected["type"] = "resume";
  expected["data"] = Json::Value();
  EXPECT_EQ(SendAndReceive("resume", Json::Value()), expected);  // "data": null, not left out
  data["share_name"] = std::string(5000, 's');
  for (uint32_t reply_size : {0u, 1u, 1023u, 1024u, 1025u, 70000u, 200000u}) {
    EXPECT_EQ(SendAndReceive("worker_create", data, reply_size)["data"], data) << reply_size;
  }
}

TEST_F(SendCommandTest, RetriesOnlyWhileTheSocketIsMissingAndLeavesSigpipeIgnored) {
  ::signal(SIGPIPE, SIG_DFL);
  ScopedSystemHooks hooks = RecordingSleeps();
  ExpectWriteFailure();
  EXPECT_EQ(sleeps_, std::vector<unsigned long>(4, 1000000));
  struct sigaction current;
  ASSERT_EQ(::sigaction(SIGPIPE, nullptr, &current), 0);
  EXPECT_EQ(current.sa_handler, SIG_IGN);
  sleeps_.clear();
  temp_.Write("var/run/fileindexd.sock", "not a socket");  // refused, not missing
  ExpectWriteFailure();
  EXPECT_TRUE(sleeps_.empty());
}

TEST_F(SendCommandTest, ConnectsOnceTheDaemonCreatesItsSocket) {
  std::unique_ptr<DaemonPeer> peer;
  ScopedSystemHooks hooks = RecordingSleeps([&] {
    if (sleeps_.size() == 2) peer = std::make_unique<DaemonPeer>(socket_path_, 8);
  });
  SendCommandToDaemon("worker_delete", Json::Value());
  ASSERT_NE(peer, nullptr);
  peer->Join();
  EXPECT_EQ(sleeps_.size(), 2u);
  EXPECT_NE(peer->body.find("\"worker_delete\""), std::string::npos) << peer->body;
}

TEST_F(SendCommandTest, SocketCreationFailureIsLoggedAndThrown) {
#if defined(__SANITIZE_ADDRESS__)
  // The sanitizers' own checks open descriptors (a pipe to probe memory);
  // with none left they report false errors.
  GTEST_SKIP() << "needs free descriptors under the sanitizers";
#endif
  const int next_fd = ::dup(0);  // a descriptor limit at the next free number
  ASSERT_GE(next_fd, 0);
  ::close(next_fd);
  testing::LogCapture log;
  std::string reason;
  int errno_after = -1;
  {
    testing::ScopedRlimit no_descriptors(RLIMIT_NOFILE, static_cast<rlim_t>(next_fd));
    ASSERT_TRUE(no_descriptors.ok());
    try {
      SendCommandToDaemon("resume", Json::Value());
    } catch (const Error& e) {
      reason = e.reason();
    }
    errno_after = errno;
  }
  const std::string text = std::strerror(EMFILE);
  EXPECT_EQ(reason, "socket failed, reason=" + text);
  EXPECT_EQ(errno_after, 0);
  ASSERT_EQ(log.lines().size(), 1u);
  EXPECT_EQ(testing::WithoutLineNumber(log.lines()[0]),
            testing::CheckLine("communication", "0 > (fd_socket = socket(PF_UNIX, SOCK_STREAM, 0))",
                               reason) +
                " [err: " + text + "]");
}

// BufferRead and BufferWrite on socket pairs. SOCK_SEQPACKET keeps each
// write as one record and hands out at most one record per read, which makes
// the chunking and the short reads visible.
class BufferTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_SEQPACKET, 0, fds_), 0);
    old_sigpipe_ = ::signal(SIGPIPE, SIG_IGN);
  }
  void TearDown() override {
    for (int fd : fds_) {
      if (fd >= 0) ::close(fd);
    }
    ::signal(SIGPIPE, old_sigpipe_);
  }

  static std::string ErrorReason(const std::function<void()>& call) {
    try {
      call();
    } catch (const Error& e) {
      EXPECT_EQ(e.code(), kErrorSystem);
      return e.reason();
    }
    return "(no error)";
  }

  int fds_[2] = {-1, -1};
  sighandler_t old_sigpipe_ = SIG_DFL;
  const std::string data_ = [] {
    std::string s(3000, '\0');
    for (size_t i = 0; i < s.size(); ++i) s[i] = static_cast<char>('a' + i % 26);
    return s;
  }();
};

TEST_F(BufferTest, WriteSplitsIntoChunksOfAtMost1024Bytes) {
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
}

TEST_F(BufferTest, ReadGathersShortReadsAndSkipsEmptyOnes) {
  for (size_t offset = 0; offset < data_.size(); offset += 300) {
    if (offset == 600) ::send(fds_[1], "", 0, 0);  // a read that returns 0
    ASSERT_EQ(::send(fds_[1], data_.data() + offset, 300, 0), 300);
  }
  std::string received(data_.size(), '\0');
  BufferRead(fds_[0], static_cast<unsigned int>(received.size()),
             reinterpret_cast<unsigned char*>(received.data()));
  EXPECT_EQ(received, data_);
}

TEST_F(BufferTest, FailuresCarryTheSystemReasonAndSizeZeroMakesNoCall) {
  unsigned char buf[16] = {};
  EXPECT_NO_THROW(BufferRead(-1, 0, nullptr));
  EXPECT_NO_THROW(BufferWrite(-1, 0, nullptr));
  ::close(fds_[1]);
  fds_[1] = -1;
  EXPECT_EQ(ErrorReason([&] { BufferWrite(fds_[0], sizeof(buf), buf); }),
            std::string("write failed, reason=") + std::strerror(EPIPE));
  EXPECT_EQ(ErrorReason([&] { BufferRead(-1, sizeof(buf), buf); }),
            std::string("read failed, reason=") + std::strerror(EBADF));
  EXPECT_EQ(ErrorReason([&] { BufferWrite(-1, sizeof(buf), buf); }),
            std::string("write failed, reason=") + std::strerror(EBADF));
}

std::atomic<int> interrupt_count{0};
void CountInterrupt(int) { interrupt_count.fetch_add(1); }

TEST_F(BufferTest, EleventhInterruptionFailsTheRead) {
  struct sigaction action {};
  action.sa_handler = CountInterrupt;  // no SA_RESTART: a blocked read returns EINTR
  struct sigaction old_action;
  ASSERT_EQ(::sigaction(SIGUSR1, &action, &old_action), 0);
  interrupt_count = 0;
  std::atomic<bool> done{false};
  std::string reason;
  int interrupts_at_failure = 0;
  std::thread reader([&] {
    unsigned char byte = 0;
    reason = ErrorReason([&] { BufferRead(fds_[0], 1, &byte); });
    interrupts_at_failure = interrupt_count.load();
    done = true;
  });
  // Signals are paced so that each one finds the reader blocked again; the
  // byte that ends the read is sent only if the reader never gives up.
  for (int i = 0; i < 2000 && !done; ++i) {
    ::pthread_kill(reader.native_handle(), SIGUSR1);
    ::usleep(500);
  }
  if (!done) ::send(fds_[1], "x", 1, 0);
  reader.join();
  ::sigaction(SIGUSR1, &old_action, nullptr);
  EXPECT_EQ(reason, std::string("read failed, reason=") + std::strerror(EINTR));
  EXPECT_GE(interrupts_at_failure, 11);
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
