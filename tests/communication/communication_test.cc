#include "orvex/communication.h"

#include <gtest/gtest.h>
#include <pthread.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstdint>
#include <cstring>
#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/portable/root.h"
#include "support/log_capture.h"
#include "support/temp_dir.h"

namespace orvex {
namespace fileindex {
namespace {

bool ReadExact(int fd, void* buf, size_t size) {
  auto* p = static_cast<unsigned char*>(buf);
  while (size > 0) {
    ssize_t n = ::read(fd, p, size);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) return false;
    p += n;
    size -= static_cast<size_t>(n);
  }
  return true;
}

bool WriteExact(int fd, const void* buf, size_t size) {
  const auto* p = static_cast<const unsigned char*>(buf);
  while (size > 0) {
    ssize_t n = ::write(fd, p, size);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) return false;
    p += n;
    size -= static_cast<size_t>(n);
  }
  return true;
}

// A stand-in for fileindexd: listens on the daemon's socket, takes one
// framed request, answers with a framed reply of the given size, then waits
// for the client to hang up and records whether it had read the whole reply.
class DaemonPeer {
 public:
  DaemonPeer(const std::string& path, uint32_t reply_size) : path_(path), reply_size_(reply_size) {
    listen_fd_ = ::socket(AF_UNIX, SOCK_STREAM, 0);
    struct sockaddr_un address;
    std::memset(&address, 0, sizeof(address));
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path.c_str(), sizeof(address.sun_path) - 1);
    bound_ = ::bind(listen_fd_, reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0 &&
             ::listen(listen_fd_, 4) == 0;
    if (bound_) thread_ = std::thread([this] { Serve(); });
  }
  DaemonPeer(const DaemonPeer&) = delete;
  DaemonPeer& operator=(const DaemonPeer&) = delete;
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

  // Valid after Join().
  uint32_t length = 0;
  std::string body;
  bool reply_fully_read = false;

 private:
  void Serve() {
    int fd = ::accept(listen_fd_, nullptr, nullptr);
    if (fd < 0) return;
    if (ReadExact(fd, &length, sizeof(length))) {
      body.resize(length);
      if (ReadExact(fd, body.data(), length)) Reply(fd);
    }
    ::close(fd);
  }

  void Reply(int fd) {
    std::string reply(reply_size_, 'r');
    if (!WriteExact(fd, &reply_size_, sizeof(reply_size_)) ||
        !WriteExact(fd, reply.data(), reply.size())) {
      return;
    }
    // A client that closes with part of the reply unread resets the
    // connection instead of ending it cleanly.
    char c;
    reply_fully_read = ::read(fd, &c, 1) == 0;
  }

  const std::string path_;
  uint32_t reply_size_;
  int listen_fd_ = -1;
  bool bound_ = false;
  std::thread thread_;
};

class SendCommandTest : public ::testing::Test {
 protected:
  SendCommandTest() : root_(temp_.path()) {
    ::mkdir(temp_.Join("var").c_str(), 0755);
    ::mkdir(temp_.Join("var/run").c_str(), 0755);
    socket_path_ = portable::RootPath(kFileIndexDaemonSockPath);
  }

  SystemHooks RecordingSleeps(std::function<void()> on_sleep = nullptr) {
    SystemHooks hooks;
    hooks.sleep_for = [this, on_sleep](unsigned long micros) {
      sleeps_.push_back(micros);
      if (on_sleep) on_sleep();
    };
    return hooks;
  }

  // Sends and returns the request the peer received, parsed.
  Json::Value SendAndReceive(const std::string& command, const Json::Value& data,
                             uint32_t reply_size = 2) {
    DaemonPeer peer(socket_path_, reply_size);
    EXPECT_TRUE(peer.bound());
    SendCommandToDaemon(command, data);
    peer.Join();
    EXPECT_TRUE(peer.reply_fully_read);
    // The length counts the text and its NUL, which comes last and only there.
    EXPECT_EQ(peer.length, peer.body.size());
    EXPECT_FALSE(peer.body.empty());
    EXPECT_EQ(peer.body.back(), '\0');
    EXPECT_EQ(std::strlen(peer.body.c_str()) + 1, peer.body.size());
    Json::Value request;
    EXPECT_TRUE(fromString(request, peer.body.c_str())) << peer.body;
    return request;
  }

