// The daemon connection's framing on a real Unix socket: the bytes a message
// becomes, whole messages across short reads and writes, and the ways a
// connection fails.
#include "kalo/kalo_sock.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include "orvex/portable/file_descriptor.h"
#include "support/temp_dir.h"

namespace kalodaemon {
namespace {

using orvex::FileDescriptor;

// A listening socket in a fresh directory; the test accepts and plays the
// daemon's side by hand.
class KaloSockTest : public ::testing::Test {
 protected:
  KaloSockTest() {
    listener_.reset(::socket(AF_UNIX, SOCK_STREAM, 0));
    struct sockaddr_un address;
    std::memset(&address, 0, sizeof(address));
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path_.c_str(), sizeof(address.sun_path) - 1);
    listening_ =
        ::bind(listener_.get(), reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0 &&
        ::listen(listener_.get(), 4) == 0;
  }

  // Connects conn_ and accepts its other end (the backlog lets the connect
  // finish before the accept).
  FileDescriptor Open() {
    EXPECT_TRUE(listening_);
    EXPECT_TRUE(conn_.Connect()) << std::strerror(errno);
    return FileDescriptor(::accept(listener_.get(), nullptr, nullptr));
  }

  static std::string ReadAll(int fd) {
    std::string bytes;
    char buf[65536];
    for (ssize_t n; (n = ::read(fd, buf, sizeof(buf))) > 0;) bytes.append(buf, n);
    return bytes;
  }

  static void WriteAll(int fd, const std::string& bytes) {
    size_t done = 0;
    while (done < bytes.size()) {
      const ssize_t n = ::send(fd, bytes.data() + done, bytes.size() - done, MSG_NOSIGNAL);
      if (n <= 0) return;
      done += static_cast<size_t>(n);
    }
  }

  static std::string Frame(uint32_t length, const std::string& body) {
    return std::string(reinterpret_cast<const char*>(&length), sizeof(length)) + body;
  }

