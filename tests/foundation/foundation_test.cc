// Error, the check-and-throw log convention, the JSON helpers and the path
// and file helpers.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <functional>
#include <string>
#include <tuple>
#include <vector>

#include "foundation/check.h"
#include "foundation/fault_helpers.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/log.h"
#include "orvex/foundation/util.h"
#include "support/log_capture.h"
#include "support/run_program.h"
#include "support/temp_dir.h"

namespace orvex {
namespace {

constexpr char kLogSource[] = "check_test";

Json::Value Parse(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

TEST(ErrorTest, MessageCarriesCodeAndReason) {
  EXPECT_STREQ(Error(kErrorBadArgument, "").message(), "Orvex error, code=120");  // no "[]"
  const Error e(kErrorLockFile, "Exceed max retry");
  EXPECT_STREQ(Error(e).message(), "Orvex error, code=506, reason=[Exceed max retry]");
  EXPECT_STREQ(static_cast<const std::runtime_error&>(e).what(), "Exceed max retry");
}

TEST(CheckTest, FailedCheckLogsOneExactLineClearsErrnoAndThrows) {
  testing::LogCapture log;
  int reasons_built = 0;
  EXPECT_NO_THROW(ORVEX_CHECK(1 < 0, kErrorSystem, std::to_string(++reasons_built)));
  EXPECT_EQ(reasons_built, 0) << "a passing check builds no reason";
  try {
    ORVEX_CHECK(0 > ::open("/nonexistent/orvex/file", O_RDONLY), kErrorSystem, "open queue");
    ADD_FAILURE() << "no throw";
  } catch (const Error& e) {
    EXPECT_EQ(errno, 0);
    EXPECT_EQ(e.code(), kErrorSystem);
    EXPECT_EQ(e.reason(), "open queue");
  }
  ASSERT_EQ(log.lines().size(), 1u);
  EXPECT_EQ(testing::WithoutLineNumber(log.lines()[0]),
            testing::CheckLine("check_test", "0 > ::open(\"/nonexistent/orvex/file\", O_RDONLY)",
                               "open queue") +
                " [err: No such file or directory]");
}

TEST(LogTest, PlainKeepsErrnoAndErrnoLineAppendsAndClearsIt) {
  testing::LogCapture log;
  errno = EACCES;
  LogPlain("%s:%d plain", "src", 7);
  EXPECT_EQ(errno, EACCES);
  LogErrno("%s:%d with errno", "src", 8);
  EXPECT_EQ(errno, 0);
  LogErrno("%s:%d without errno", "src", 9);
  const std::string long_text(3000, 'x');  // past any fixed formatting buffer
  LogPlain("%s", long_text.c_str());
  EXPECT_EQ(log.lines(),
            (std::vector<std::string>{"src:7 plain", "src:8 with errno [err: Permission denied]",
                                      "src:9 without errno", long_text}));
}

TEST(GetJsonValueTest, ReadsTypedValuesOrThrowsWithTheData) {
  const Json::Value obj = Parse(R"({"n":"abc","big":3000000000,"real":1.5,"z":null})");
  const std::string data = ", data=" + toString(obj);
  int i = 42;
  long long ll = 0;
  std::string s;
  GetJsonValue(i, obj, "absent", false);
  GetJsonValue(ll, obj, "big", true);
  EXPECT_EQ(std::make_pair(i, ll), std::make_pair(42, 3000000000LL));
  const std::vector<std::pair<std::function<void()>, std::string>> failures = {
      {[&] { GetJsonValue(i, obj, "n", true); }, "Not a string" + data},
      {[&] { GetJsonValue(ll, obj, "real", true); }, "Not a string" + data},
      {[&] { GetJsonValue(s, obj, "missing", true); }, "Missing property: missing" + data},
      {[&] { GetJsonValue(s, Parse("[1]"), "n", false); }, "Not an object, data=[1]"},
  };
  for (size_t k = 0; k < failures.size(); ++k) {
    try {
      failures[k].first();
      ADD_FAILURE() << "case " << k << " did not throw";
    } catch (const Error& e) {
      EXPECT_EQ(e.code(), kErrorBadArgument) << k;
      EXPECT_EQ(e.reason(), failures[k].second) << k;
    }
  }
}

TEST(JsonTest, ApplyChangesAndTextRoundTrip) {
  Json::Value target = Parse(R"({"a":1,"b":{"d":2},"l":[2,3]})");
  JsonApplyChanges(target, Parse(R"({"a":null,"b":{"c":1},"l":[1],"gone":null})"));
  EXPECT_EQ(target, Parse(R"({"b":{"c":1,"d":2},"l":[1]})"));

  Json::Value nested(Json::objectValue);
  nested["text"] = "line one\nline two\r\n\x1f end caf\xC3\xA9";
  const std::string text = toString(nested);
  EXPECT_EQ(text.find_first_of("\r\n"), std::string::npos) << text;
  EXPECT_NE(text.find("caf\xC3\xA9"), std::string::npos) << "UTF-8 keeps its bytes";
  EXPECT_EQ(Parse(text), nested);
  EXPECT_FALSE(fromString(nested, "{\"a\":1}\n{\"a\":2}")) << "two queue lines, not one";
  // Deep nesting fails cleanly instead of overflowing the stack.
  EXPECT_FALSE(fromString(nested, std::string(100000, '[') + std::string(100000, ']')));
}

TEST(JsonFileTest, ToFileReplacesWholeWithMode0644OrNotAtAll) {
  testing::TempDir temp;
  Json::Value value;
  const std::string path = temp.Write("state.json", "{\"old\":true}");
  ::chmod(path.c_str(), 0600);
  const mode_t old_mask = ::umask(077);
  value = Parse(R"({"share":[{"name":"photo","status":1}]})");
  const bool written = toFile(value, path);
  ::umask(old_mask);
  ASSERT_TRUE(written);
  Json::Value back;
  ASSERT_TRUE(fromFile(back, path));
  EXPECT_EQ(back, value);
  struct stat st;
  ASSERT_EQ(::stat(path.c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0644u);
  // A write that fails part-way must not leave a cut-off file behind.
  const std::string old_text = testing::ReadFileText(path);
  value["text"] = std::string(20000, 'n');
  bool big_written = true;
  {
    testing::ScopedRlimit full_disk(RLIMIT_FSIZE, 1024);
    ASSERT_TRUE(full_disk.ok());
    big_written = toFile(value, path);
  }
  EXPECT_FALSE(big_written) << "reported success past the size limit";
  EXPECT_EQ(testing::ReadFileText(path), old_text);
  EXPECT_EQ(std::distance(std::filesystem::directory_iterator(temp.path()), {}), 1)
      << "no temporary may be left behind";
}

// Both exported sets (orvex:: and fileindex::) must answer alike.
TEST(PathStringTest, BasenameDirnameAndExtension) {
  const std::vector<std::vector<std::string>> cases = {
      // path, basename, dirname, lower-case extension
      {"file", "file", "file", ""},  // no slash: the whole string for both
      {"/a.b/c.JPG", "c.JPG", "/a.b", "jpg"},
      {"/.bashrc", ".bashrc", "", "bashrc"},
  };
  for (const auto& c : cases) {
    const std::string expected = c[1] + "|" + c[2] + "|" + c[3];
    EXPECT_EQ(Basename(c[0]) + "|" + Dirname(c[0]) + "|" + GetFileExtension(c[0], true), expected);
    EXPECT_EQ(fileindex::Basename(c[0]) + "|" + fileindex::Dirname(c[0]) + "|" +
                  fileindex::GetFileExtension(c[0], true),
              expected);
  }
}

// Links are not followed for files; for directories only when asked, and a
// loop of links ends in a plain "no" instead of recursing without end.
TEST(FileTest, ExistenceOfFilesDirectoriesAndLinks) {
  testing::TempDir dir;
  const std::string file = dir.Write("file", "x");
  ASSERT_EQ(::mkdir(dir.Join("dir").c_str(), 0755), 0);
  ASSERT_EQ(::symlink(dir.Join("dir").c_str(), dir.Join("to_dir").c_str()), 0);
  ASSERT_EQ(::symlink(file.c_str(), dir.Join("to_file").c_str()), 0);
  ASSERT_EQ(::symlink(dir.Join("loop_b").c_str(), dir.Join("loop_a").c_str()), 0);
  ASSERT_EQ(::symlink(dir.Join("loop_a").c_str(), dir.Join("loop_b").c_str()), 0);
  EXPECT_TRUE(IsFileExist(file));
  EXPECT_FALSE(IsFileExist(dir.Join("to_file")));
  EXPECT_FALSE(IsFileExist(dir.Join("dir")));
  EXPECT_TRUE(IsDirExist(dir.Join("dir"), false));
  EXPECT_FALSE(IsDirExist(dir.Join("to_dir"), false));
  EXPECT_TRUE(IsDirExist(dir.Join("to_dir"), true));
  EXPECT_FALSE(IsDirExist(dir.Join("loop_a"), true));
  EXPECT_FALSE(IsDirExist(dir.Join("missing"), true));
}

}  // namespace
}  // namespace orvex
