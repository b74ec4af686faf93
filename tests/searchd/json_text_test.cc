// The daemon's JSON writer: what it writes reads back as the same value.
#include "search/json_text.h"

#include <gtest/gtest.h>

#include <limits>

#include "orvex/foundation/json.h"

namespace orvex {
namespace testing {
namespace {

TEST(JsonTextTest, EveryKindOfValueReadsBackEqual) {
  Json::Value doc;
  doc["KALOMDPath"] =
      "/v/s/\"quoted\"\\back\\slash/Stra\xc3\x9f"
      "e\ttab\nline\x01\x1f.txt";
  doc["KALOMDFSSize"] = static_cast<Json::Int64>(std::numeric_limits<int64_t>::max());
  doc["negative"] = static_cast<Json::Int64>(std::numeric_limits<int64_t>::min());
  doc["unsigned"] = static_cast<Json::UInt64>(std::numeric_limits<uint64_t>::max());
  doc["KALOMDDurationSecond"] = 0.1;
  doc["whole"] = 2.0;
  doc["KALOMDIsDir"] = false;
  doc["yes"] = true;
  doc["nothing"] = Json::Value();
  doc["KALOMDAuthors"].append("a");
  doc["KALOMDAuthors"].append(Json::Value(Json::objectValue));
  doc["KALOMDAuthors"].append(Json::Value(Json::arrayValue));
  doc["nested"]["k\"ey"]["deep"] = 1;
  doc[std::string("nul\0inside", 10)] = std::string("a\0b", 3);
  const std::string text = search::JsonText(doc);
  Json::Value back;
  ASSERT_TRUE(fromString(back, text)) << text;
  EXPECT_EQ(doc, back) << text;
  EXPECT_EQ(toString(doc), toString(back));
  EXPECT_EQ("{}", search::JsonText(Json::Value(Json::objectValue)));
  EXPECT_EQ("[]", search::JsonText(Json::Value(Json::arrayValue)));
}

}  // namespace
}  // namespace testing
}  // namespace orvex