  orvex::testing::TempDir dir_;
  const std::string path_ = dir_.Join("daemon.sock");
  FileDescriptor listener_;
  bool listening_ = false;
  DomainSockConnection conn_{path_};
};

TEST_F(KaloSockTest, SentMessageIsLengthThenTextAndItsNul) {
  FileDescriptor peer = Open();
  const std::string text = R"({"command":"commit","data":{"id":"fileindex_é"}})";
  ASSERT_TRUE(conn_.Send(text));
  conn_.Disconnect();
  EXPECT_EQ(Frame(static_cast<uint32_t>(text.size() + 1), text + '\0'), ReadAll(peer.get()));
}

TEST_F(KaloSockTest, ReceivedMessageLosesOneTrailingNul) {
  struct Case {
    std::string body;
    std::string text;
  };
  const std::vector<Case> cases = {
      {std::string("{\"success\":true}\0", 17), "{\"success\":true}"},
      {"{\"success\":true}", "{\"success\":true}"},
      {std::string("a\0\0", 3), std::string("a\0", 2)},
      {"", ""},
  };
  for (const Case& c : cases) {
    FileDescriptor peer = Open();
    WriteAll(peer.get(), Frame(static_cast<uint32_t>(c.body.size()), c.body));
    std::string got = "stale";
    EXPECT_TRUE(conn_.Recv(got)) << c.body;
    EXPECT_EQ(c.text, got) << c.body;
  }
}

// Larger than any socket buffer: both sides see short reads and writes.
TEST_F(KaloSockTest, LargeMessagesTravelWholeBothWays) {
  FileDescriptor peer = Open();
  std::string text(3 << 20, 'x');
  for (size_t i = 0; i < text.size(); i += 4093) text[i] = static_cast<char>('a' + i % 26);
  std::string echoed;
  uint32_t length = 0;
  std::thread daemon([&] {
    std::string body;
    char buf[65536];
    while (body.size() < sizeof(length) + text.size() + 1) {
      const ssize_t n = ::read(peer.get(), buf, sizeof(buf));
      if (n <= 0) break;
      body.append(buf, n);
    }
    std::memcpy(&length, body.data(), sizeof(length));
    echoed = body.substr(sizeof(length));
    WriteAll(peer.get(), body);  // the same frame back
  });
  ASSERT_TRUE(conn_.Send(text));
  std::string got;
  EXPECT_TRUE(conn_.Recv(got));
  daemon.join();
  EXPECT_EQ(text.size() + 1, length);
  EXPECT_EQ(text + '\0', echoed);
  EXPECT_EQ(text, got);
}

TEST_F(KaloSockTest, TruncatedOrOversizedAnswerFailsTheReceive) {
  struct Case {
    const char* name;
    std::string bytes;  // written, then the daemon closes
    int error;
  };
  const std::vector<Case> cases = {
      {"nothing", "", ECONNRESET},
      {"half a length", std::string("\x05\x00", 2), ECONNRESET},
      {"short body", Frame(10, "{\"succ"), ECONNRESET},
      {"past the cap", Frame(kMaxMessageBytes + 1, "{}"), EMSGSIZE},
      {"announces 4 GiB", Frame(0xFFFFFFFFu, "{}"), EMSGSIZE},
  };
  for (const Case& c : cases) {
    FileDescriptor peer = Open();
    WriteAll(peer.get(), c.bytes);
    peer.reset();
    std::string got;
    errno = 0;
    EXPECT_FALSE(conn_.Recv(got)) << c.name;
    EXPECT_EQ(c.error, errno) << c.name;
  }
}

TEST_F(KaloSockTest, SendToADaemonThatHasGoneFailsWithoutKillingTheProcess) {
  FileDescriptor peer = Open();
  peer.reset();
  errno = 0;
  EXPECT_FALSE(conn_.Send(std::string(1 << 20, 'x')));
  EXPECT_EQ(EPIPE, errno);
}

TEST_F(KaloSockTest, ConnectFailsWithTheCause) {
  struct Case {
    std::string path;
    int error;
  };
  const std::vector<Case> cases = {
      {dir_.Join("absent.sock"), ENOENT},
      {dir_.path() + "/" + std::string(120, 'n'), ENAMETOOLONG},
      {"", ENOENT},
  };
  for (const Case& c : cases) {
    DomainSockConnection conn(c.path);
    errno = 0;
    EXPECT_FALSE(conn.Connect()) << c.path;
    EXPECT_EQ(c.error, errno) << c.path;
    EXPECT_FALSE(conn.IsConnected()) << c.path;
  }
  listener_.reset();  // the socket file stays, but nobody listens
  DomainSockConnection conn(path_);
  EXPECT_FALSE(conn.Connect());
  EXPECT_EQ(ECONNREFUSED, errno);
}

TEST_F(KaloSockTest, UnconnectedOrDisconnectedConnectionRefusesToTalk) {
  std::string got;
  EXPECT_FALSE(conn_.Send("{}"));
  EXPECT_EQ(ENOTCONN, errno);
  EXPECT_FALSE(conn_.Recv(got));
  EXPECT_EQ(ENOTCONN, errno);
  FileDescriptor peer = Open();
  conn_.Disconnect();
  EXPECT_FALSE(conn_.IsConnected());
  EXPECT_FALSE(conn_.Send("{}"));
  EXPECT_EQ("", ReadAll(peer.get()));  // the daemon sees the end of the stream
}

TEST_F(KaloSockTest, DestructionClosesTheConnection) {
  FileDescriptor peer;
  {
    DomainSockConnection conn(path_);
    ASSERT_TRUE(conn.Connect());
    peer.reset(::accept(listener_.get(), nullptr, nullptr));
  }
  EXPECT_EQ("", ReadAll(peer.get()));
}

TEST_F(KaloSockTest, ReconnectingDropsTheEarlierConnection) {
  FileDescriptor first = Open();
  FileDescriptor second = Open();
  EXPECT_EQ("", ReadAll(first.get()));
  ASSERT_TRUE(conn_.Send("{}"));
  conn_.Disconnect();
  EXPECT_EQ(Frame(3, std::string("{}\0", 3)), ReadAll(second.get()));
}

}  // namespace
}  // namespace kalodaemon
