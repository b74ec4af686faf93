// Error, the check-and-throw log convention, the JSON helpers and the path
// and file helpers.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <functional>
#include <iterator>
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

using testing::CheckLine;
using testing::WithoutLineNumber;

constexpr char kLogSource[] = "check_test";

Json::Value Parse(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

TEST(ErrorTest, MessageReasonAndCopies) {
  EXPECT_STREQ(Error(kErrorNoFolder).message(), "Orvex error, code=902");
  EXPECT_STREQ(Error(kErrorNoFolder).what(), "");
  EXPECT_STREQ(Error(kErrorBadArgument, "").message(), "Orvex error, code=120");  // no "[]"
  // A forwarded daemon code keeps its number.
  EXPECT_STREQ(Error(static_cast<ErrorCode>(1400), "busy").message(),
               "Orvex error, code=1400, reason=[busy]");
  const Error original(kErrorLockFile, "Exceed max retry");
  Error assigned(kErrorInternal);
  assigned = original;
  for (const Error& e : {Error(original), assigned}) {
    EXPECT_EQ(e.code(), kErrorLockFile);
    EXPECT_STREQ(e.message(), "Orvex error, code=506, reason=[Exceed max retry]");
    EXPECT_STREQ(static_cast<const std::runtime_error&>(e).what(), "Exceed max retry");
  }
}

TEST(CheckTest, FailedCheckLogsOneExactLineAndThrows) {
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
  try {  // errno is clear now: no "[err: ...]" suffix
    ORVEX_CHECK_AS(fd < 0, "folders_.size() > kFileIndexFoldersMax", kErrorTooManyFolders, "");
    ADD_FAILURE() << "no throw";
  } catch (const Error& e) {
    EXPECT_EQ(e.code(), kErrorTooManyFolders);
  }
  ASSERT_EQ(log.lines().size(), 2u);
  EXPECT_EQ(WithoutLineNumber(log.lines()[0]),
            CheckLine("check_test", "0 > (fd = ::open(\"/nonexistent/orvex/file\", O_RDONLY))",
                      "Failed to open queue, reason=No such file or directory") +
                " [err: No such file or directory]");
  EXPECT_EQ(WithoutLineNumber(log.lines()[1]),
            CheckLine("check_test", "folders_.size() > kFileIndexFoldersMax", ""));
}

TEST(CheckTest, PassingCheckNeitherLogsNorBuildsTheReason) {
  testing::LogCapture log;
  int reasons_built = 0;
  auto reason = [&reasons_built] { return std::to_string(++reasons_built); };
  errno = EAGAIN;
  EXPECT_NO_THROW(ORVEX_CHECK(1 < 0, kErrorSystem, reason()));
  EXPECT_EQ(reasons_built, 0);
  EXPECT_TRUE(log.lines().empty());
  EXPECT_EQ(errno, EAGAIN);
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
  EXPECT_EQ(log.lines(), (std::vector<std::string>{"src:7 plain line",
                                                   "src:8 with errno [err: Permission denied]",
                                                   "src:9 without errno", long_text}));
  EXPECT_EQ(fileindex::log_level, 7);
}

TEST(GetJsonValueTest, ReadsTypedValuesOrThrowsWithTheData) {
  const Json::Value obj = Parse(R"({"n":"abc","big":3000000000,"neg":-1,"real":1.5,"z":null})");
  const std::string data = ", data=" + toString(obj);
  int i = 42;
  unsigned int u = 0;
  long long ll = 0;
  std::string s = "keep";
  bool b = true;
  GetJsonValue(s, obj, "absent", false);
  GetJsonValue(i, obj, "absent", false);
  GetJsonValue(ll, obj, "big", true);
  EXPECT_EQ(std::make_tuple(s, i, ll), std::make_tuple("keep", 42, 3000000000LL));
  // A null member passes the convertibility tests and reads as empty.
  GetJsonValue(s, obj, "z", true);
  GetJsonValue(b, obj, "z", true);
  GetJsonValue(i, obj, "z", true);
  EXPECT_EQ(std::make_tuple(s, b, i), std::make_tuple("", false, 0));
  const std::vector<std::pair<std::function<void()>, std::string>> failures = {
      {[&] { GetJsonValue(i, obj, "n", true); }, "Not a string" + data},
      {[&] { GetJsonValue(i, obj, "big", true); }, "Not a string" + data},
      {[&] { GetJsonValue(u, obj, "neg", true); }, "Not a string" + data},
      {[&] { GetJsonValue(ll, obj, "real", true); }, "Not a string" + data},
      {[&] { GetJsonValue(ll, obj, "z", true); }, "Not a string" + data},  // exact integer test
      {[&] { GetJsonValue(s, obj, "missing", true); }, "Missing property: missing" + data},
      {[&] { GetJsonValue(s, Parse("[1]"), "n", false); }, "Not an object, data=[1]"},
      {[&] { GetJsonValue(s, Json::Value(), "n", false); }, "Not an object, data=null"},
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

TEST(JsonApplyChangesTest, NullDeletesObjectsMergeOthersReplace) {
  const std::vector<std::vector<std::string>> cases = {
      // target, changes, expected
      {R"({"a":1,"b":{"d":2}})", R"({"a":null,"b":{"c":1}})", R"({"b":{"c":1,"d":2}})"},
      {R"({"list":[2,3]})", R"({"list":[1]})", R"({"list":[1]})"},
      {R"({})", R"({"x":{"y":{"z":1}}})", R"({"x":{"y":{"z":1}}})"},
      {R"({"a":1})", R"({"gone":null})", R"({"a":1})"},
      {R"({"b":{"c":2}})", R"({"b":1})", R"({"b":1})"},
      {R"({"b":1})", R"({"b":{"c":2}})", R"({"b":{"c":2}})"},
  };
  for (const auto& c : cases) {
    Json::Value target = Parse(c[0]);
    JsonApplyChanges(target, Parse(c[1]));
    EXPECT_EQ(target, Parse(c[2])) << c[0] << " + " << c[1];
  }
}

TEST(JsonTextTest, ToStringIsOneParsableLineAndFromStringOneDocument) {
  Json::Value nested(Json::objectValue);
  nested["text"] = "line one\nline two\r\nthree\x0b\x1f end";
  nested["utf8"] = "caf\xC3\xA9 \xE2\x80\xA8";
  nested["deep"]["a"]["b"].append(Json::Value(Json::objectValue));
  const std::string text = toString(nested);
  EXPECT_EQ(text.find_first_of("\r\n"), std::string::npos) << text;
  EXPECT_EQ(Parse(text), nested);
  EXPECT_NE(text.find("caf\xC3\xA9"), std::string::npos) << "UTF-8 keeps its bytes";
  EXPECT_EQ(AppendData(nested), ", data=" + text);

  const std::vector<std::pair<std::string, bool>> cases = {
      {" {\"a\":[1,2,{\"b\":null}]} \n", true},
      {"\"s\"", true},
      {std::string(100, '[') + std::string(100, ']'), true},
      {"", false},
      {"{\"a\":}", false},
      {"{} x", false},
      {"{\"a\":1}\n{\"a\":2}", false},  // two queue lines are not one document
      // Deep nesting fails cleanly instead of overflowing the stack.
      {std::string(100000, '[') + std::string(100000, ']'), false},
  };
  for (const auto& [input, ok] : cases) {
    Json::Value value;
    EXPECT_EQ(fromString(value, input), ok) << "\"" << input.substr(0, 40) << "\"";
  }
  const std::string garbage = "{\"a\":1}garbage";
  Json::Value value;
  ASSERT_TRUE(fromString(value, garbage.data(), garbage.data() + 7));  // the range ends it
  EXPECT_EQ(value, Parse("{\"a\":1}"));
}

TEST(JsonFileTest, ToFileReplacesWholeWithMode0644OrNotAtAll) {
  testing::TempDir temp;
  Json::Value value;
  EXPECT_FALSE(fromFile(value, temp.Join("missing.json")));
  EXPECT_FALSE(fromFile(value, temp.path()));
  EXPECT_FALSE(fromFile(value, temp.Write("state.json", "")));
  const std::string path = temp.Write("state.json", std::string(5000, ' ') + "{\"old\":true}");
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

  const std::string old_text = testing::ReadFileText(path);
  EXPECT_FALSE(toFile(value, temp.Join("missing/dir/state.json")));
  EXPECT_FALSE(toFile(value, path + "/state.json"));  // parent is a file
  // A write that fails part-way: one that truncated the old file in place
  // would leave a cut-off file behind.
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
TEST(PathStringTest, BasenameDirnameExtensionAndPrefix) {
  const std::vector<std::vector<std::string>> cases = {
      // path, basename, dirname, lower-case extension
      {"file", "file", "file", ""},  // no slash: the whole string for both
      {"/share/", "", "/share", ""},
      {"/volume1/photo/a.JPG", "a.JPG", "/volume1/photo", "jpg"},
      {"/a.b/c", "c", "/a.b", ""},  // the dot of a directory does not count
      {"a//archive.tar.gz", "archive.tar.gz", "a/", "gz"},
      {"/.bashrc", ".bashrc", "", "bashrc"},
      {"name.", "name.", "name.", ""},
      {"/caf\xC3\x89.\xC3\x89X", "caf\xC3\x89.\xC3\x89X", "", "\xC3\x89x"},  // bytes only
  };
  for (const auto& c : cases) {
    const std::string expected = c[1] + "|" + c[2] + "|" + c[3];
    EXPECT_EQ(Basename(c[0]) + "|" + Dirname(c[0]) + "|" + GetFileExtension(c[0], true), expected);
    EXPECT_EQ(fileindex::Basename(c[0]) + "|" + fileindex::Dirname(c[0]) + "|" +
                  fileindex::GetFileExtension(c[0], true),
              expected);
  }
  EXPECT_EQ(GetFileExtension("/x/Photo.JPG", false), "JPG");
  EXPECT_TRUE(StringStartWith("/photo/2024", "/photo"));
  EXPECT_TRUE(fileindex::StringStartWith("/photo", "/photo"));
  EXPECT_FALSE(StringStartWith("/pho", "/photo"));
  EXPECT_FALSE(fileindex::StringStartWith("/Photo", "/photo"));
}

class FileTestsTest : public ::testing::Test {
 protected:
  FileTestsTest() {
    ::mkdir(dir_.c_str(), 0755);
    Link(file_, "link_to_file");
    Link(dir_, "link_to_dir");
    Link(temp_.Join("link_to_dir"), "link_to_link_to_dir");
    Link(temp_.Join("nowhere"), "dangling");
    Link(temp_.Join("loop"), "loop");
  }

  std::string Link(const std::string& target, const std::string& name) {
    const std::string path = temp_.Join(name);
    EXPECT_EQ(::symlink(target.c_str(), path.c_str()), 0) << path;
    return path;
  }

  testing::TempDir temp_;
  const std::string file_ = temp_.Write("file.txt", "x");
  const std::string dir_ = temp_.Join("dir");
};

TEST_F(FileTestsTest, IsFileExistAndIsDirExistOnFilesDirectoriesAndLinks) {
  const std::vector<std::tuple<std::string, bool, bool, bool>> cases = {
      // name, IsFileExist, IsDirExist, IsDirExist following links
      {"file.txt", true, false, false},
      {"dir", false, true, true},
      {"link_to_file", false, false, false},
      {"link_to_dir", false, false, true},
      {"link_to_link_to_dir", false, false, true},
      {"dangling", false, false, false},
      {"loop", false, false, false},  // ends, no crash
      {"missing", false, false, false},
  };
  for (const auto& [name, file, dir, dir_following_links] : cases) {
    const std::string path = temp_.Join(name);
    EXPECT_EQ(IsFileExist(path), file) << name;
    EXPECT_EQ(IsDirExist(path, /*follow_link=*/false), dir) << name;
    EXPECT_EQ(IsDirExist(path, /*follow_link=*/true), dir_following_links) << name;
  }
  // A relative link target is resolved against the working directory, not
  // the link's own: "sub" exists only beside the link, "cwd_only" only in
  // the working directory.
  std::filesystem::create_directories(temp_.Join("links/sub"));
  std::filesystem::create_directories(temp_.Join("cwd_only"));
  const std::string to_sub = Link("sub", "links/to_sub");
  const std::string to_cwd_only = Link("cwd_only", "links/to_cwd_only");
  const std::filesystem::path old_cwd = std::filesystem::current_path();
  std::filesystem::current_path(temp_.path());
  const bool sub_found = IsDirExist(to_sub, /*follow_link=*/true);
  const bool cwd_only_found = IsDirExist(to_cwd_only, /*follow_link=*/true);
  std::filesystem::current_path(old_cwd);
  EXPECT_FALSE(sub_found);
  EXPECT_TRUE(cwd_only_found);
}

TEST_F(FileTestsTest, DirentAclAndMountPointTests) {
  dirent entry{};
  entry.d_type = DT_DIR;
  EXPECT_TRUE(IsDirentDir(entry, file_));  // d_type decides, the path is not asked
  entry.d_type = DT_UNKNOWN;
  EXPECT_FALSE(IsDirentDir(entry, dir_));  // deliberately not a directory
  entry.d_type = DT_LNK;
  EXPECT_FALSE(IsDirentDir(entry, dir_));

  // Modes chosen so that root and the owner get the same answers.
  ASSERT_EQ(::chmod(file_.c_str(), 0600), 0);
  EXPECT_TRUE(CheckACLPerm(file_, 2));
  EXPECT_FALSE(CheckACLPerm(file_, 1));
  EXPECT_TRUE(CheckACLPerm(file_, 1 | 4));  // any of the bits
  EXPECT_FALSE(CheckACLPerm(file_, 0));
  EXPECT_TRUE(CheckACLPerm(temp_.Join("link_to_file"), 4));  // links followed
  EXPECT_FALSE(CheckACLPerm(temp_.Join("dangling"), 7));

  EXPECT_TRUE(IsMountPoint("/"));
  EXPECT_FALSE(IsMountPoint(dir_));
  EXPECT_FALSE(IsMountPoint(file_));
  EXPECT_FALSE(IsMountPoint(temp_.Join("missing")));
}

}  // namespace
}  // namespace orvex
