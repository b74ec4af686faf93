// The request channel against a search daemon stand-in on a real socket:
// framing, bad answers, refusals, the busy retry with its one notice, and the
// compound answers.
#include "elastic/channel.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <string>
#include <vector>

#include "elastic/elastic_test_root.h"
#include "foundation/fault_helpers.h"
#include "orvex/foundation/json.h"
#include "support/error_code.h"

namespace orvex {
namespace fileindex {
namespace elastic {
namespace {

using testing::BusyAnswer;
using testing::CodeOf;
using testing::FramedPeer;
using testing::Options;

class ChannelTest : public testing::ElasticTestRoot {
 protected:
  static void ExpectLogLine(const std::string& line, const std::string& text) {
    EXPECT_TRUE(testing::IsLogLine(line, "elastic_control", text));
  }

  const Json::Value pause_ =
      Options(R"({"command": "index_pause", "data": {"id": "fileindex_s"}})");
  const Json::Value compound_ = Options(R"({"compound": [
      {"command": "document_set_by_id", "data": {"id": "fileindex_s", "doc_id": "/v/s/0"}},
      {"command": "document_set_by_id", "data": {"id": "fileindex_s", "doc_id": "/v/s/1"}},
      {"command": "document_set_by_id", "data": {"id": "fileindex_s", "doc_id": "/v/s/2"}}]})");
};

TEST_F(ChannelTest, RequestTravelsFramedAndTheAnswerComesBackParsed) {
  peer_.Script({R"({"success": true, "data": [{"KALOMDPath": "/v/s/é"}]})"});
  Json::Value res;
  SendWithRetry(res, pause_);
  ASSERT_EQ(1u, peer_.requests().size());
  EXPECT_EQ(pause_, peer_.requests()[0]);
  EXPECT_TRUE(peer_.faults().empty()) << peer_.faults()[0];
  EXPECT_EQ(Options(R"({"success": true, "data": [{"KALOMDPath": "/v/s/é"}]})"), res);
  EXPECT_TRUE(log_.lines().empty());
}

TEST_F(ChannelTest, BadAnswerIs913WithWhatWasParsedAndIsNotRetried) {
  struct Case {
    FramedPeer::Reply answer;
    std::string reason;
  };
  const std::vector<Case> cases = {
      {R"({"success": "true"})", R"(Recv failed, res={"success":"true"})"},
      {R"({"result": 1})", R"(Recv failed, res={"result":1})"},
      {"[true]", "Recv failed, res=[true]"},
      {"not json", "Recv failed, res=null"},
      {std::nullopt, "Recv failed, res=null"},  // closed without an answer
  };
  const char* condition =
      "Failed [!conn.Recv(resp_raw) || !res.fromString(resp_raw) || !res.isMember(\"success\") "
      "|| !res[\"success\"].isBool()], reason: ";
  for (const Case& c : cases) {
    const std::string shown = c.answer ? *c.answer : "(closed)";
    testing::LogCapture log;
    const size_t sent_before = peer_.requests().size();
    peer_.Script({c.answer});
    std::string reason;
    Json::Value res;
    EXPECT_EQ(913, CodeOf([&] { SendWithRetry(res, pause_); }, &reason)) << shown;
    EXPECT_EQ(c.reason, reason) << shown;
    EXPECT_EQ(sent_before + 1, peer_.requests().size()) << shown;
    ASSERT_EQ(1u, log.lines().size()) << shown;
    ExpectLogLine(log.lines()[0], condition + c.reason);
  }
  EXPECT_TRUE(waits_.empty());
}

TEST_F(ChannelTest, NoDaemonIsConnectFailed) {
  peer_.Stop();
  std::string reason;
  EXPECT_EQ(913, CodeOf([&] { Send(pause_); }, &reason));
  EXPECT_EQ("Connect failed", reason);
  ASSERT_EQ(1u, log_.lines().size());
  ExpectLogLine(log_.lines()[0], "Failed [!conn.Connect()], reason: Connect failed");
  EXPECT_NE(std::string::npos, log_.lines()[0].find("[err: No such file or directory]"));
  EXPECT_EQ(0, errno);
}

TEST_F(ChannelTest, RefusalThrowsTheDaemonsCodeWithoutLogging) {
  peer_.Script({R"({"success": false, "error": {"code": 1002, "msg": "no such index"}})"});
  std::string reason;
  EXPECT_EQ(1002, CodeOf([&] { Send(pause_); }, &reason));
  EXPECT_EQ("Request failed, msg=no such index", reason);
  EXPECT_EQ(1u, peer_.requests().size());
  EXPECT_TRUE(log_.lines().empty());
  EXPECT_TRUE(waits_.empty());
}

TEST_F(ChannelTest, BusyDaemonIsWaitedOutWithOneNoticeAfterTheTenthRetry) {
  struct Case {
    int code;
    size_t busy_answers;
    size_t notices;
  };
  for (const Case& c :
       std::vector<Case>{{1400, 1, 0}, {1401, 10, 0}, {1400, 11, 1}, {1401, 14, 1}}) {
    const std::string shown = std::to_string(c.code) + " x" + std::to_string(c.busy_answers);
    testing::LogCapture log;
    waits_.clear();
    next_random_ = 0;
    std::remove(NoticesPath().c_str());
    const size_t sent_before = peer_.requests().size();
    peer_.Script(std::vector<FramedPeer::Reply>(c.busy_answers, BusyAnswer(c.code)));
    Send(pause_);
    EXPECT_EQ(sent_before + c.busy_answers + 1, peer_.requests().size()) << shown;
    ASSERT_EQ(c.busy_answers, log.lines().size()) << shown;
    ASSERT_EQ(c.busy_answers, waits_.size()) << shown;
    for (size_t i = 0; i < c.busy_answers; ++i) {
      ExpectLogLine(log.lines()[i], "Retry[" + std::to_string(i) +
                                        "] since kaloelasticd is busy. Command: index_pause, "
                                        "db: fileindex_s");
      EXPECT_EQ(900 + 60 * (i % 5), waits_[i].seconds) << shown << " wait " << i;
      // The notice goes out before the wait that follows the eleventh refusal.
      EXPECT_EQ(i >= 10 ? 1u : 0u, waits_[i].notices_before) << shown << " wait " << i;
    }
    ASSERT_EQ(c.notices, Notices().size()) << shown;
    if (c.notices > 0) {
      EXPECT_NE(std::string::npos, Notices()[0].find("error:lack_of_memory")) << Notices()[0];
    }
  }
}

TEST_F(ChannelTest, BusySubRequestSendsTheWholeCompoundRequestAgain) {
  peer_.Script({R"({"success": true, "has_fail": true, "data": [
                    {"success": false, "error": {"code": 1002, "msg": "gone"}},
                    {"success": false, "error": {"code": 1401, "msg": "queue full"}},
                    {"success": false, "error": {"code": 1400, "msg": "later"}}]})"});
  Send(compound_);
  ASSERT_EQ(2u, peer_.requests().size());
  EXPECT_EQ(compound_, peer_.requests()[0]);
  EXPECT_EQ(compound_, peer_.requests()[1]);
  // The walk stops at the first busy element: one failure logged, one retry.
  ASSERT_EQ(2u, log_.lines().size());
  ExpectLogLine(log_.lines()[0],
                "Compound failed: " + toString(compound_["compound"][0]) + " (1002) gone");
  ExpectLogLine(log_.lines()[1], "Retry[0] since kaloelasticd is busy. Command: , db: ");
  EXPECT_EQ(1u, waits_.size());
}

TEST_F(ChannelTest, OtherSubRequestFailuresAreLoggedAndTolerated) {
  peer_.Script({R"({"success": true, "has_fail": true, "data": [
                    {"success": false, "error": {"code": 1002, "msg": "no doc"}},
                    {"success": true},
                    {"success": false, "error": {"code": 500, "msg": "bad field"}}]})"});
  Json::Value res;
  SendWithRetry(res, compound_);
  EXPECT_EQ(1u, peer_.requests().size());
  ASSERT_EQ(2u, log_.lines().size());
  ExpectLogLine(log_.lines()[0],
                "Compound failed: " + toString(compound_["compound"][0]) + " (1002) no doc");
  ExpectLogLine(log_.lines()[1],
                "Compound failed: " + toString(compound_["compound"][2]) + " (500) bad field");
  EXPECT_TRUE(res["has_fail"].asBool());
}

TEST_F(ChannelTest, HasFailOfAPlainRequestIsNotLookedAt) {
  peer_.Script({R"({"success": true, "has_fail": true, "data": [
                    {"success": false, "error": {"code": 1400, "msg": "busy"}}]})"});
  Send(pause_);
  EXPECT_EQ(1u, peer_.requests().size());
  EXPECT_TRUE(log_.lines().empty());
  EXPECT_TRUE(waits_.empty());
}

}  // namespace
}  // namespace elastic
}  // namespace fileindex
}  // namespace orvex