  void ExpectWriteFailure(const std::string& command) {
    try {
      SendCommandToDaemon(command, Json::Value());
      ADD_FAILURE() << "sent without a daemon";
    } catch (const Error& e) {
      EXPECT_EQ(e.code(), kErrorSystem);
      EXPECT_EQ(e.reason().rfind("write failed, reason=", 0), 0u) << e.reason();
    }
  }

  testing::TempDir temp_;
  testing::ScopedOrvexRoot root_;
  std::string socket_path_;
  std::vector<unsigned long> sleeps_;
};

TEST_F(SendCommandTest, FramesTypeAndDataAsNulTerminatedJson) {
  Json::Value data(Json::objectValue);
  data["resume_time"] = 1700000000;
  Json::Value request = SendAndReceive("pause", data);
  EXPECT_EQ(request.size(), 2u);
  EXPECT_EQ(request["type"], "pause");
  EXPECT_EQ(request["data"], data);
}

TEST_F(SendCommandTest, NullDataIsSentAsJsonNull) {
  Json::Value request = SendAndReceive("resume", Json::Value());
  EXPECT_EQ(request["type"], "resume");
  ASSERT_TRUE(request.isMember("data"));
  EXPECT_TRUE(request["data"].isNull());
}

TEST_F(SendCommandTest, LargeRequestAndRepliesOfAnySizeAreTransferredWhole) {
  Json::Value data(Json::objectValue);
  data["share_name"] = std::string(5000, 's');
  for (uint32_t reply_size : {0u, 1u, 1023u, 1024u, 1025u, 70000u, 200000u}) {
    Json::Value request = SendAndReceive("worker_create", data, reply_size);
    EXPECT_EQ(request["data"], data) << reply_size;
  }
}

TEST_F(SendCommandTest, RetriesFiveTimesWhileTheSocketIsMissing) {
  ScopedSystemHooks hooks(RecordingSleeps());
  ExpectWriteFailure("resume");
  EXPECT_EQ(sleeps_, std::vector<unsigned long>(4, 1000000));
}

TEST_F(SendCommandTest, ConnectsOnceTheDaemonCreatesItsSocket) {
  std::unique_ptr<DaemonPeer> peer;
  ScopedSystemHooks hooks(RecordingSleeps([&] {
    if (sleeps_.size() == 2) peer = std::make_unique<DaemonPeer>(socket_path_, 8);
  }));
  SendCommandToDaemon("worker_delete", Json::Value());
  ASSERT_NE(peer, nullptr);
  peer->Join();
  EXPECT_EQ(sleeps_.size(), 2u);
  EXPECT_NE(peer->body.find("\"worker_delete\""), std::string::npos) << peer->body;
}

TEST_F(SendCommandTest, SocketPathThatIsARegularFileFailsWithoutRetry) {
  temp_.Write("var/run/fileindexd.sock", "not a socket");
  ScopedSystemHooks hooks(RecordingSleeps());
  ExpectWriteFailure("resume");
  EXPECT_TRUE(sleeps_.empty());
}

TEST_F(SendCommandTest, LeavesSigpipeIgnored) {
  struct sigaction previous;
  ::signal(SIGPIPE, SIG_DFL);
  ScopedSystemHooks hooks(RecordingSleeps());
  ExpectWriteFailure("resume");
  ASSERT_EQ(::sigaction(SIGPIPE, nullptr, &previous), 0);
  EXPECT_EQ(previous.sa_handler, SIG_IGN);
}

TEST_F(SendCommandTest, SocketCreationFailureIsLoggedAndThrown) {
#if defined(__SANITIZE_ADDRESS__)
  // The sanitizers' own checks open descriptors (a pipe to probe memory);
  // with none left they report false errors.
  GTEST_SKIP() << "needs free descriptors under the sanitizers";
#endif
  // Lower the descriptor limit to the next free number so socket() fails.
  struct rlimit saved;
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &saved), 0);
  const int next_fd = ::dup(0);
  ASSERT_GE(next_fd, 0);
  ::close(next_fd);
  struct rlimit lowered = saved;
  lowered.rlim_cur = static_cast<rlim_t>(next_fd);
  testing::LogCapture log;
  std::string reason;
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &lowered), 0);
  try {
    SendCommandToDaemon("resume", Json::Value());
  } catch (const Error& e) {
    reason = e.reason();
  }
  const int errno_after = errno;
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &saved), 0);

  const std::string text = std::strerror(EMFILE);
  EXPECT_EQ(reason, "socket failed, reason=" + text);
  EXPECT_EQ(errno_after, 0);
  ASSERT_EQ(log.lines().size(), 1u);
  const std::string& line = log.lines()[0];
  const std::string expected_tail = " (" + std::to_string(::getpid()) + ", " +
                                    std::to_string(::geteuid()) +
                                    ") Failed [0 > (fd_socket = socket(PF_UNIX, SOCK_STREAM, 0))],"
                                    " reason: socket failed, reason=" +
                                    text + " [err: " + text + "]";
  EXPECT_EQ(line.rfind("communication:", 0), 0u) << line;
  ASSERT_GE(line.size(), expected_tail.size());
  EXPECT_EQ(line.substr(line.size() - expected_tail.size()), expected_tail) << line;
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

  static std::string Pattern(size_t size) {
    std::string s(size, '\0');
    for (size_t i = 0; i < size; ++i) s[i] = static_cast<char>('a' + i % 26);
    return s;
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
};

