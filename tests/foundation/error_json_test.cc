// Error, the check-and-throw log convention and the JSON helpers.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <set>
#include <string>
#include <vector>

#include "foundation/check.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/log.h"
#include "support/log_capture.h"
#include "support/temp_dir.h"

namespace orvex {
namespace {

constexpr char kLogSource[] = "check_test";

Json::Value Parse(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

std::string Prefix() {
  return " (" + std::to_string(::getpid()) + ", " + std::to_string(::geteuid()) + ") ";
}

// Everything after "<source>:<line>" of a log line, or "" when the line does
// not start that way: line numbers are free, the rest is exact.
std::string AfterSourceLine(const std::string& line, const std::string& source) {
  if (line.compare(0, source.size() + 1, source + ":") != 0) return "";
  size_t i = source.size() + 1;
  const size_t digits = i;
  while (i < line.size() && isdigit(static_cast<unsigned char>(line[i]))) ++i;
  return i == digits ? "" : line.substr(i);
}

TEST(ErrorTest, MessageAndReason) {
  Error bare(kErrorNoFolder);
  EXPECT_EQ(bare.code(), kErrorNoFolder);
  EXPECT_STREQ(bare.what(), "");
  EXPECT_STREQ(bare.message(), "Orvex error, code=902");

  Error with_reason(kErrorLockFile, "Exceed max retry");
  EXPECT_STREQ(with_reason.what(), "Exceed max retry");
  EXPECT_STREQ(with_reason.message(), "Orvex error, code=506, reason=[Exceed max retry]");

  Error empty_reason(kErrorBadArgument, "");
  EXPECT_STREQ(empty_reason.message(), "Orvex error, code=120");  // no "[]"

  // A forwarded daemon code keeps its number.
  Error forwarded(static_cast<ErrorCode>(1400), "busy");
  EXPECT_EQ(static_cast<int>(forwarded.code()), 1400);
  EXPECT_STREQ(forwarded.message(), "Orvex error, code=1400, reason=[busy]");
}

TEST(ErrorTest, CopiesKeepCodeReasonAndMessage) {
  const Error original(kErrorNoSpace, "Share (photo) space not enough");
  Error copy(original);
  EXPECT_EQ(copy.code(), kErrorNoSpace);
  EXPECT_EQ(copy.reason(), original.reason());
  EXPECT_STREQ(copy.message(), original.message());
  Error assigned(kErrorInternal);
  assigned = original;
  EXPECT_EQ(assigned.code(), kErrorNoSpace);
  EXPECT_STREQ(assigned.what(), "Share (photo) space not enough");
  EXPECT_STREQ(assigned.message(), original.message());
}

TEST(ErrorTest, WhatThroughTheStandardBaseIsTheReason) {
  try {
    throw Error(kErrorFolderExists, "Duplicated ID: /photo");
  } catch (const std::runtime_error& e) {
    EXPECT_STREQ(e.what(), "Duplicated ID: /photo");
  }
}

TEST(CheckTest, FailedCheckWithErrnoLogsSuffixThrowsAndClearsErrno) {
  testing::LogCapture log;
  int fd = -1;
  try {
    ORVEX_CHECK(0 > (fd = ::open("/nonexistent/orvex/file", O_RDONLY)), kErrorSystem,
                "Failed to open queue, reason=" + std::string(std::strerror(errno)));
    ADD_FAILURE() << "no throw";
  } catch (const Error& e) {
    EXPECT_EQ(errno, 0);
    EXPECT_EQ(e.code(), kErrorSystem);
    EXPECT_EQ(e.reason(), "Failed to open queue, reason=No such file or directory");
  }
  ASSERT_EQ(log.lines().size(), 1u);
  EXPECT_EQ(AfterSourceLine(log.lines()[0], "check_test"),
            Prefix() +
                "Failed [0 > (fd = ::open(\"/nonexistent/orvex/file\", O_RDONLY))], reason: "
                "Failed to open queue, reason=No such file or directory "
                "[err: No such file or directory]")
      << log.lines()[0];
}

TEST(CheckTest, FailedCheckWithoutErrnoHasNoSuffix) {
  testing::LogCapture log;
  errno = 0;
  const size_t folders = 1001;
  try {
    ORVEX_CHECK_AS(folders > 1000, "folders_.size() > kFileIndexFoldersMax", kErrorTooManyFolders,
                   "");
    ADD_FAILURE() << "no throw";
  } catch (const Error& e) {
    EXPECT_EQ(e.code(), kErrorTooManyFolders);
    EXPECT_STREQ(e.what(), "");
  }
  ASSERT_EQ(log.lines().size(), 1u);
  EXPECT_EQ(AfterSourceLine(log.lines()[0], "check_test"),
            Prefix() + "Failed [folders_.size() > kFileIndexFoldersMax], reason: ")
      << log.lines()[0];
}

TEST(CheckTest, PassingCheckNeitherLogsNorBuildsTheReason) {
  testing::LogCapture log;
  int reasons_built = 0;
  auto reason = [&reasons_built] {
    ++reasons_built;
    return std::string("unused");
  };
  errno = EAGAIN;
  EXPECT_NO_THROW(ORVEX_CHECK(1 < 0, kErrorSystem, reason()));
  EXPECT_EQ(reasons_built, 0);
  EXPECT_TRUE(log.lines().empty());
  EXPECT_EQ(errno, EAGAIN);  // untouched when nothing failed
}

TEST(LogTest, PlainKeepsErrnoAndErrnoLineAppendsAndClearsIt) {
  testing::LogCapture log;
  errno = EACCES;
  LogPlain("%s:%d plain %s", "src", 7, "line");
  EXPECT_EQ(errno, EACCES);
  LogErrno("%s:%d with errno", "src", 8);
  EXPECT_EQ(errno, 0);
  LogErrno("%s:%d without errno", "src", 9);
  const std::string long_text(3000, 'x');  // past any fixed formatting buffer
  LogPlain("%s", long_text.c_str());
  ASSERT_EQ(log.lines().size(), 4u);
  EXPECT_EQ(log.lines()[0], "src:7 plain line");
  EXPECT_EQ(log.lines()[1], "src:8 with errno [err: Permission denied]");
  EXPECT_EQ(log.lines()[2], "src:9 without errno");
  EXPECT_EQ(log.lines()[3], long_text);
  EXPECT_EQ(fileindex::log_level, 7);
}

TEST(GetJsonValueTest, WrongTypeMissingAndNotAnObject) {
  const Json::Value obj = Parse(R"({"n":"abc","big":3000000000,"neg":-1,"real":1.5})");
  const std::string data = ", data=" + toString(obj);
  struct Case {
    std::function<void()> read;
    std::string reason;
  };
  int i = 0;
  unsigned int u = 0;
  long long ll = 0;
  std::string s;
  const std::vector<Case> cases = {
      {[&] { GetJsonValue(i, obj, "n", true); }, "Not a string" + data},
      {[&] { GetJsonValue(i, obj, "big", true); }, "Not a string" + data},
      {[&] { GetJsonValue(u, obj, "neg", true); }, "Not a string" + data},
      {[&] { GetJsonValue(ll, obj, "real", true); }, "Not a string" + data},
      {[&] { GetJsonValue(ll, obj, "n", true); }, "Not a string" + data},
      {[&] { GetJsonValue(s, obj, "missing", true); }, "Missing property: missing" + data},
      {[&] { GetJsonValue(s, Parse("[1]"), "n", false); }, "Not an object, data=[1]"},
      {[&] { GetJsonValue(s, Json::Value(), "n", false); }, "Not an object, data=null"},
  };
  for (size_t k = 0; k < cases.size(); ++k) {
    try {
      cases[k].read();
      ADD_FAILURE() << "case " << k << " did not throw";
    } catch (const Error& e) {
      EXPECT_EQ(e.code(), kErrorBadArgument) << k;
      EXPECT_EQ(e.reason(), cases[k].reason) << k;
    }
  }
}

TEST(GetJsonValueTest, ReadsValuesAndKeepsOutForMissingOptional) {
  const Json::Value obj =
      Parse(R"({"s":"x","b":true,"i":-7,"u":7,"ll":5000000000,"d":2.5,"o":{"k":[1]},"z":null})");
  std::string s = "keep";
  int i = 42;
  GetJsonValue(s, obj, "absent", false);
  GetJsonValue(i, obj, "absent", false);
  EXPECT_EQ(s, "keep");
  EXPECT_EQ(i, 42);

  bool b = false;
  unsigned int u = 0;
  long long ll = 0;
  double d = 0;
  Json::Value o;
  GetJsonValue(s, obj, "s", true);
  GetJsonValue(b, obj, "b", true);
  GetJsonValue(i, obj, "i", true);
  GetJsonValue(u, obj, "u", true);
  GetJsonValue(ll, obj, "ll", true);
  GetJsonValue(d, obj, "d", true);
  GetJsonValue(o, obj, "o", true);
  EXPECT_EQ(s, "x");
  EXPECT_TRUE(b);
  EXPECT_EQ(i, -7);
  EXPECT_EQ(u, 7u);
  EXPECT_EQ(ll, 5000000000LL);
  EXPECT_EQ(d, 2.5);
  EXPECT_EQ(o, Parse(R"({"k":[1]})"));

  // A null member passes the convertibility tests and reads as empty.
  s = "x";
  b = true;
  i = 1;
  GetJsonValue(s, obj, "z", true);
  GetJsonValue(b, obj, "z", true);
  GetJsonValue(i, obj, "z", true);
  EXPECT_EQ(s, "");
  EXPECT_FALSE(b);
  EXPECT_EQ(i, 0);
  EXPECT_THROW(GetJsonValue(ll, obj, "z", true), Error);  // exact integer test
}

TEST(JsonApplyChangesTest, NullDeletesObjectsMergeOthersReplace) {
  struct Case {
    std::string target;
    std::string changes;
    std::string expected;
  };
  const std::vector<Case> cases = {
      {R"({"a":1,"b":{"d":2}})", R"({"a":null,"b":{"c":1}})", R"({"b":{"c":1,"d":2}})"},
      {R"({"list":[2,3]})", R"({"list":[1]})", R"({"list":[1]})"},
      {R"({})", R"({"x":{"y":{"z":1}}})", R"({"x":{"y":{"z":1}}})"},
      {R"({"a":1})", R"({"gone":null})", R"({"a":1})"},
      {R"({"b":{"c":2}})", R"({"b":1})", R"({"b":1})"},
      {R"({"a":1})", R"({})", R"({"a":1})"},
  };
  for (const Case& c : cases) {
    Json::Value target = Parse(c.target);
    JsonApplyChanges(target, Parse(c.changes));
    EXPECT_EQ(target, Parse(c.expected)) << c.target << " + " << c.changes;
  }
}

TEST(JsonTextTest, AppendDataIsTheOneLineText) {
  const Json::Value obj = Parse(R"({"path":"/photo/a b","n":[1,2]})");
  const std::string data = AppendData(obj);
  ASSERT_EQ(data.rfind(", data=", 0), 0u);
  EXPECT_EQ(data.substr(7), toString(obj));
  EXPECT_EQ(Parse(data.substr(7)), obj);
}

TEST(JsonTextTest, ToStringIsAlwaysOneParsableLine) {
  Json::Value nested(Json::objectValue);
  nested["text"] = "line one\nline two\r\nthree\x0b\x0c\x1f end";
  nested["utf8"] = "caf\xC3\xA9 \xE2\x80\xA8";
  for (int k = 0; k < 200; ++k) nested["list"].append(k);
  nested["deep"]["a"]["b"]["c"] = Json::Value(Json::arrayValue);
  nested["deep"]["a"]["b"]["c"].append(Json::Value(Json::objectValue));
  const std::vector<Json::Value> values = {nested, Json::Value("\n"), Json::Value(),
                                           Json::Value(Json::arrayValue)};
  for (const Json::Value& value : values) {
    const std::string text = toString(value);
    EXPECT_EQ(text.find('\n'), std::string::npos) << text;
    EXPECT_EQ(text.find('\r'), std::string::npos) << text;
    Json::Value back;
    ASSERT_TRUE(fromString(back, text)) << text;
    EXPECT_EQ(back, value);
  }
  // UTF-8 text keeps its bytes rather than being escaped.
  EXPECT_NE(toString(nested).find("caf\xC3\xA9"), std::string::npos);
}

TEST(JsonTextTest, FromStringAcceptsExactlyOneDocument) {
  struct Case {
    std::string text;
    bool ok;
  };
  const std::vector<Case> cases = {
      {"{}", true},
      {" {\"a\":[1,2,{\"b\":null}]} \n", true},
      {"[1]", true},
      {"\"s\"", true},
      {std::string(100, '[') + std::string(100, ']'), true},
      {"", false},
      {"   ", false},
      {"{", false},
      {"{\"a\":}", false},
      {"{} x", false},
      {"{}{}", false},
      {"[1] [2]", false},
      {"{\"a\":1}\n{\"a\":2}", false},  // two queue lines are not one document
  };
  for (const Case& c : cases) {
    Json::Value value;
    EXPECT_EQ(fromString(value, c.text), c.ok) << "\"" << c.text << "\"";
  }
}

TEST(JsonTextTest, FromStringRejectsDeepNestingWithoutCrashing) {
  Json::Value value;
  EXPECT_FALSE(fromString(value, std::string(200000, '[')));
  EXPECT_FALSE(fromString(value, std::string(100000, '[') + std::string(100000, ']')));
  std::string objects;
  for (int k = 0; k < 100000; ++k) objects += "{\"a\":";
  EXPECT_FALSE(fromString(value, objects));
}

TEST(JsonTextTest, FromStringRangeStopsAtEnd) {
  const std::string text = "{\"a\":1}garbage";
  Json::Value value;
  ASSERT_TRUE(fromString(value, text.data(), text.data() + 7));
  EXPECT_EQ(value, Parse("{\"a\":1}"));
  EXPECT_FALSE(fromString(value, text.data(), text.data() + text.size()));
}

class JsonFileTest : public ::testing::Test {
 protected:
  std::set<std::string> Entries() const {
    std::set<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(temp_.path())) {
      names.insert(entry.path().filename().string());
    }
    return names;
  }
  std::string Read(const std::string& path) const {
    std::string text;
    FILE* f = std::fopen(path.c_str(), "rb");
    if (f == nullptr) return "(unreadable)";
    char buf[4096];
    size_t n;
    while ((n = std::fread(buf, 1, sizeof(buf), f)) > 0) text.append(buf, n);
    std::fclose(f);
    return text;
  }

  testing::TempDir temp_;
};

TEST_F(JsonFileTest, FromFileFailsOnMissingDirectoryEmptyAndInvalid) {
  Json::Value value;
  EXPECT_FALSE(fromFile(value, temp_.Join("missing.json")));
  EXPECT_FALSE(fromFile(value, temp_.path()));
  EXPECT_FALSE(fromFile(value, temp_.Write("empty.json", "")));
  EXPECT_FALSE(fromFile(value, temp_.Write("bad.json", "{\"a\":")));
  ASSERT_TRUE(fromFile(value, temp_.Write("good.json", "[{\"a\":1}]\n")));
  EXPECT_EQ(value, Parse("[{\"a\":1}]"));
}

TEST_F(JsonFileTest, ToFileReplacesWholeWithMode0644) {
  const std::string path = temp_.Write("state.json", std::string(5000, ' ') + "{\"old\":true}");
  ::chmod(path.c_str(), 0600);
  const mode_t old_mask = ::umask(077);
  const Json::Value value = Parse(R"({"share":[{"name":"photo","status":1}]})");
  const bool written = toFile(value, path);
  ::umask(old_mask);
  ASSERT_TRUE(written);
  Json::Value back;
  ASSERT_TRUE(fromFile(back, path));
  EXPECT_EQ(back, value);
  struct stat st;
  ASSERT_EQ(::stat(path.c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0644u);
  EXPECT_EQ(Entries(), std::set<std::string>{"state.json"});  // no temporary left
}

TEST_F(JsonFileTest, ToFileFailsWhereThePathCannotBeWritten) {
  const std::string file = temp_.Write("plain", "x");
  EXPECT_FALSE(toFile(Parse("{}"), temp_.Join("missing/dir/state.json")));
  EXPECT_FALSE(toFile(Parse("{}"), file + "/state.json"));  // parent is a file
  EXPECT_EQ(Read(file), "x");
  EXPECT_EQ(Entries(), std::set<std::string>{"plain"});
}

TEST_F(JsonFileTest, FailedToFileLeavesTheOldContentIntact) {
  // A file-size limit makes the write fail part-way even for root: a writer
  // that truncated the old file in place would leave a cut-off file behind.
  const std::string old_text = "{\"old\":true}\n";
  const std::string path = temp_.Write("state.json", old_text);
  Json::Value big(Json::objectValue);
  big["text"] = std::string(20000, 'n');
  const pid_t child = ::fork();
  ASSERT_GE(child, 0);
  if (child == 0) {
    ::signal(SIGXFSZ, SIG_IGN);
    struct rlimit limit;
    ::getrlimit(RLIMIT_FSIZE, &limit);
    limit.rlim_cur = 1024;
    ::setrlimit(RLIMIT_FSIZE, &limit);
    ::_exit(toFile(big, path) ? 1 : 0);
  }
  int status = 0;
  ASSERT_EQ(::waitpid(child, &status, 0), child);
  ASSERT_TRUE(WIFEXITED(status));
  EXPECT_EQ(WEXITSTATUS(status), 0) << "toFile reported success past the size limit";
  EXPECT_EQ(Read(path), old_text);
  EXPECT_EQ(Entries(), std::set<std::string>{"state.json"});
}

}  // namespace
}  // namespace orvex
