// The document commands, as the search daemon stand-in receives them: the
// extracted documents, the three requests of a rename, and a commit that
// fails on a full volume.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <functional>
#include <string>
#include <vector>

#include "elastic/elastic_test_root.h"
#include "orvex/elastic.h"
#include "orvex/foundation/json.h"
#include "orvex/status/status_mgr.h"
#include "support/error_code.h"

namespace orvex {
namespace fileindex {
namespace elastic {
namespace {

using testing::CodeOf;
using testing::FramedPeer;
using testing::Options;

class DocumentsTest : public testing::ElasticTestRoot {
 protected:
  void SetUp() override { root_ = AddShare("s"); }

  // Answers each document_get_by_query from docs, by the prefix of its
  // "KALOMDPath" as the daemon does; anything else with success.
  void ServeQueries(const std::vector<Json::Value>& docs) {
    peer_.SetResponder([docs](const Json::Value& req) -> FramedPeer::Reply {
      if (req["command"] != "document_get_by_query") return std::string(FramedPeer::kSuccess);
      const std::string prefix = req["data"]["query"]["qsl"]["prefix"]["KALOMDPath"].asString();
      Json::Value answer;
      answer["success"] = true;
      answer["data"] = Json::Value(Json::arrayValue);
      for (const Json::Value& doc : docs) {
        if (doc["KALOMDPath"].asString().rfind(prefix, 0) == 0) answer["data"].append(doc);
      }
      return toString(answer);
    });
  }

  static Json::Value Doc(const std::string& parent, const std::string& name) {
    Json::Value doc;
    doc["KALOMDPath"] = parent + "/" + name;
    doc["KALOMDParent"] = parent;
    doc["KALOMDFSName"] = name;
    return doc;
  }

