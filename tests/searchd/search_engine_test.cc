// The search daemon's commands, each sent over the real socket to the engine
// and loop running in this process.
#include <gtest/gtest.h>

#include <algorithm>
#include <ctime>
#include <filesystem>
#include <random>
#include <set>
#include <string>
#include <vector>

#include "search/case_fold.h"
#include "search/name_tokenizer.h"
#include "search/search_error.h"
#include "search/sqlite_db.h"
#include "searchd/searchd_fixture.h"

namespace orvex {
namespace testing {
namespace {

using search::SearchCode;

class SearchEngineTest : public SearchdLoopTest {
 protected:
  void SetUp() override { CreateIndex(); }

  void Commit() { Ok(Command("commit", kId)); }

  Json::Value GetByPrefix(const std::string& prefix) {
    return Ok(PrefixQuery("document_get_by_query", kId, prefix));
  }

  // FTS5's own check that both full-text indexes hold exactly their
  // content tables' committed rows; throws (kStorage) when they do not.
  void CheckFullTextIndexes() {
    search::SqliteDb db(DbPath(), /*create=*/false);
    search::RegisterNameTokenizer(db.handle());
    EXPECT_NO_THROW(db.Exec("INSERT INTO name_grams(name_grams) VALUES ('integrity-check')"));
    EXPECT_NO_THROW(db.Exec("INSERT INTO words(words) VALUES ('integrity-check')"));
  }
};

// Names and words enter the full-text indexes at commit; whatever happens to
// a document before, after or between commits, searches see its last state.
TEST_F(SearchEngineTest, FullTextIndexesFollowEveryChangeAcrossCommits) {
  auto text_search = [&](const std::string& words) {
    Json::Value data;
    data["text"] = words;
    return HitPaths(SearchFor(data));
  };
  using Paths = std::vector<std::string>;
  Json::Value a = DocWith("/v/s/alpha_report.txt", R"({"KALOMDTextContent": "quarterly figures"})");
  Ok(Upsert(kId, a));
  Ok(Upsert(kId, DocWith("/v/s/ephemeral.txt", R"({"KALOMDTextContent": "vanishing words"})")));
  EXPECT_EQ(1, Ok(DelById(kId, "/v/s/ephemeral.txt"))["data"]["deleted"].asInt());
  // Not committed: not searchable yet.
  EXPECT_EQ(Paths{}, HitPaths(SearchName("alpha")));
  Commit();
  EXPECT_EQ(Paths{"/v/s/alpha_report.txt"}, HitPaths(SearchName("ALPHA")));
  EXPECT_EQ(Paths{"/v/s/alpha_report.txt"}, text_search("quarterly"));
  EXPECT_EQ(Paths{}, HitPaths(SearchName("ephemeral")));
  EXPECT_EQ(Paths{}, text_search("vanishing"));

  // The same document sent again, unchanged and then with new words.
  Ok(Upsert(kId, a));
  Commit();
  EXPECT_EQ(Paths{"/v/s/alpha_report.txt"}, HitPaths(SearchName("alpha_rep")));
  a["KALOMDTextContent"] = "annual summary";
  Ok(Upsert(kId, a));
  Commit();
  EXPECT_EQ(Paths{}, text_search("quarterly"));
  EXPECT_EQ(Paths{"/v/s/alpha_report.txt"}, text_search("annual"));
  // Its words changed twice before one commit (a file saved twice).
  a["KALOMDTextContent"] = "first draft";
  Ok(Upsert(kId, a));
  a["KALOMDTextContent"] = "annual summary";
  Ok(Upsert(kId, a));
  Commit();
  EXPECT_EQ(Paths{}, text_search("draft"));
  EXPECT_EQ(Paths{"/v/s/alpha_report.txt"}, text_search("annual"));

  // Renamed (a new search name), then renamed again before the commit.
  const auto rename = [&](const std::string& path, const std::string& name) {
    Ok(SetById(kId, path, ParseJson(R"({"KALOMDSearchFileName": ")" + name + "\"}")));
  };
  rename("/v/s/alpha_report.txt", "beta_report.txt");
  rename("/v/s/alpha_report.txt", "gamma_report.txt");
  Commit();
  EXPECT_EQ(Paths{}, HitPaths(SearchName("alpha")));
  EXPECT_EQ(Paths{}, HitPaths(SearchName("beta")));
  EXPECT_EQ(Paths{"/v/s/alpha_report.txt"}, HitPaths(SearchName("gamma")));
  EXPECT_EQ(Paths{"/v/s/alpha_report.txt"}, text_search("summary"));

