// Compounds of upserts are read without a value tree: they must answer and
// store exactly what the same upserts sent one by one (through the value
// tree) answer and store, for every kind of document and every failure.
#include <gtest/gtest.h>
#include <unistd.h>

#include <optional>
#include <random>
#include <string>
#include <vector>

#include "searchd/searchd_fixture.h"

namespace orvex {
namespace testing {
namespace {

constexpr char kOther[] = "fileindex_t";

class UpsertCompoundTest : public SearchdLoopTest {
 protected:
  void SetUp() override {
    CreateIndex();
    CreateIndex(kOther, "t");
  }

  Json::Value AskText(const std::string& text) {
    FileDescriptor fd = ConnectUnix(SocketPath());
    EXPECT_TRUE(SendServing(fd.get(), Framed(text)));
    return ReadAnswer(fd.get());
  }

  Json::Value Everything(const std::string& id) {
    return Ok(PrefixQuery("document_get_by_query", id, "/"))["data"];
  }
};

// One upsert of doc (JSON text) with the given doc_id, to index "@ID@".
std::string UpsertText(const std::string& doc_id, const std::string& doc,
                       const std::string& id = "@ID@") {
  return R"({"command":"document_upsert_by_id","data":{"id":")" + id + R"(","doc_id":")" + doc_id +
         R"(","data":)" + doc + "}}";
}

std::string ReplaceAll(std::string text, const std::string& from, const std::string& to) {
  for (size_t at = text.find(from); at != std::string::npos; at = text.find(from, at + to.size())) {
    text.replace(at, from.size(), to);
  }
  return text;
}

std::string WithId(const std::string& text, const std::string& id) {
  return ReplaceAll(text, "@ID@", id);
}

TEST_F(UpsertCompoundTest, ACompoundStoresAndAnswersWhatSingleUpsertsDo) {
  const std::string file = R"("KALOMDFSName":"a.txt","KALOMDIsDir":false,"KALOMDFSSize":10)";
  const std::vector<std::string> items = {
      UpsertText("/v/s/a.txt", R"({"KALOMDPath":"/v/s/a.txt",)" + file + "}"),
      // Names and attributes of every flat kind: owner as a number, a null,
      // a non-ASCII name, an upper-case extension.
      UpsertText("/v/s/Straße.TXT",
                 R"({"KALOMDPath":"/v/s/Straße.TXT","KALOMDOwnerUserID":1024,"KALOMDComment":null,
                     "KALOMDIsDir":true,"KALOMDFSContentChangeDate":-5})"),
      // A repeated property: the last one counts.
      UpsertText("/v/s/twice", R"({"KALOMDPath":"/v/s/twice","KALOMDFSSize":1,"KALOMDFSSize":2})"),
      // Documents that need their value: text content, an array, a
      // fraction, no path of their own, a number past 64 signed bits.
      UpsertText("/v/s/b.txt", R"({"KALOMDPath":"/v/s/b.txt","KALOMDTextContent":"hello world"})"),
      UpsertText("/v/s/c.mp3", R"({"KALOMDPath":"/v/s/c.mp3","KALOMDAuthors":["x","y"]})"),
      UpsertText("/v/s/d.mkv", R"({"KALOMDPath":"/v/s/d.mkv","KALOMDDurationSecond":1.5})"),
      UpsertText("/v/s/no path.txt", R"({"KALOMDFSSize":3})"),
      UpsertText("/v/s/huge", R"({"KALOMDPath":"/v/s/huge","KALOMDFSSize":18446744073709551615})"),
      // Failures, each its own: a property of the wrong type, an empty
      // doc_id, a bad index id, an index that does not exist.
      UpsertText("/v/s/bad", R"({"KALOMDPath":"/v/s/bad","KALOMDFSSize":"big"})"),
      UpsertText("", R"({"KALOMDPath":"/v/s/e"})"),
      UpsertText("/v/s/f", R"({"KALOMDPath":"/v/s/f"})", "a/b"),
      UpsertText("/v/s/g", R"({"KALOMDPath":"/v/s/g"})", "fileindex_nothere"),
  };
  std::string compound = R"({"compound":[)";
  for (size_t i = 0; i < items.size(); ++i) compound += (i ? "," : "") + WithId(items[i], kId);
  compound += "]}";
  const Json::Value together = AskText(compound);
  ASSERT_EQ(items.size(), together["data"].size()) << toString(together);
  EXPECT_TRUE(together["has_fail"].asBool());
  for (size_t i = 0; i < items.size(); ++i) {
    EXPECT_EQ(AskText(WithId(items[i], kOther)), together["data"][static_cast<int>(i)]) << items[i];
  }
  Ok(Command("commit", kId));
  Ok(Command("commit", kOther));
  const Json::Value stored = Everything(kId);
  EXPECT_EQ(7u, stored.size()) << toString(stored);
  EXPECT_EQ(Everything(kOther), stored);
  // Every column as a search shows it (size, type, owner, dates, name),
  // and the name index: the same in both.
  for (const char* fragment : {"", "a", "straße", "STRASSE", "no path", ".txt"}) {
    Json::Value data;
    if (*fragment != '\0') data["name"] = fragment;
    data["folder"] = "/v/s";
    data["id"] = kId;
    Json::Value here = SearchFor(data)["data"];
    data["id"] = kOther;
    Json::Value there = SearchFor(data)["data"];
    for (Json::Value* answer : {&here, &there}) {
      for (Json::Value& hit : (*answer)["hits"]) hit.removeMember("id");
    }
    EXPECT_EQ(there, here) << fragment;
    EXPECT_FALSE(here["hits"].empty()) << fragment;
  }
  EXPECT_EQ(std::vector<std::string>{"/v/s/b.txt"},
            Found(R"({"text": "hello", "id": "fileindex_s"})"));
}