  std::string root_;
};

TEST_F(DocumentsTest, UpsertAndAttrSendTheExtractedDocumentWithItsSearchName) {
  const std::string path = dir_.Write("volume1/s/Draft Notes.TXT", "hello");
  struct Case {
    const char* command;
    std::function<void()> call;
  };
  const std::vector<Case> cases = {
      {"document_upsert_by_id", [&] { IndexUpsert("s", path, /*need_meta=*/true); }},
      {"document_upsert_by_id", [&] { IndexUpsert("s", path, /*need_meta=*/false); }},
      {"document_set_by_id", [&] { IndexAttr("s", path); }},
  };
  for (const Case& c : cases) {
    const size_t before = peer_.requests().size();
    c.call();
    ASSERT_EQ(before + 1, peer_.requests().size()) << c.command;
    const Json::Value req = peer_.requests().back();
    EXPECT_EQ(c.command, req["command"].asString());
    EXPECT_EQ("fileindex_s", req["data"]["id"].asString());
    EXPECT_EQ(path, req["data"]["doc_id"].asString());
    const Json::Value& doc = req["data"]["data"];
    EXPECT_EQ(path, doc["KALOMDPath"].asString()) << c.command;
    EXPECT_EQ("Draft Notes.TXT", doc["KALOMDFSName"].asString()) << c.command;
    EXPECT_EQ("Draft Notes.TXT", doc["KALOMDSearchFileName"].asString()) << c.command;
    EXPECT_EQ(root_, doc["KALOMDParent"].asString()) << c.command;
    EXPECT_EQ("txt", doc["KALOMDExtension"].asString()) << c.command;
    EXPECT_EQ(5, doc["KALOMDFSSize"].asInt()) << c.command;
    EXPECT_FALSE(doc["KALOMDIsDir"].asBool()) << c.command;
  }
}

TEST_F(DocumentsTest, ItemThatCannotBeExaminedIs914AndNothingIsSent) {
  const std::string path = root_ + "/gone.txt";
  for (const auto& call : std::vector<std::function<void()>>{
           [&] { IndexUpsert("s", path, /*need_meta=*/true); }, [&] { IndexAttr("s", path); }}) {
    testing::LogCapture log;
    std::string reason;
    EXPECT_EQ(914, CodeOf(call, &reason));
    EXPECT_EQ("Parse failed, path=" + path, reason);
    const std::string logged =
        ") Failed [!ParseFile(full_path, cfg, file_data)], reason: " + reason +
        " [err: No such file or directory]";
    ASSERT_EQ(1u, log.lines().size());
    EXPECT_NE(std::string::npos, log.lines()[0].find(logged)) << log.lines()[0];
  }
  EXPECT_TRUE(peer_.requests().empty());
}

TEST_F(DocumentsTest, BatchSendsTheSingleCommandsRequestsAsOneCompoundAndReportsRefusals) {
  std::vector<std::string> paths;
  for (const char* name : {"a.txt", "b.txt", "c.txt"})
    paths.push_back(dir_.Write(std::string("volume1/s/") + name, name));
  IndexUpsert("s", paths[0], /*need_meta=*/true);
  IndexUpsert("s", paths[1], /*need_meta=*/false);
  IndexAttr("s", paths[2]);
  IndexDel("s", paths[0]);
  const std::vector<Json::Value> singles = peer_.requests();
  ASSERT_EQ(4u, singles.size());

  peer_.SetResponder([](const Json::Value&) -> FramedPeer::Reply {
    return R"({"success": true, "has_fail": true, "data": [{"success": true}, {"success": true},
              {"success": false, "error": {"code": 1107, "msg": "no document"}},
              {"success": true}]})";
  });
  DocumentBatch batch("s");
  EXPECT_TRUE(batch.Flush().empty());  // nothing to send
  batch.Upsert(paths[0], /*need_meta=*/true);
  batch.Upsert(paths[1], /*need_meta=*/false);
  EXPECT_EQ(914, CodeOf([&] { batch.Attr(root_ + "/gone.txt"); }));
  batch.Attr(paths[2]);
  batch.Del(paths[0]);
  EXPECT_EQ(4u, batch.size());
  EXPECT_GT(batch.bytes(), toString(singles[0]).size());
  const std::vector<DocumentFailure> failures = batch.Flush();
  ASSERT_EQ(5u, peer_.requests().size());
  Json::Value expected(Json::arrayValue);
  for (const Json::Value& single : singles) expected.append(single);
  EXPECT_EQ(expected, peer_.requests().back()["compound"]);
  ASSERT_EQ(1u, failures.size());
  EXPECT_EQ(2u, failures[0].index);
  EXPECT_EQ(1107, failures[0].code);
  EXPECT_EQ("no document", failures[0].msg);
  EXPECT_TRUE(batch.empty());
  EXPECT_EQ(0u, batch.bytes());
}

TEST_F(DocumentsTest, DeleteAndDeleteDirAddressTheDocumentOrItsDescendants) {
  IndexDel("s", "/v/s/a b.txt");
  IndexDelDir("s", "/v/s/a");
  ASSERT_EQ(2u, peer_.requests().size());
  EXPECT_EQ(Options(R"({"command": "document_del_by_id",
                        "data": {"id": "fileindex_s", "doc_id": "/v/s/a b.txt"}})"),
            peer_.requests()[0]);
  EXPECT_EQ(Options(R"({"command": "document_del_by_query", "data": {"id": "fileindex_s",
                        "query": {"qsl": {"prefix": {"KALOMDPath": "/v/s/a/"}}}}})"),
            peer_.requests()[1]);
}

