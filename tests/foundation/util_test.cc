#include "orvex/foundation/util.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <string>
#include <vector>

#include "support/temp_dir.h"

namespace orvex {
namespace {

// Both exported sets must answer alike; every table row checks the two.
struct PathCase {
  std::string path;
  std::string basename;
  std::string dirname;
};

TEST(PathStringTest, BasenameAndDirname) {
  const std::vector<PathCase> cases = {
      {"file", "file", "file"},  // no slash: the whole string for both
      {"/share", "share", ""},
      {"/share/", "", "/share"},
      {"/volume1/photo/2024/a.jpg", "a.jpg", "/volume1/photo/2024"},
      {"/", "", ""},
      {"", "", ""},
      {"a//b", "b", "a/"},
      {"dir/", "", "dir"},
  };
  for (const PathCase& c : cases) {
    EXPECT_EQ(Basename(c.path), c.basename) << "Basename(\"" << c.path << "\")";
    EXPECT_EQ(Dirname(c.path), c.dirname) << "Dirname(\"" << c.path << "\")";
    EXPECT_EQ(fileindex::Basename(c.path), c.basename)
        << "fileindex::Basename(\"" << c.path << "\")";
    EXPECT_EQ(fileindex::Dirname(c.path), c.dirname) << "fileindex::Dirname(\"" << c.path << "\")";
  }
}

TEST(PathStringTest, GetFileExtension) {
  struct Case {
    std::string path;
    bool lower;
    std::string extension;
  };
  const std::vector<Case> cases = {
      {"/x/Photo.JPG", true, "jpg"},
      {"/x/Photo.JPG", false, "JPG"},
      {"/a.b/c", true, ""},  // the dot of a directory does not count
      {"archive.tar.gz", false, "gz"},
      {".bashrc", false, "bashrc"},
      {"name.", true, ""},
      {"noext", true, ""},
      {"/dir/", true, ""},
      {"/x/MiXeD.TxT", true, "txt"},
      {"/x/caf\xC3\x89.\xC3\x89X", true, "\xC3\x89x"},  // bytes, not characters
  };
  for (const Case& c : cases) {
    EXPECT_EQ(GetFileExtension(c.path, c.lower), c.extension) << c.path << " lower=" << c.lower;
    EXPECT_EQ(fileindex::GetFileExtension(c.path, c.lower), c.extension)
        << c.path << " lower=" << c.lower;
  }
}

TEST(PathStringTest, StringStartWith) {
  struct Case {
    std::string s;
    std::string prefix;
    bool expected;
  };
  const std::vector<Case> cases = {
      {"/photo/2024", "/photo", true},
      {"/photo", "/photo", true},
      {"/pho", "/photo", false},
      {"x/photo", "/photo", false},
      {"", "", true},
      {"abc", "", true},
      {"", "a", false},
      {"/Photo", "/photo", false},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(StringStartWith(c.s, c.prefix), c.expected) << c.s << " / " << c.prefix;
    EXPECT_EQ(fileindex::StringStartWith(c.s, c.prefix), c.expected) << c.s << " / " << c.prefix;
  }
}

class FileTestsTest : public ::testing::Test {
 protected:
  FileTestsTest() {
    file_ = temp_.Write("file.txt", "x");
    dir_ = temp_.Join("dir");
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
  std::string file_;
  std::string dir_;
};

TEST_F(FileTestsTest, IsFileExistDoesNotFollowLinks) {
  EXPECT_TRUE(IsFileExist(file_));
  EXPECT_FALSE(IsFileExist(temp_.Join("link_to_file")));
  EXPECT_FALSE(IsFileExist(dir_));
  EXPECT_FALSE(IsFileExist(temp_.Join("missing")));
  EXPECT_FALSE(IsFileExist(""));
}

TEST_F(FileTestsTest, IsDirExistFollowsLinksOnlyWhenAsked) {
  EXPECT_TRUE(IsDirExist(dir_, /*follow_link=*/false));
  EXPECT_TRUE(IsDirExist(dir_, /*follow_link=*/true));
  EXPECT_FALSE(IsDirExist(temp_.Join("link_to_dir"), /*follow_link=*/false));
  EXPECT_TRUE(IsDirExist(temp_.Join("link_to_dir"), /*follow_link=*/true));
  EXPECT_TRUE(IsDirExist(temp_.Join("link_to_link_to_dir"), /*follow_link=*/true));
  EXPECT_FALSE(IsDirExist(temp_.Join("link_to_file"), /*follow_link=*/true));
  EXPECT_FALSE(IsDirExist(file_, /*follow_link=*/true));
  EXPECT_FALSE(IsDirExist(temp_.Join("dangling"), /*follow_link=*/true));
  EXPECT_FALSE(IsDirExist(temp_.Join("loop"), /*follow_link=*/true));  // ends, no crash
  EXPECT_FALSE(IsDirExist(temp_.Join("missing"), /*follow_link=*/true));
}

TEST_F(FileTestsTest, IsDirExistResolvesRelativeTargetsAgainstTheWorkingDirectory) {
  // "sub" exists beside the link but not in the working directory, and the
  // other way round for "cwd_only".
  ::mkdir(temp_.Join("links").c_str(), 0755);
  ::mkdir(temp_.Join("links/sub").c_str(), 0755);
  ::mkdir(temp_.Join("cwd_only").c_str(), 0755);
  const std::string to_sub = Link("sub", "links/to_sub");
  const std::string to_cwd_only = Link("cwd_only", "links/to_cwd_only");

  char old_cwd[4096];
  ASSERT_NE(::getcwd(old_cwd, sizeof(old_cwd)), nullptr);
  ASSERT_EQ(::chdir(temp_.path().c_str()), 0);
  const bool sub_found = IsDirExist(to_sub, /*follow_link=*/true);
  const bool cwd_only_found = IsDirExist(to_cwd_only, /*follow_link=*/true);
  ASSERT_EQ(::chdir(old_cwd), 0);

  EXPECT_FALSE(sub_found);
  EXPECT_TRUE(cwd_only_found);
}

TEST_F(FileTestsTest, IsDirentDirTrustsDtypeAndCountsUnknownAsNotADirectory) {
  dirent entry;
  std::memset(&entry, 0, sizeof(entry));
  entry.d_type = DT_DIR;
  EXPECT_TRUE(IsDirentDir(entry, file_));  // d_type decides, the path is not asked
  for (unsigned char type : {DT_REG, DT_LNK, DT_FIFO, DT_SOCK, DT_CHR, DT_BLK}) {
    entry.d_type = type;
    EXPECT_FALSE(IsDirentDir(entry, dir_)) << static_cast<int>(type);
  }
  entry.d_type = DT_UNKNOWN;
  EXPECT_FALSE(IsDirentDir(entry, dir_));
  EXPECT_FALSE(IsDirentDir(entry, temp_.Join("missing")));
}

TEST_F(FileTestsTest, CheckACLPermAnswersAnyGrantedBit) {
  // Modes chosen so that root and the owner get the same answers.
  ASSERT_EQ(::chmod(file_.c_str(), 0600), 0);
  EXPECT_TRUE(CheckACLPerm(file_, 4));
  EXPECT_TRUE(CheckACLPerm(file_, 2));
  EXPECT_FALSE(CheckACLPerm(file_, 1));
  EXPECT_TRUE(CheckACLPerm(file_, 1 | 4));  // any of the bits
  EXPECT_FALSE(CheckACLPerm(file_, 0));
  ASSERT_EQ(::chmod(file_.c_str(), 0700), 0);
  EXPECT_TRUE(CheckACLPerm(file_, 1));
  EXPECT_TRUE(CheckACLPerm(temp_.Join("link_to_file"), 1));  // links followed
  EXPECT_TRUE(CheckACLPerm(dir_, 1));
  EXPECT_FALSE(CheckACLPerm(temp_.Join("missing"), 7));
  EXPECT_FALSE(CheckACLPerm(temp_.Join("dangling"), 7));
  EXPECT_FALSE(CheckACLPerm("", 7));
}

TEST_F(FileTestsTest, IsMountPoint) {
  EXPECT_TRUE(IsMountPoint("/"));
  struct stat proc_self;
  if (::stat("/proc/self", &proc_self) == 0) {
    EXPECT_TRUE(IsMountPoint("/proc"));  // procfs is mounted there when it exists
  }
  EXPECT_FALSE(IsMountPoint(dir_));
  EXPECT_FALSE(IsMountPoint(temp_.path()));
  EXPECT_FALSE(IsMountPoint(file_));
  EXPECT_FALSE(IsMountPoint(temp_.Join("missing")));
  EXPECT_FALSE(IsMountPoint(""));
}

}  // namespace
}  // namespace orvex