  // Moved onto another document's path: one document remains there.
  Ok(Upsert(kId, DocWith("/v/s/beta.txt", R"({"KALOMDTextContent": "beta words"})")));
  Commit();
  Json::Value req = Upsert(kId, DocWith("/v/s/beta.txt", R"({"KALOMDSearchFileName": "delta.txt",
                                                             "KALOMDTextContent": "delta words"})"));
  req["data"]["doc_id"] = "/v/s/alpha_report.txt";
  Ok(req);
  Commit();
  EXPECT_EQ(Paths{"/v/s/beta.txt"}, DocPaths(GetByPrefix("/v/s/")));
  EXPECT_EQ(Paths{"/v/s/beta.txt"}, text_search("words"));
  EXPECT_EQ(Paths{"/v/s/beta.txt"}, HitPaths(SearchName("delta")));
  EXPECT_EQ(Paths{}, HitPaths(SearchName("gamma")));
  CheckFullTextIndexes();

  // Documents of names alone: the newest committed row removed before new
  // ones come; new ones sent again, renamed or removed before the commit;
  // an older one renamed.
  Ok(Upsert(kId, FileDoc("/v/s/one.txt")));
  Ok(Upsert(kId, FileDoc("/v/s/two.txt")));
  Commit();
  Ok(DelById(kId, "/v/s/two.txt"));
  Ok(Upsert(kId, FileDoc("/v/s/three.txt")));
  Ok(Upsert(kId, FileDoc("/v/s/three.txt")));
  rename("/v/s/three.txt", "four.txt");
  Ok(Upsert(kId, FileDoc("/v/s/five.txt")));
  Ok(DelById(kId, "/v/s/five.txt"));
  rename("/v/s/one.txt", "six.txt");
  Commit();
  for (const char* gone_name : {"one", "two", "three", "five"}) {
    EXPECT_EQ(Paths{}, HitPaths(SearchName(gone_name))) << gone_name;
  }
  EXPECT_EQ(Paths{"/v/s/three.txt"}, HitPaths(SearchName("four")));
  EXPECT_EQ(Paths{"/v/s/one.txt"}, HitPaths(SearchName("six")));
  CheckFullTextIndexes();