TEST_F(DocumentsTest, RenamedDirectoryMovesItselfAndOnlyItsDescendants) {
  ServeQueries({Doc("/v/s", "a"), Doc("/v/s/a", "x"), Doc("/v/s/a/x", "y"), Doc("/v/s", "ab"),
                Doc("/v/s/ab", "z")});
  IndexRename("s", "/v/s/a", "/v/s/New.Dir");
  const std::vector<Json::Value> reqs = peer_.requests();
  ASSERT_EQ(3u, reqs.size());
  const Json::Value moved = Options(R"({"command": "document_set_by_id", "data": {
      "id": "fileindex_s", "doc_id": "/v/s/a",
      "data": {"KALOMDPath": "/v/s/New.Dir", "KALOMDParent": "/v/s", "KALOMDFSName": "New.Dir",
               "KALOMDSearchFileName": "New.Dir", "KALOMDDisplayName": "New.Dir",
               "KALOMDKind": "dir", "KALOMDExtension": "dir"}}})");
  EXPECT_EQ(moved, reqs[0]);
  // The query is the first request reused: it still carries doc_id and data.
  Json::Value query = moved;
  query["command"] = "document_get_by_query";
  query["data"]["query"] = Options(R"({"qsl": {"prefix": {"KALOMDPath": "/v/s/a/"}}})");
  EXPECT_EQ(query, reqs[1]);
  EXPECT_EQ(Options(R"({"compound": [
      {"command": "document_set_by_id", "data": {"id": "fileindex_s", "doc_id": "/v/s/a/x",
       "data": {"KALOMDParent": "/v/s/New.Dir", "KALOMDPath": "/v/s/New.Dir/x",
                "KALOMDSearchFileName": "x"}}},
      {"command": "document_set_by_id", "data": {"id": "fileindex_s", "doc_id": "/v/s/a/x/y",
       "data": {"KALOMDParent": "/v/s/New.Dir/x", "KALOMDPath": "/v/s/New.Dir/x/y",
                "KALOMDSearchFileName": "y"}}}]})"),
            reqs[2]);
}

TEST_F(DocumentsTest, RenamedFileStillSendsAnEmptyCompoundRequest) {
  ServeQueries({Doc("/v/s", "a.txt"), Doc("/v/s", "a.txt.bak")});
  IndexRename("s", "/v/s/a.txt", "/v/s/b.txt");
  const std::vector<Json::Value> reqs = peer_.requests();
  ASSERT_EQ(3u, reqs.size());
  EXPECT_EQ("txt", reqs[0]["data"]["data"]["KALOMDKind"].asString());
  EXPECT_EQ(Options(R"({"compound": []})"), reqs[2]);
}

TEST_F(DocumentsTest, QueryAnswerWithoutDocumentsIs916WithTheAnswer) {
  peer_.Script({std::string(FramedPeer::kSuccess), R"({"success": true, "data": {"n": 0}})"});
  std::string reason;
  EXPECT_EQ(916, CodeOf([] { IndexRename("s", "/v/s/a", "/v/s/b"); }, &reason));
  EXPECT_EQ(R"({"data":{"n":0},"success":true})", reason);
  EXPECT_EQ(2u, peer_.requests().size());
}

TEST_F(DocumentsTest, CommitSendsTheCommitCommand) {
  IndexCommit("s");
  ASSERT_EQ(1u, peer_.requests().size());
  EXPECT_EQ(Options(R"({"command": "commit", "data": {"id": "fileindex_s"}})"),
            peer_.requests()[0]);
  EXPECT_EQ(0, StatusMgr().GetShareStatus("s"));
}

// /proc never has a free block: a real, always full file system.
TEST_F(DocumentsTest, FailedCommitOnAFullVolumeMarksTheShareAndIs1003) {
  AddShareAt("full", "/proc");
  const char* refusal = R"({"success": false, "error": {"code": 1002, "msg": "disk full"}})";
  struct Case {
    const char* share;
    int code;
    std::string reason;
    int status;
  };
  const std::vector<Case> cases = {
      {"full", 1003, "Share (full) space not enough", NeedReindex},
      {"s", 1002, "Request failed, msg=disk full", 0},
  };
  for (const Case& c : cases) {
    testing::LogCapture log;
    peer_.Script({std::string(refusal)});
    std::string reason;
    EXPECT_EQ(c.code, CodeOf([&] { IndexCommit(c.share); }, &reason)) << c.share;
    EXPECT_EQ(c.reason, reason) << c.share;
    EXPECT_EQ(c.status, StatusMgr().GetShareStatus(c.share)) << c.share;
    EXPECT_EQ(c.status != 0 ? 1u : 0u,
              log.Matching(") Failed [!share.IsSpaceEnough()], reason: " + c.reason).size())
        << c.share;
  }
}

}  // namespace
}  // namespace elastic
}  // namespace fileindex
}  // namespace orvex
