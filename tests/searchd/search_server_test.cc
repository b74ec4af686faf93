// The socket loop's bounds, driven round by round with RunOnce().
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/resource.h>

#include <algorithm>
#include <chrono>
#include <memory>
#include <string>
#include <vector>

#include "search/search_error.h"
#include "searchd/searchd_fixture.h"

namespace orvex {
namespace testing {
namespace {

class SearchServerTest : public SearchdLoopTest {};

TEST_F(SearchServerTest, ARequestOverTheMemoryBoundIsAnsweredBusyAfterItsBody) {
  search::ServerOptions options;
  options.memory_bound = 4096;
  Restart(&options);
  CreateIndex();
  Json::Value big = Upsert(kId, FileDoc("/v/s/big"));
  big["data"]["data"]["KALOMDTextContent"] = std::string(8000, 'w');
  FileDescriptor fd = ConnectUnix(SocketPath());
  ASSERT_TRUE(SendBytes(fd.get(), Framed(toString(big))));
  const Json::Value answer = ReadAnswer(fd.get());
  EXPECT_EQ(search::kBusy, answer["error"]["code"].asInt()) << toString(answer);
  // Nothing is held for it any more, and a small request on the same
  // connection is served.
  EXPECT_EQ(0u, server_->held_bytes());
  ASSERT_TRUE(SendBytes(fd.get(), Framed(toString(Upsert(kId, FileDoc("/v/s/small"))))));
  EXPECT_TRUE(ReadAnswer(fd.get())["success"].asBool());
}

TEST_F(SearchServerTest, AFrameOverTheCapIsRefusedAndTheConnectionClosed) {
  search::ServerOptions options;
  options.max_frame = 1024;
  Restart(&options);
  FileDescriptor fd = ConnectUnix(SocketPath());
  ASSERT_TRUE(SendBytes(fd.get(), LengthWord(1025)));
  EXPECT_EQ(search::kBadFrame, ReadAnswer(fd.get())["error"]["code"].asInt());
  EXPECT_TRUE(ClosedByDaemon(fd.get()));
  EXPECT_EQ(0u, server_->connection_count());
}

TEST_F(SearchServerTest, AClientGoneMidAnswerIsDroppedAndOthersAreServed) {
  CreateIndex();
  Json::Value compound;
  for (int i = 0; i < 3000; ++i) {
    Json::Value doc = FileDoc("/v/s/d/f" + std::to_string(i));
    doc["KALOMDTitle"] = std::string(300, 't');
    compound["compound"].append(Upsert(kId, doc));
  }
  Ok(compound);
  {
    FileDescriptor leaving = ConnectUnix(SocketPath());
    ASSERT_TRUE(SendBytes(leaving.get(),
                          Framed(toString(PrefixQuery("document_get_by_query", kId, "/v/s/")))));
    pollfd begun = {leaving.get(), POLLIN, 0};  // the answer has begun
    for (int i = 0; i < 100 && ::poll(&begun, 1, 0) != 1; ++i) server_->RunOnce(1000);
    EXPECT_GT(server_->held_bytes(), 0u);
  }  // closed with most of its answer unread
  Ok(Command("commit", kId));
  EXPECT_EQ(0u, server_->held_bytes());
  // The commit's own connection closes after its answer: a round or two.
  for (int i = 0; i < 10 && server_->connection_count() > 0; ++i) server_->RunOnce(100);
  EXPECT_EQ(0u, server_->connection_count());
}

TEST_F(SearchServerTest, ConnectionsOverTheCapWaitTheirTurn) {
  search::ServerOptions options;
  options.max_connections = 2;
  Restart(&options);
  CreateIndex();
  FileDescriptor first = ConnectUnix(SocketPath());
  FileDescriptor second = ConnectUnix(SocketPath());
  FileDescriptor third = ConnectUnix(SocketPath());  // waits in the backlog
  for (int i = 0; i < 5; ++i) server_->RunOnce(/*timeout_ms=*/0);
  EXPECT_EQ(2u, server_->connection_count());
  ASSERT_TRUE(SendBytes(third.get(), Framed(toString(Command("commit", kId)))));
  first.reset();  // one leaves: the third gets in and is answered
  EXPECT_TRUE(ReadAnswer(third.get())["success"].asBool());
}

TEST_F(SearchServerTest, SilentAndHalfSentConnectionsAreClosedAfterTheIdleTimeout) {
  auto now = std::make_shared<std::chrono::steady_clock::time_point>();
  search::ServerOptions options;
  options.now = [now] { return *now; };
  Restart(&options);
  FileDescriptor silent = ConnectUnix(SocketPath());
  FileDescriptor half = ConnectUnix(SocketPath());
  ASSERT_TRUE(SendBytes(half.get(), LengthWord(100) + "{"));
  for (int i = 0; i < 5 && server_->held_bytes() == 0; ++i) server_->RunOnce(0);
  EXPECT_EQ(2u, server_->connection_count());
  *now += std::chrono::milliseconds(options.idle_timeout_ms - 1);
  server_->RunOnce(0);
  EXPECT_EQ(2u, server_->connection_count());
  *now += std::chrono::milliseconds(1);
  EXPECT_TRUE(ClosedByDaemon(silent.get()));
  EXPECT_TRUE(ClosedByDaemon(half.get()));
  EXPECT_EQ(0u, server_->held_bytes());
}

// Each client connects, sends a search and reads its answer, all at once:
// more than the connection cap and the listen backlog together.
TEST_F(SearchServerTest, AThousandClientsAtOnceAreAllAnswered) {
  constexpr size_t kClients = 1000;
  struct rlimit fds;
  ASSERT_EQ(0, ::getrlimit(RLIMIT_NOFILE, &fds));
  if (fds.rlim_cur < 2 * kClients) {
    fds.rlim_cur = std::min<rlim_t>(fds.rlim_max, 2 * kClients);
    ::setrlimit(RLIMIT_NOFILE, &fds);
  }
  if (fds.rlim_cur < kClients + 400) GTEST_SKIP() << "needs more descriptors than the hard limit";
  CreateIndex();
  Ok(Upsert(kId, FileDoc("/v/s/only.txt")));
  Ok(Command("commit", kId));
  const std::string request = Framed(R"({"command": "search", "data": {"name": "only"}})");
  const sockaddr_un address = UnixAddress(SocketPath());
  enum class State { kConnecting, kWaiting, kAnswered };
  std::vector<State> states(kClients, State::kConnecting);
  std::vector<FileDescriptor> clients;
  std::vector<std::string> received(kClients);
  for (size_t i = 0; i < kClients; ++i) {
    clients.emplace_back(::socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
    ASSERT_TRUE(clients.back().valid());
  }
  size_t answered = 0;
  for (int round = 0; answered < kClients && round < 5000; ++round) {
    for (size_t i = 0; i < kClients; ++i) {
      const int fd = clients[i].get();
      if (states[i] == State::kConnecting) {
        // A full backlog answers EAGAIN: the client tries again next round.
        if (::connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0) {
          ASSERT_EQ(EAGAIN, errno);
          continue;
        }
        ASSERT_TRUE(SendBytes(fd, request));
        states[i] = State::kWaiting;
      } else if (states[i] == State::kWaiting) {
        char chunk[4096];
        const ssize_t n = ::recv(fd, chunk, sizeof(chunk), MSG_DONTWAIT);
        if (n > 0) received[i].append(chunk, static_cast<size_t>(n));
        uint32_t length = 0;
        if (received[i].size() < 4) continue;
        std::memcpy(&length, received[i].data(), 4);
        if (received[i].size() < 4 + length) continue;
        const Json::Value answer = ParseJson(received[i].substr(4, length - 1));
        EXPECT_EQ(1, answer["data"]["total"].asInt()) << i << ": " << toString(answer);
        clients[i].reset();
        states[i] = State::kAnswered;
        ++answered;
      }
    }
    server_->RunOnce(/*timeout_ms=*/0);
  }
  EXPECT_EQ(kClients, answered);
  for (int i = 0; i < 10 && server_->connection_count() > 0; ++i) server_->RunOnce(10);
  EXPECT_EQ(0u, server_->connection_count());
  EXPECT_EQ(0u, server_->held_bytes());
}

TEST_F(SearchServerTest, RequestStopFinishesAnswersAndDropsPartialRequests) {
  CreateIndex();
  FileDescriptor partial = ConnectUnix(SocketPath());
  ASSERT_TRUE(SendBytes(partial.get(), LengthWord(50) + "{"));
  for (int i = 0; i < 5 && server_->connection_count() < 1; ++i) server_->RunOnce(0);
  server_->RequestStop();
  EXPECT_TRUE(server_->RunOnce(/*timeout_ms=*/0));
  EXPECT_EQ(0u, server_->connection_count());
}

}  // namespace
}  // namespace testing
}  // namespace orvex