TEST_F(BufferTest, SizeZeroMakesNoSystemCall) {
  int closed = ::dup(0);
  ::close(closed);
  for (int fd : {-1, closed}) {
    EXPECT_NO_THROW(BufferRead(fd, 0, nullptr));
    EXPECT_NO_THROW(BufferWrite(fd, 0, nullptr));
  }
}

TEST_F(BufferTest, WriteSplitsIntoChunksOfAtMost1024Bytes) {
  const std::string data = Pattern(3000);
  BufferWrite(fds_[0], static_cast<unsigned int>(data.size()),
              reinterpret_cast<const unsigned char*>(data.data()));
  std::vector<size_t> records;
  std::string received;
  char buf[4096];
  while (received.size() < data.size()) {
    ssize_t n = ::recv(fds_[1], buf, sizeof(buf), 0);
    ASSERT_GT(n, 0);
    records.push_back(static_cast<size_t>(n));
    received.append(buf, static_cast<size_t>(n));
  }
  EXPECT_EQ(records, (std::vector<size_t>{1024, 1024, 952}));
  EXPECT_EQ(received, data);
}

TEST_F(BufferTest, ReadGathersShortReadsAndSkipsEmptyOnes) {
  const std::string data = Pattern(2500);
  std::vector<std::string> records;
  for (size_t offset = 0; offset < data.size(); offset += 300) {
    records.push_back(data.substr(offset, 300));
    if (offset == 600) records.push_back("");  // a read that returns 0
  }
  for (const std::string& record : records) {
    ASSERT_EQ(::send(fds_[1], record.data(), record.size(), 0),
              static_cast<ssize_t>(record.size()));
  }
  std::string received(data.size(), '\0');
  BufferRead(fds_[0], static_cast<unsigned int>(received.size()),
             reinterpret_cast<unsigned char*>(received.data()));
  EXPECT_EQ(received, data);
}

TEST_F(BufferTest, FailuresCarryTheSystemReason) {
  unsigned char buf[16] = {};
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
  struct sigaction action;
  std::memset(&action, 0, sizeof(action));
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
  const pthread_t reader_handle = reader.native_handle();
  // Signals are paced so that each one finds the reader blocked again; the
  // byte that ends the read is sent only if the reader never gives up.
  for (int i = 0; i < 2000 && !done; ++i) {
    ::pthread_kill(reader_handle, SIGUSR1);
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
