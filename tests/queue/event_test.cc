#include "orvex/queue/event.h"

#include <gtest/gtest.h>

#include "orvex/foundation/error.h"
#include "support/log_capture.h"

namespace orvex {
namespace fileindex {
namespace {

TEST(EventTest, ParsesEveryField) {
  Event ev(R"({"event":256,"is_dir":true,"path":"/v/s/new","path_old":"/v/s/old",)"
           R"("data":{"photo":true},"ts":12345})");
  EXPECT_EQ(ev.event, 256u);
  EXPECT_TRUE(ev.is_dir);
  EXPECT_EQ(ev.path, "/v/s/new");
  EXPECT_EQ(ev.path_old, "/v/s/old");
  EXPECT_TRUE(ev.data["photo"].asBool());
}

TEST(EventTest, OptionalFieldsStartEmpty) {
  Event ev(R"({"event":128,"path":"/v/s/f"})");
  EXPECT_EQ(ev.event, 128u);
  EXPECT_FALSE(ev.is_dir);
  EXPECT_EQ(ev.path_old, "");
  EXPECT_TRUE(ev.data.isNull());
}

TEST(EventTest, OptionalFieldOfWrongTypeKeepsItsInitialValue) {
  Event ev(R"({"event":64,"path":"/v/s/f","is_dir":"yes","path_old":{"x":1}})");
  EXPECT_FALSE(ev.is_dir);
  EXPECT_EQ(ev.path_old, "");
}

struct BadLine {
  const char* text;
  ErrorCode code;
};

TEST(EventTest, RejectsBadLinesWithTheirCodes) {
  const BadLine cases[] = {
      {"", kErrorMalformedEvent},
      {"not json", kErrorMalformedEvent},
      {R"({"event":64,"path":"/a"} trailing)", kErrorMalformedEvent},
      {R"({"event":64,"path":"/a")", kErrorMalformedEvent},
      {"[1,2]", kErrorBadArgument},
      {"42", kErrorBadArgument},
      {R"({"path":"/a"})", kErrorBadArgument},
      {R"({"event":64})", kErrorBadArgument},
      {R"({"event":"128","path":"/a"})", kErrorBadArgument},
      {R"({"event":-1,"path":"/a"})", kErrorBadArgument},
      {R"({"event":64,"path":["/a"]})", kErrorBadArgument},
  };
  testing::LogCapture log;
  for (const BadLine& bad : cases) {
    try {
      Event ev(bad.text);
      ADD_FAILURE() << "accepted: " << bad.text;
    } catch (const Error& e) {
      EXPECT_EQ(e.code(), bad.code) << bad.text << ": " << e.reason();
    }
  }
}

TEST(EventTest, MalformedTextIsLoggedAndQuotedInTheReason) {
  testing::LogCapture log;
  try {
    Event ev("{oops");
    FAIL() << "accepted a malformed line";
  } catch (const Error& e) {
    EXPECT_EQ(e.reason(), "Malformed event_raw: {oops");
  }
  ASSERT_EQ(log.lines().size(), 1u);
  EXPECT_NE(log.lines()[0].find("optree:"), std::string::npos);
  EXPECT_NE(log.lines()[0].find("Failed [!data.fromString(event_raw)], reason: "
                                "Malformed event_raw: {oops"),
            std::string::npos);
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