  // Deleted by prefix, committed, and the index is empty of it.
  Ok(PrefixQuery("document_del_by_query", kId, "/v/s/"));
  Commit();
  EXPECT_EQ(Paths{}, HitPaths(SearchName("delta")));
  EXPECT_EQ(Paths{}, text_search("words"));
  CheckFullTextIndexes();
}

TEST_F(SearchEngineTest, UpsertThenSetKeepsThePropertiesNotSet) {
  Ok(Upsert(kId, DocWith("/v/s/song.mp3", R"({"KALOMDFSSize": 4000, "KALOMDTitle": "Blue in Green",
      "KALOMDDurationSecond": 337.5, "KALOMDTextContent": "so what freddie freeloader"})")));
  Ok(SetById(kId, "/v/s/song.mp3",
             ParseJson(R"({"KALOMDFSSize": 4096, "KALOMDFSContentChangeDate": 1800000000})")));
  Commit();

  const Json::Value docs = GetByPrefix("/v/s/")["data"];
  ASSERT_EQ(1u, docs.size());
  EXPECT_EQ("Blue in Green", docs[0]["KALOMDTitle"].asString());
  EXPECT_EQ(337.5, docs[0]["KALOMDDurationSecond"].asDouble());
  EXPECT_EQ(4096, docs[0]["KALOMDFSSize"].asInt());
  EXPECT_EQ(1800000000, docs[0]["KALOMDFSContentChangeDate"].asInt());
  // The text content survives the set too: a text search still finds it.
  EXPECT_EQ(std::vector<std::string>{"/v/s/song.mp3"}, Found(R"({"text": "freeloader"})"));
  EXPECT_EQ(std::vector<std::string>{"/v/s/song.mp3"},
            Found(R"({"size_min": 4096, "size_max": 4096})"));
}

TEST_F(SearchEngineTest, DeleteByPrefixLeavesTheDirectoryAndItsLookalikeSiblings) {
  for (const char* path :
       {"/v/s/a", "/v/s/a/x", "/v/s/a/y/z", "/v/s/ab", "/v/s/ab/c", "/v/s/a.txt", "/v/s/b"}) {
    Ok(Upsert(kId, FileDoc(path)));
  }
  const Json::Value answer = Ok(PrefixQuery("document_del_by_query", kId, "/v/s/a/"));
  EXPECT_EQ(2, answer["data"]["deleted"].asInt());
  Commit();
  EXPECT_EQ((std::vector<std::string>{"/v/s/a", "/v/s/a.txt", "/v/s/ab", "/v/s/ab/c", "/v/s/b"}),
            DocPaths(GetByPrefix("/v/s/")));
}

// Pages follow the byte order of whole paths ("/" sorts between "." and
// "0"), whatever "after" names: a path of the subtree, one that is not
// stored, or one before the prefix.
TEST_F(SearchEngineTest, GetByPrefixPagesInPathOrderAfterAGivenPath) {
  for (const char* path : {"/v/s/a", "/v/s/a/x", "/v/s/a.b", "/v/s/a0", "/v/s/b", "/v/t/c"}) {
    Ok(Upsert(kId, FileDoc(path)));
  }
  const auto page = [&](const char* after, int limit) {
    Json::Value request = PrefixQuery("document_get_by_query", kId, "/v/s/");
    if (after != nullptr) request["data"]["after"] = after;
    request["data"]["limit"] = limit;
    const Json::Value answer = Ok(request);
    std::vector<std::string> paths = DocPaths(answer);
    paths.push_back(answer["more"].asBool() ? "more" : "end");
    return paths;
  };
  using Paths = std::vector<std::string>;
  EXPECT_EQ((Paths{"/v/s/a", "/v/s/a.b", "more"}), page(nullptr, 2));
  EXPECT_EQ((Paths{"/v/s/a/x", "/v/s/a0", "more"}), page("/v/s/a.b", 2));
  EXPECT_EQ((Paths{"/v/s/b", "end"}), page("/v/s/a0", 2));
  EXPECT_EQ((Paths{"/v/s/a0", "/v/s/b", "end"}), page("/v/s/a/y", 10));
  EXPECT_EQ((Paths{"/v/s/a", "more"}), page("/v/", 1));
  EXPECT_EQ((Paths{"end"}), page("/v/s/b", 1));
  // Without "limit" the answer is the whole subtree, and says nothing more.
  const Json::Value whole = GetByPrefix("/v/s/");
  EXPECT_EQ(5u, whole["data"].size());
  EXPECT_FALSE(whole.isMember("more"));
}

// Searches see committed documents only; the indexer's own query sees its
// uncommitted writes (a rename needs them).
TEST_F(SearchEngineTest, NothingIsVisibleToASearchBeforeCommit) {
  using Paths = std::vector<std::string>;
  Ok(Upsert(kId, FileDoc("/v/s/report.pdf")));
  Ok(Upsert(kId, FileDoc("/v/s/b")));
  EXPECT_EQ(0, SearchName("report")["data"]["total"].asInt());
  EXPECT_EQ((Paths{"/v/s/b", "/v/s/report.pdf"}), DocPaths(GetByPrefix("/v/s/")));
  Commit();
  EXPECT_EQ(Paths{"/v/s/report.pdf"}, HitPaths(SearchName("report")));
  EXPECT_EQ(1, Ok(DelById(kId, "/v/s/report.pdf"))["data"]["deleted"].asInt());
  EXPECT_EQ(0, Ok(DelById(kId, "/v/s/report.pdf"))["data"]["deleted"].asInt());  // still fine
  EXPECT_EQ(1, SearchName("report")["data"]["total"].asInt());
  EXPECT_EQ(Paths{"/v/s/b"}, DocPaths(GetByPrefix("/v/s/")));
  Commit();
  EXPECT_EQ(Paths{"/v/s/b"}, HitPaths(SearchName("")));
}

TEST_F(SearchEngineTest, ACompoundAnswersEachSubRequestAndMarksTheFailure) {
  Json::Value compound;
  compound["compound"].append(Upsert(kId, FileDoc("/v/s/one")));
  compound["compound"].append(SetById(kId, "/v/s/missing", FileDoc("/v/s/missing")));
  Json::Value bad_type = FileDoc("/v/s/three");
  bad_type["KALOMDFSSize"] = "big";
  compound["compound"].append(Upsert(kId, bad_type));
  compound["compound"].append(Upsert(kId, FileDoc("/v/s/four")));
  const Json::Value answer = Ok(compound);
  EXPECT_TRUE(answer["has_fail"].asBool());
  ASSERT_EQ(4u, answer["data"].size());
  EXPECT_TRUE(answer["data"][0]["success"].asBool());
  EXPECT_EQ(search::kNoSuchDocument, answer["data"][1]["error"]["code"].asInt());
  EXPECT_EQ(search::kBadArgument, answer["data"][2]["error"]["code"].asInt());
  EXPECT_TRUE(answer["data"][3]["success"].asBool());
  EXPECT_EQ((std::vector<std::string>{"/v/s/four", "/v/s/one"}), DocPaths(GetByPrefix("/v/s/")));

  Json::Value clean;
  clean["compound"] = Json::Value(Json::arrayValue);
  const Json::Value empty = Ok(clean);
  EXPECT_FALSE(empty["has_fail"].asBool());
  EXPECT_EQ(0u, empty["data"].size());
}

TEST_F(SearchEngineTest, SetWithANewPathMovesTheDocument) {
  Ok(Upsert(kId, FileDoc("/v/s/old/a.txt")));
  Json::Value moved;
  moved["KALOMDPath"] = "/v/s/new/a.txt";
  moved["KALOMDParent"] = "/v/s/new";
  Ok(SetById(kId, "/v/s/old/a.txt", moved));
  Commit();
  EXPECT_EQ(std::vector<std::string>{"/v/s/new/a.txt"}, DocPaths(GetByPrefix("/v/s/")));
  EXPECT_EQ(std::vector<std::string>{"/v/s/new/a.txt"}, Found(R"({"folder": "/v/s/new"})"));
  EXPECT_EQ(std::vector<std::string>{}, Found(R"({"folder": "/v/s/old"})"));
}

// Every length of fragment, in any case, against a naive scan of the same
// generated names: short fragments take the scan path, longer ones the
// trigram index, and both must agree with the model exactly.
TEST_F(SearchEngineTest, NameFragmentsMatchANaiveScan) {
  const std::vector<std::string> pieces = {"a",    "B", "ab",  "Straße", "STRASSE", "é",
                                           "É",    "x", "Ünï", "ünï",    "photo",   "PHOTO",
                                           "2024", "_", ".",   "ǅ"};
  std::mt19937 random(20241124);
  std::vector<std::string> names;
  Json::Value compound;
  for (int i = 0; i < 400; ++i) {
    std::string name;
    const int parts = 1 + static_cast<int>(random() % 5);
    for (int p = 0; p < parts; ++p) name += pieces[random() % pieces.size()];
    name += "-" + std::to_string(i);
    names.push_back(name);
    compound["compound"].append(Upsert(kId, FileDoc("/v/s/" + name)));
  }
  // One fixed name, so the ten-character fragment below has a match.
  names.push_back("xxSTRASSEab-1yy");
  compound["compound"].append(Upsert(kId, FileDoc("/v/s/" + names.back())));
  EXPECT_FALSE(Ok(compound)["has_fail"].asBool());
  Commit();
  search::SqliteDb db(DbPath(), /*create=*/false);
  search::RegisterNameTokenizer(db.handle());
  const std::vector<std::string> fragments = {
      "a",   "É",   "ß",  "ab",        "Ab",           "x.",  "ss", "ünï", "STR",
      "raß", "PHO", "5-", "photo2024", "strassephoto", "aÉa", "ǆ",  "-1",  "Straßeab-1"};
  for (const std::string& fragment : fragments) {
    const std::string folded = search::FoldCase(fragment);
    std::set<std::string> expected;
    for (const std::string& name : names) {
      if (search::FoldCase(name).find(folded) != std::string::npos) expected.insert("/v/s/" + name);
    }
    const Json::Value answer = SearchName(fragment);
    const std::vector<std::string> got = HitPaths(answer);
    EXPECT_EQ(expected, std::set<std::string>(got.begin(), got.end())) << "fragment " << fragment;
    EXPECT_EQ(static_cast<int64_t>(expected.size()), answer["data"]["total"].asInt64())
        << "fragment " << fragment;
    // The name index alone, as a large index asks it: a phrase of trigrams,
    // or for one or two code points a prefix of one token.
    search::Statement grams(db, "SELECT count(*) FROM name_grams WHERE name_grams MATCH ?1");
    const bool short_fragment = search::CodePointCount(folded) < 3;
    grams.Bind(1, "\"" + folded + "\"" + (short_fragment ? "*" : "")).Step();
    EXPECT_EQ(static_cast<int64_t>(expected.size()), grams.Int(0)) << "fragment " << fragment;
  }
  const std::vector<std::string> ten = HitPaths(SearchName("Straßeab-1"));
  EXPECT_NE(ten.end(), std::find(ten.begin(), ten.end(), "/v/s/xxSTRASSEab-1yy"));
}

// Each way to a fragment's first page must give the model's page, in both
// directions and after an offset: the name index read in order ("photo" is
// in so many names that it is counted only to 1,000), the names that begin
// with the fragment read from their stretch of that index ("report_" begins
// 2,199 names), and that stretch merged with the few that hold it further
// in ("album", and "report_" once). Names repeat in other folders: ties go
// by path.
TEST_F(SearchEngineTest, CommonFragmentsPageInNameOrderLikeTheModel) {
  std::mt19937 random(7);
  std::vector<std::pair<std::string, std::string>> model;  // folded name, path
  Json::Value compound;
  for (int i = 0; i < 3000; ++i) {
    const std::string letter(1, static_cast<char>('A' + random() % 26));
    const std::string number = std::to_string(random() % 3);
    std::string name = letter + "x" + number + (i % 3 ? "Photo" : "PHOTO") + ".jpg";
    if (i < 2200) name = (i % 2 ? "Report_" : "REPORT_") + name;
    // One name that holds "report_" further in, where the sample of the
    // names does not look: the count must still find it.
    if (i == 300) name = "A" + name;
    if (i >= 2200 && i < 2800) name = "Album" + number + letter + ".jpg";
    if (i >= 2800) name = letter + number + "_ALBUM.jpg";
    const std::string path = "/v/s/d" + std::to_string(i) + "/" + name;
    model.emplace_back(search::FoldCase(name), path);
    compound["compound"].append(Upsert(kId, FileDoc(path)));
  }
  Ok(compound);
  Commit();
  std::sort(model.begin(), model.end());
  const struct {
    const char* fragment;
    bool exact;  // whether the total is counted to the end
  } cases[] = {{"pHoTo", false}, {"rEpOrT_", true}, {"ALBUM", true}};
  for (const auto& c : cases) {
    std::vector<std::pair<std::string, std::string>> matches;
    for (const auto& entry : model) {
      if (entry.first.find(search::FoldCase(c.fragment)) != std::string::npos) {
        matches.push_back(entry);
      }
    }
    for (const bool descending : {false, true}) {
      if (descending) std::reverse(matches.begin(), matches.end());
      std::vector<std::string> expected;
      for (size_t i = 10; i < 60; ++i) expected.push_back(matches[i].second);
      const Json::Value answer = SearchFor(ParseJson(std::string(R"({"name": ")") + c.fragment +
                                                     R"(", "offset": 10, "limit": 50)" +
                                                     (descending ? R"(, "order": "desc"})" : "}")));
      const std::string where = std::string(c.fragment) + (descending ? " descending" : "");
      EXPECT_EQ(expected, HitPaths(answer)) << where;
      EXPECT_EQ(c.exact, answer["data"]["total_exact"].asBool()) << where;
      // A count stopped early is at least the page's end, never more than matched.
      EXPECT_GE(answer["data"]["total"].asInt(), c.exact ? matches.size() : 60) << where;
      EXPECT_LE(answer["data"]["total"].asInt(), matches.size()) << where;
    }
  }
}

TEST_F(SearchEngineTest, SearchFiltersSortsAndPages) {
  Json::Value compound;
  for (int i = 0; i < 30; ++i) {
    const std::string ext = i % 3 == 0 ? "jpg" : i % 3 == 1 ? "pdf" : "mp3";
    compound["compound"].append(Upsert(
        kId, FileDoc("/v/s/d" + std::to_string(i % 2) + "/f" + std::to_string(100 + i) + "." + ext,
                     i * 10)));
  }
  Ok(compound);
  Commit();
  const Json::Value answer = SearchFor(
      ParseJson(R"({"type": "image", "sort": "size", "order": "desc", "limit": 3, "offset": 1})"));
  EXPECT_EQ(10, answer["data"]["total"].asInt());
  EXPECT_EQ((std::vector<std::string>{"/v/s/d0/f124.jpg", "/v/s/d1/f121.jpg", "/v/s/d0/f118.jpg"}),
            HitPaths(answer));
  EXPECT_EQ((std::vector<std::string>{"/v/s/d1/f101.pdf", "/v/s/d1/f107.pdf"}),
            Found(R"({"extension": "PDF", "folder": "/v/s/d1", "size_max": 100})"));
  // The owner by id, as a number or text, or by name (root is id 0).
  Ok(Upsert(kId, DocWith("/v/s/mine.txt", R"({"KALOMDOwnerUserID": "0"})")));
  Ok(Upsert(kId, DocWith("/v/s/theirs.txt", R"({"KALOMDOwnerUserID": 1024})")));
  Commit();
  const std::vector<std::string> mine = {"/v/s/mine.txt"}, theirs = {"/v/s/theirs.txt"};
  EXPECT_EQ(mine, Found(R"({"owner": "root"})"));
  EXPECT_EQ(mine, Found(R"({"owner": 0})"));
  EXPECT_EQ(theirs, Found(R"({"owner": "1024"})"));
  EXPECT_EQ(search::kBadArgument, ErrorCode(Request("search", R"({"owner": "no such user"})")));
}

TEST_F(SearchEngineTest, TextQueriesTakeWordsPhrasesAndPrefixes) {
  Ok(Upsert(kId, DocWith("/v/s/a.txt", R"({"KALOMDTextContent":
                                           "The quick brown fox jumps over the lazy dog"})")));
  Ok(Upsert(kId, DocWith("/v/s/b.txt", R"({"KALOMDTextContent":
                                           "A brown dog, quick to anger; café au lait"})")));
  Ok(Upsert(kId, DocWith("/v/s/c.txt", R"({"KALOMDTitle": "Quickstart guide"})")));
  Commit();
  const struct {
    const char* query;
    std::vector<std::string> paths;
  } cases[] = {
      {"quick", {"/v/s/a.txt", "/v/s/b.txt"}},
      {"\"quick brown\"", {"/v/s/a.txt"}},
      {"quick*", {"/v/s/a.txt", "/v/s/b.txt", "/v/s/c.txt"}},
      {"dog brown", {"/v/s/a.txt", "/v/s/b.txt"}},
      {"cafe", {"/v/s/b.txt"}},  // diacritics removed
      {"NEAR(fox dog)", {}},     // user text is never FTS5 syntax
      {"guide", {"/v/s/c.txt"}},
      {"fox OR guide", {"/v/s/a.txt", "/v/s/c.txt"}},
      {"dog fox OR anger", {"/v/s/a.txt", "/v/s/b.txt"}},
      {"quick* -fox", {"/v/s/b.txt", "/v/s/c.txt"}},
      {"brown -\"lazy dog\" -nothing", {"/v/s/b.txt"}},
      {"OR guide", {}},  // a leading OR is a word to find
  };
  for (const auto& c_ : cases) {
    Json::Value q;
    q["text"] = c_.query;
    EXPECT_EQ(c_.paths, HitPaths(SearchFor(q))) << c_.query;
  }
  for (const char* lazy : {"lazy", "laz*"}) {
    Json::Value q;
    q["text"] = lazy;
    EXPECT_EQ("The quick brown fox jumps over the [lazy] dog",
              SearchFor(q)["data"]["hits"][0]["snippet"].asString());
  }
}

// Below the bound where phrases' documents are counted, the relevance order
// is FTS5's own bm25 order (ties by path), for words, phrases, prefixes,
// either-or and excluded terms.
TEST_F(SearchEngineTest, RelevanceOrderIsBm25) {
  const char* const vocabulary[] = {"alpha", "beta", "gamma", "delta", "epsilon", "zeta"};
  std::mt19937 random(11);
  for (int i = 0; i < 60; ++i) {
    std::string text;
    const int words = 3 + static_cast<int>(random() % 30);
    for (int w = 0; w < words; ++w) text += std::string(vocabulary[random() % 6]) + " ";
    Json::Value doc = FileDoc("/v/s/t" + std::to_string(100 + i) + ".txt");
    doc["KALOMDTextContent"] = text;
    Ok(Upsert(kId, doc));
  }
  Commit();
  search::SqliteDb db(DbPath(), /*create=*/false);
  const struct {
    const char* query;  // ours
    const char* fts5;   // the same for FTS5
  } cases[] = {
      {"zeta", "zeta"},
      {"alpha zeta", "alpha AND zeta"},
      {"\"beta gamma\" delta", "\"beta gamma\" AND delta"},
      {"eps* OR zeta -alpha", "(eps* OR zeta) NOT alpha"},
  };
  for (const auto& c : cases) {
    search::Statement bm25(db,
                           "SELECT d.path FROM words JOIN documents d ON d.id = words.rowid "
                           "WHERE words MATCH ?1 ORDER BY bm25(words), d.path");
    bm25.Bind(1, c.fts5);
    std::vector<std::string> expected;
    while (bm25.Step()) expected.push_back(bm25.Text(0));
    Json::Value q;
    q["text"] = c.query;
    q["sort"] = "relevance";
    q["limit"] = 100;
    EXPECT_FALSE(expected.empty()) << c.query;
    EXPECT_EQ(expected, HitPaths(SearchFor(q))) << c.query;
  }
}

TEST_F(SearchEngineTest, BadRequestsGetClearErrors) {
  Json::Value no_doc_id = Command("document_upsert_by_id", kId);
  no_doc_id["data"]["data"] = FileDoc("/v/s/x");
  Json::Value doc_not_object = Upsert(kId, FileDoc("/v/s/x"));
  doc_not_object["data"]["data"] = "text";
  Json::Value size_as_text = Upsert(kId, FileDoc("/v/s/x"));
  size_as_text["data"]["data"]["KALOMDFSSize"] = "ten";
  Json::Value empty_prefix = PrefixQuery("document_del_by_query", kId, "");
  Json::Value bad_query = Command("document_get_by_query", kId);
  bad_query["data"]["query"]["qsl"]["match"]["KALOMDPath"] = "/v";
  const auto page = [](const char* key, const Json::Value& value) {
    Json::Value req = PrefixQuery("document_get_by_query", kId, "/v/s/");
    req["data"][key] = value;
    return req;
  };
  Json::Value no_data;
  no_data["command"] = "commit";
  Json::Value relative = Command("index_create", "fileindex_t");
  relative["data"]["path"] = "relative/db";
  Json::Value other_path = Command("index_create", kId);
  other_path["data"]["path"] = DbPath("elsewhere");
  auto search = [](const char* key, const Json::Value& value) {
    Json::Value req;
    req["command"] = "search";
    req["data"][key] = value;
    return req;
  };
  std::string many_words;
  for (int i = 0; i < 10000; ++i) many_words += "w" + std::to_string(i) + " ";
  // Databases go only where the client puts them: in a share's metadata folder.
  auto create_at = [](const std::string& path) {
    Json::Value req = Command("index_create", "fileindex_t");
    req["data"]["path"] = path;
    return req;
  };
  Json::Value onto_system_file = Command("index_config_set", kId);
  onto_system_file["data"]["data"]["path"] = "/etc/passwd";
  Json::Value size_one;
  size_one["KALOMDFSSize"] = 1;
  const struct {
    const char* what;
    Json::Value request;
    int code;
  } cases[] = {
      {"unknown command", Command("index_explode", kId), search::kUnknownCommand},
      {"command not a string", ParseJson(R"({"command": 7, "data": {}})"), search::kBadArgument},
      {"no command", ParseJson(R"({"data": {"id": "x"}})"), search::kBadArgument},
      {"no data", no_data, search::kBadArgument},
      {"not an object", ParseJson(R"([1, 2])"), search::kBadJson},
      {"id with ..", Command("commit", "fileindex_.."), search::kBadIndexId},
      {"id with /", Command("commit", "fileindex_a/b"), search::kBadIndexId},
      {"empty id", Command("commit", ""), search::kBadIndexId},
      {"id not a string", ParseJson(R"({"command": "commit", "data": {"id": 3}})"),
       search::kBadArgument},
      {"unknown index", Command("commit", "fileindex_none"), search::kNoSuchIndex},
      {"no doc_id", no_doc_id, search::kBadArgument},
      {"document not an object", doc_not_object, search::kBadArgument},
      {"size as text", size_as_text, search::kBadArgument},
      {"empty prefix", empty_prefix, search::kBadArgument},
      {"query not a prefix", bad_query, search::kBadArgument},
      {"page limit negative", page("limit", -1), search::kBadArgument},
      {"page limit zero", page("limit", 0), search::kBadArgument},
      {"page limit above 10,000", page("limit", 10001), search::kBadArgument},
      {"page limit beyond 64 bits", page("limit", Json::UInt64(~0ull)), search::kBadArgument},
      {"page after not a string", page("after", 5), search::kBadArgument},
      {"relative path", relative, search::kBadArgument},
      {"existing id elsewhere", other_path, search::kIndexExists},
      {"unknown sort", search("sort", "colour"), search::kBadArgument},
      {"name not a string", search("name", 5), search::kBadArgument},
      {"limit as text", search("limit", "ten"), search::kBadArgument},
      {"limit beyond 64 bits", search("limit", Json::UInt64(~0ull)), search::kBadArgument},
      {"offset beyond the reach", search("offset", 10000), search::kBadArgument},
      {"text of 10,000 words", search("text", many_words), search::kBadArgument},
      {"text of excluded words only", search("text", "-quick -\"brown fox\""),
       search::kBadArgument},
      {"name longer than a file name", search("name", std::string(2000, 'n')),
       search::kBadArgument},
      {"database outside a share", create_at(root_.Join("outside/db")), search::kBadArgument},
      {"database up and out of a share",
       create_at(root_.Join("volume1/t/../../outside/@eaDir/@fileindex/db")), search::kBadArgument},
      {"moved onto a system file", onto_system_file, search::kBadArgument},
      {"set of a missing document", SetById(kId, "/v/s/never", size_one), search::kNoSuchDocument},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(c.code, ErrorCode(c.request)) << c.what << ": " << toString(c.request);
  }
  EXPECT_FALSE(std::filesystem::exists(root_.Join("outside")));
  // The index is still there and serving.
  Ok(Upsert(kId, FileDoc("/v/s/after")));
}

// A paused index answers reads and refuses document writes (the indexer
// keeps them queued); the pause first commits what was sent before it.
TEST_F(SearchEngineTest, APausedIndexAnswersReadsRefusesWritesAndSurvivesARestart) {
  Ok(Upsert(kId, FileDoc("/v/s/kept")));
  Commit();
  Ok(Upsert(kId, FileDoc("/v/s/sent_before_pause")));
  Ok(Command("index_pause", kId));
  Restart();
  const Json::Value stats = Request("stats");
  Json::Value answer = Ok(stats);
  ASSERT_EQ(1u, answer["data"]["indexes"].size());
  EXPECT_EQ(kId, answer["data"]["indexes"][0]["id"].asString());
  EXPECT_TRUE(answer["data"]["indexes"][0]["paused"].asBool());
  EXPECT_EQ(2, answer["data"]["indexes"][0]["documents"].asInt());
  const std::vector<std::string> both = {"/v/s/kept", "/v/s/sent_before_pause"};
  EXPECT_EQ(both, HitPaths(SearchName("")));
  EXPECT_EQ(both, DocPaths(GetByPrefix("/v/s/")));
  const Json::Value writes[] = {
      Upsert(kId, FileDoc("/v/s/new")), SetById(kId, "/v/s/kept", FileDoc("/v/s/moved")),
      DelById(kId, "/v/s/kept"), PrefixQuery("document_del_by_query", kId, "/v/s/")};
  for (const Json::Value& write : writes) {
    EXPECT_EQ(search::kIndexPaused, ErrorCode(write)) << toString(write);
  }
  Commit();  // nothing is pending: not refused
  EXPECT_EQ(both, DocPaths(GetByPrefix("/v/s/")));
  Ok(Command("index_resume", kId));
  EXPECT_FALSE(Ok(stats)["data"]["indexes"][0]["paused"].asBool());
  Ok(writes[0]);
}

TEST_F(SearchEngineTest, StatsTellWhenTheIndexWasLastCommitted) {
  const Json::Value stats = Request("stats");
  auto last_commit = [&] { return Ok(stats)["data"]["indexes"][0]["last_commit"]; };
  Ok(Upsert(kId, FileDoc("/v/s/a")));
  const int64_t before = std::time(nullptr);
  Commit();
  const int64_t after = std::time(nullptr);
  const Json::Value committed = last_commit();
  ASSERT_TRUE(committed.isInt64()) << toString(committed);
  EXPECT_LE(before, committed.asInt64());
  EXPECT_GE(after, committed.asInt64());
  Restart();
  EXPECT_EQ(committed, last_commit());
}

TEST_F(SearchEngineTest, ConfigSetRenamesAndMovesTheDatabaseWhole) {
  Ok(Upsert(kId, FileDoc("/v/s/a")));
  Commit();
  Ok(Upsert(kId, FileDoc("/v/s/b")));  // committed by the move
  Json::Value rename = Command("index_config_set", kId);
  rename["data"]["data"]["id"] = "fileindex_t";
  rename["data"]["data"]["path"] = DbPath("t");
  Ok(rename);
  EXPECT_FALSE(std::filesystem::exists(DbPath("s")));
  EXPECT_TRUE(std::filesystem::exists(DbPath("t")));
  EXPECT_EQ(search::kNoSuchIndex, ErrorCode(Command("commit", kId)));
  Restart();
  EXPECT_EQ((std::vector<std::string>{"/v/s/a", "/v/s/b"}),
            DocPaths(Ok(PrefixQuery("document_get_by_query", "fileindex_t", "/v/s/"))));
  Json::Value migrate = Command("index_config_set", "fileindex_t");
  migrate["data"]["data"]["path"] = DbPath("u");
  Ok(migrate);
  EXPECT_FALSE(std::filesystem::exists(DbPath("t")));
  EXPECT_EQ(2, SearchName("")["data"]["total"].asInt());
  // Taking an existing index's id is refused.
  CreateIndex("fileindex_v", "v");
  Json::Value clash = Command("index_config_set", "fileindex_v");
  clash["data"]["data"]["id"] = "fileindex_t";
  EXPECT_EQ(search::kIndexExists, ErrorCode(clash));
}

TEST_F(SearchEngineTest, DeleteRemovesTheIndexAndItsDatabase) {
  Ok(Upsert(kId, FileDoc("/v/s/a")));
  Commit();
  Ok(Command("index_delete", kId));
  EXPECT_FALSE(std::filesystem::exists(DbPath("s")));
  EXPECT_EQ(search::kNoSuchIndex, ErrorCode(Upsert(kId, FileDoc("/v/s/a"))));
  Ok(Command("index_delete", kId));  // again: already gone, not an error
  Restart();
  EXPECT_EQ(search::kNoSuchIndex, ErrorCode(Command("commit", kId)));
}

}  // namespace
}  // namespace testing
}  // namespace orvex