// Random compounds of upserts and other requests, well and badly formed:
// both paths answer and store the same, whatever each sub-request holds.
TEST_F(UpsertCompoundTest, RandomCompoundsAnswerAsTheValueTreeDoes) {
  const std::vector<std::string> values = {R"("x")",
                                           R"("Ünï\u00e9")",
                                           R"("q\"b\\s\/\b\f\n\r\t\u0001\u001f\u007f")",
                                           "0",
                                           "-7",
                                           "9223372036854775807",
                                           "18446744073709551615",
                                           "1.5",
                                           "3.0",
                                           "true",
                                           "null",
                                           R"(["a","b"])",
                                           R"({"k":1})",
                                           R"([1])",
                                           R"("")"};
  const std::vector<std::string> keys = {
      "KALOMDPath",        "KALOMDFSName",         "KALOMDFSSize",
      "KALOMDIsDir",       "KALOMDTitle",          "KALOMDTextContent",
      "KALOMDOwnerUserID", "KALOMDDurationSecond", "other"};
  std::mt19937 random(42);
  auto pick = [&random](const std::vector<std::string>& from) {
    return from[random() % from.size()];
  };
  for (int round = 0; round < 40; ++round) {
    std::string compound = R"({"compound":[)";
    for (int i = 0; i < 12; ++i) {
      const std::string path = "/v/s/f" + std::to_string(random() % 20);
      std::string doc = "{";
      if (random() % 4 != 0) doc += R"("KALOMDPath":")" + path + "\",";
      for (int k = random() % 5; k > 0; --k) doc += "\"" + pick(keys) + "\":" + pick(values) + ",";
      doc += R"("KALOMDFSName":"n")" + std::string("}");
      switch (random() % 8) {
        case 0:
          compound +=
              R"({"command":"document_del_by_id","data":{"id":"@ID@","doc_id":")" + path + "\"}}";
          break;
        case 1:
          compound += R"({"command":"document_upsert_by_id","data":{"id":"@ID@","doc_id":)" +
                      pick(values) + R"(,"data":)" + doc + "}}";
          break;
        default:
          compound += UpsertText(path, doc);
      }
      compound += ",";
    }
    compound += R"({"command":"commit","data":{"id":"@ID@"}}]})";
    const std::string fast_text = WithId(compound, kId), tree_text = WithId(compound, kOther);
    const std::optional<Json::Value> fast = engine_->HandleCompound(fast_text, search::Caller{});
    ASSERT_TRUE(fast) << fast_text;
    const Json::Value tree = engine_->Handle(ParseJson(tree_text), search::Caller{}, tree_text);
    // The other index's id and database path, as this one's.
    ASSERT_EQ(ReplaceAll(ReplaceAll(toString(tree), kOther, kId), "volume1/t/", "volume1/s/"),
              toString(*fast))
        << compound;
  }
  EXPECT_EQ(Everything(kOther), Everything(kId));
}

// An upsert whose request has more members than anyone sends.
std::string ManyKeys() {
  std::string request = R"({"command":"document_upsert_by_id",)";
  for (int k = 0; k < 100; ++k)
    request += "\"k" + std::to_string(k) + "\":" + std::to_string(k) + ",";
  return request + R"("data":{"id":"@ID@","doc_id":"/v/s/m","data":{"KALOMDPath":"/v/s/m"}}})";
}

// Every other sub-request is read on its own and carried out as Compound()
// does, in its turn; a request this path cannot read whole is left alone.
TEST_F(UpsertCompoundTest, OtherSubRequestsAnswerAsTheValueTreeDoes) {
  const std::string compound =
      R"({"compound":[)" + UpsertText("/v/s/a", R"({"KALOMDPath":"/v/s/a"})") + "," +
      UpsertText("/v/s/b", R"({"KALOMDPath":"/v/s/b","KALOMDTextContent":"words"})") + "," +
      R"({"command":"commit","data":{"id":"@ID@"}},)"
      R"({"command":"search","data":{"id":"@ID@","name":"a"}},)"
      R"({"command":"document_del_by_id","data":{"id":"@ID@","doc_id":"/v/s/b"}},)"
      R"({"compound":[]},5,{"command":"nope","data":{}},)"
      R"({"command":"document_upsert_by_id","command":"document_upsert_by_id",)"
      R"("data":{"id":"@ID@","doc_id":"/v/s/c","data":{"KALOMDPath":"/v/s/c"}}},)" +
      UpsertText("", R"({"KALOMDPath":"/v/s/d"})", "fileindex_nothere") + "," + ManyKeys() + "]}";
  Json::Value fast = AskText(WithId(compound, kId));
  const std::string other = WithId(compound, kOther);
  Json::Value tree =
      engine_->Handle(ParseJson(other), search::Caller{::getuid(), ::getgid()}, other);
  for (Json::Value* answer : {&fast, &tree}) {
    for (Json::Value& hit : (*answer)["data"][3]["data"]["hits"]) hit.removeMember("id");
  }
  EXPECT_EQ(tree, fast);
  EXPECT_EQ(1u, fast["data"][3]["data"]["hits"].size()) << toString(fast);
  EXPECT_EQ(Everything(kOther), Everything(kId));
  for (const std::string& text :
       {std::string(R"({"compound":[],"compound":[]})"), std::string(R"({"compound":[]} // c)"),
        std::string(R"({"compound":{}})"), std::string(R"({"command":"commit"})"),
        std::string("not json")}) {
    EXPECT_FALSE(engine_->HandleCompound(text, search::Caller{})) << text;
  }
}

}  // namespace
}  // namespace testing
}  // namespace orvex
