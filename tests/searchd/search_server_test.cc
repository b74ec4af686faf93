// The socket loop's bounds, driven round by round with RunOnce().
#include <gtest/gtest.h>

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
  FileDescriptor fd = ConnectRaw(SocketPath());
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
  FileDescriptor fd = ConnectRaw(SocketPath());
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
    FileDescriptor leaving = ConnectRaw(SocketPath());
    ASSERT_TRUE(SendBytes(leaving.get(),
                          Framed(toString(PrefixQuery("document_get_by_query", kId, "/v/s/")))));
    PumpUntilReadable(leaving.get());  // the answer has begun
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
  FileDescriptor first = ConnectRaw(SocketPath());
  FileDescriptor second = ConnectRaw(SocketPath());
  FileDescriptor third = ConnectRaw(SocketPath());  // waits in the backlog
  for (int i = 0; i < 5; ++i) server_->RunOnce(/*timeout_ms=*/0);
  EXPECT_EQ(2u, server_->connection_count());
  ASSERT_TRUE(SendBytes(third.get(), Framed(toString(Command("commit", kId)))));
  first.reset();  // one leaves: the third gets in and is answered
  EXPECT_TRUE(ReadAnswer(third.get())["success"].asBool());
}

TEST_F(SearchServerTest, RequestStopFinishesAnswersAndDropsPartialRequests) {
  CreateIndex();
  FileDescriptor partial = ConnectRaw(SocketPath());
  ASSERT_TRUE(SendBytes(partial.get(), LengthWord(50) + "{"));
  for (int i = 0; i < 5 && server_->connection_count() < 1; ++i) server_->RunOnce(0);
  server_->RequestStop();
  EXPECT_TRUE(server_->RunOnce(/*timeout_ms=*/0));
  EXPECT_EQ(0u, server_->connection_count());
}

}  // namespace
}  // namespace testing
}  // namespace orvex
