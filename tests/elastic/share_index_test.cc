// The schema and the per-share index commands, as the search daemon
// stand-in receives them.
#include <gtest/gtest.h>

#include <functional>
#include <sstream>
#include <string>
#include <vector>

#include "elastic/elastic_test_root.h"
#include "orvex/elastic.h"
#include "orvex/foundation/json.h"
#include "support/error_code.h"

namespace orvex {
namespace fileindex {
namespace elastic {
namespace {

using testing::CodeOf;
using testing::Options;

class ShareIndexTest : public testing::ElasticTestRoot {};

// The schema's properties as the search daemon was designed to receive
// them, grouped by type, analyzer ("" where the default applies) and further
// members.
struct PropertyGroup {
  const char* type;
  const char* analyzer;
  const char* others;
  const char* names;  // blank-separated, "KALOMD" left out where it leads
};

const PropertyGroup kSchema[] = {
    {"", "keyword", R"({"required": true, "_all": false})", "Path"},
    {"", "keyword", R"({"_all": false})",
     "FSName Privilege OwnerUserID OwnerGroupID Parent Extension"},
    {"bool", "", R"({"_all": false})", "IsDir"},
    {"text", "keyword", R"({"_all": false})", "Identifier"},
    {"int", "", "{}",
     "FSSize FSContentChangeDate AttributeChangeDate FSCreationDate ContentModificationDate "
     "LastUsedDate ContentCreationDate AudioTrackNumber RecordingYear AudioBitRate TotalBitRate "
     "VideoBitRate AudioSampleRate AudioChannelCount ISOSpeed ResolutionWidthDPI "
     "ResolutionHeightDPI FinderLabel FinderOpenDate LogicalSize PhysicalSize DateAdded"},
    {"double", "", "{}", "DurationSecond"},
    {"text", "white space", "{}",
     "Authors Creator Composer Codecs AcquisitionMake AcquisitionModel SpotlightBoost"},
    {"text", "white space", R"({"preprocess": ["tolower", "ngram"]})", "SearchFileName"},
    {"text", "", "{}", "Title Album MusicalGenre Comment Description TextContent _KALOMDUserTags"},
    {"", "keyword", "{}", "ExposureTimeString Aperture MediaTypes GroupId StarRating"},
    {"", "", "{}", "Keywords"},
};

TEST(MappingsTest, HoldsTheDefaultAndEveryPropertyOfTheSchema) {
  const Json::Value mappings = GetFileIndexMappings();
  EXPECT_EQ(3u, mappings.size());
  EXPECT_EQ("KALOMDPath", mappings["property_id"].asString());
  EXPECT_EQ(Options(R"({"type": "string", "analyzer": "kalostandard", "required": false,
                        "stored": true, "_all": true})"),
            mappings["default"]);
  size_t count = 0;
  for (const PropertyGroup& group : kSchema) {
    Json::Value expected = Options(group.others);
    if (*group.type) expected["type"] = group.type;
    if (*group.analyzer) expected["analyzer"] = group.analyzer;
    std::istringstream names(group.names);
    for (std::string name; names >> name; ++count) {
      if (name[0] != '_') name = "KALOMD" + name;
      EXPECT_EQ(expected, mappings["properties"][name]) << name;
    }
  }
  ASSERT_EQ(53u, count);
  EXPECT_EQ(53u, mappings["properties"].size());
}

TEST_F(ShareIndexTest, CreateSendsTheDatabasePathEmptySettingsAndTheSchema) {
  const std::string root = AddShare("Home Media");
  ShareIndexCreate("Home Media");
  ASSERT_EQ(1u, peer_.requests().size());
  Json::Value expected;
  expected["command"] = "index_create";
  expected["data"]["id"] = "fileindex_Home Media";
  expected["data"]["path"] = root + "/@eaDir/@fileindex/db";
  expected["data"]["settings"] = Json::Value(Json::objectValue);
  expected["data"]["mappings"] = GetFileIndexMappings();
  EXPECT_EQ(expected, peer_.requests()[0]);
  EXPECT_TRUE(peer_.faults().empty());
}

TEST_F(ShareIndexTest, CreateOfAnUnknownShareSendsNothing) {
  std::string reason;
  EXPECT_EQ(800, CodeOf([] { ShareIndexCreate("nope"); }, &reason));
  EXPECT_EQ("nope", reason);
  EXPECT_TRUE(peer_.requests().empty());
}

TEST_F(ShareIndexTest, EachCommandSendsItsRequest) {
  struct Case {
    const char* name;
    std::function<void()> call;
    const char* request;
  };
  const std::vector<Case> cases = {
      {"delete", [] { ShareIndexDelete("s"); },
       R"({"command": "index_delete", "data": {"id": "fileindex_s"}})"},
      {"pause", [] { ShareIndexPause("s"); },
       R"({"command": "index_pause", "data": {"id": "fileindex_s"}})"},
      {"resume", [] { ShareIndexResume("s"); },
       R"({"command": "index_resume", "data": {"id": "fileindex_s"}})"},
      {"rename", [] { ShareIndexRename("old s", "new é", "/volume2/new é/@eaDir/@fileindex/db"); },
       R"({"command": "index_config_set", "data": {"id": "fileindex_old s",
           "data": {"id": "fileindex_new é", "path": "/volume2/new é/@eaDir/@fileindex/db"}}})"},
      {"migrate", [] { ShareIndexMigrate("s", "/volume2/s/@eaDir/@fileindex/db"); },
       R"({"command": "index_config_set", "data": {"id": "fileindex_s",
           "data": {"path": "/volume2/s/@eaDir/@fileindex/db"}}})"},
  };
  for (const Case& c : cases) {
    const size_t before = peer_.requests().size();
    c.call();
    ASSERT_EQ(before + 1, peer_.requests().size()) << c.name;
    EXPECT_EQ(Options(c.request), peer_.requests().back()) << c.name;
  }
}

}  // namespace
}  // namespace elastic
}  // namespace fileindex
}  // namespace orvex
