#include "orvex/portable/share_registry.h"

#include <sys/stat.h>

#include <stdexcept>
#include <string>
#include <vector>

#include "kalo_test_root.h"

namespace orvex {
namespace portable {
namespace {

class ShareRegistryTest : public TempRootTest {
 protected:
  static ShareRecord Share(const std::string& name, const std::string& path) {
    ShareRecord share;
    share.name = name;
    share.path = path;
    return share;
  }

  std::vector<std::string> Names() const {
    std::vector<std::string> names;
    for (const ShareRecord& share : LoadShares()) names.push_back(share.name);
    return names;
  }

  std::string RegistryFile() const { return root_ + "/etc/orvex/shares.json"; }
};

TEST_F(ShareRegistryTest, RoundTripKeepsEveryFieldAndTheOrder) {
  ShareRecord photo = Share("photo", "/srv/data/photo");
  photo.encryption = true;
  photo.encrypted = true;
  photo.readonly = true;
  photo.recycle_bin = true;
  photo.hide_unreadable = true;
  photo.ftp_privilege = 7;
  photo.privileges = {{"alice", "rw"}, {"bob", "ro"}, {"eve", "na"}};
  AddShare(photo);
  AddShare(Share("ph", "/srv/data/ph"));
  AddShare(Share("my share", "/srv/data/my share"));
  AddShare(Share("фото", "/srv/данные/фото"));

  EXPECT_EQ(Names(), (std::vector<std::string>{"photo", "ph", "my share", "фото"}));
  ShareRecord read;
  ASSERT_TRUE(FindShare("photo", read));
  EXPECT_EQ(read.path, "/srv/data/photo");
  EXPECT_TRUE(read.encryption && read.encrypted && read.readonly && read.recycle_bin &&
              read.hide_unreadable);
  EXPECT_EQ(read.ftp_privilege, 7);
  EXPECT_EQ(read.privileges, photo.privileges);

  ASSERT_TRUE(FindShare("ph", read));
  EXPECT_EQ(read.path, "/srv/data/ph");
  EXPECT_FALSE(read.encryption || read.encrypted || read.readonly || read.recycle_bin ||
               read.hide_unreadable);
  EXPECT_TRUE(read.privileges.empty());
  ASSERT_TRUE(FindShare("фото", read));
  EXPECT_EQ(read.path, "/srv/данные/фото");
  EXPECT_FALSE(FindShare("Photo", read)) << "names are exact case";
  EXPECT_FALSE(FindShare("phot", read));

  struct stat st;
  ASSERT_EQ(::stat(RegistryFile().c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0644u);
  EXPECT_NE(ReadText(RegistryFile()).find("\"фото\""), std::string::npos)
      << "non-ASCII names are written as UTF-8 text";
}

TEST_F(ShareRegistryTest, MissingRegistryMeansNoShares) {
  EXPECT_TRUE(LoadShares().empty());
  ShareRecord read;
  EXPECT_FALSE(FindShare("photo", read));
  EXPECT_FALSE(RemoveShare("photo"));
  EXPECT_FALSE(std::filesystem::exists(RegistryFile())) << "a no-op remove writes nothing";
}

TEST_F(ShareRegistryTest, HandWrittenRegistryTakesDefaults) {
  WriteRegistry(R"([{"name": "music", "path": "/volume1/music/"}])");
  ShareRecord read;
  ASSERT_TRUE(FindShare("music", read));
  EXPECT_EQ(read.path, "/volume1/music") << "trailing slash dropped";
  EXPECT_FALSE(read.readonly);
  EXPECT_EQ(read.ftp_privilege, 0);
}

TEST_F(ShareRegistryTest, MalformedRegistryNamesTheFileAndTheProblem) {
  struct Case {
    const char* text;
    const char* problem;
  };
  const Case cases[] = {
      {"", "not valid JSON"},
      {"[{\"name\": \"a\", \"path\": \"/a\"}", "not valid JSON"},
      {"{\"name\": \"a\", \"path\": \"/a\"}", "not a JSON array"},
      {"[{\"name\": \"a\", \"name\": \"b\", \"path\": \"/a\"}]", "not valid JSON"},
      {"[\"a\"]", "share [0]: is not an object"},
      {"[{\"path\": \"/a\"}]", "share [0]: key \"name\" is missing"},
      {"[{\"name\": \"a\"}]", "share [0]: key \"path\" is missing"},
      {"[{\"name\": \"a\", \"path\": \"/a\"}, {\"name\": 3, \"path\": \"/b\"}]",
       "share [1]: key \"name\" is not a string"},
      {"[{\"name\": \"a\", \"path\": \"a\"}]", "is not absolute"},
      {"[{\"name\": \"a\", \"path\": \"/a/../b\"}]", "\"..\" component"},
      {"[{\"name\": \"\", \"path\": \"/a\"}]", "the name is empty"},
      {"[{\"name\": \"a\", \"path\": \"/a\", \"readonly\": \"yes\"}]",
       "key \"readonly\" is not a boolean"},
      {"[{\"name\": \"a\", \"path\": \"/a\", \"ftp_privilege\": 1.5}]",
       "key \"ftp_privilege\" is not an integer"},
      {"[{\"name\": \"a\", \"path\": \"/a\", \"privileges\": {\"bob\": \"rx\"}}]",
       "privilege of \"bob\" is \"rx\""},
      {"[{\"name\": \"a\", \"path\": \"/a\", \"read_only\": true}]", "unknown key \"read_only\""},
      {"[{\"name\": \"a\", \"path\": \"/a\"}, {\"name\": \"a\", \"path\": \"/b\"}]",
       "share [1]: duplicate name \"a\""},
  };
  for (const Case& c : cases) {
    WriteRegistry(c.text);
    try {
      LoadShares();
      ADD_FAILURE() << "accepted: " << c.text;
    } catch (const std::runtime_error& e) {
      const std::string what = e.what();
      EXPECT_EQ(what.rfind(RegistryFile() + ": ", 0), 0u) << what;
      EXPECT_NE(what.find(c.problem), std::string::npos) << c.text << " gave: " << what;
    }
  }
}

TEST_F(ShareRegistryTest, UnreadableRegistryIsAFailureNotAnEmptyList) {
  std::filesystem::create_directories(RegistryFile());  // a directory in its place
  EXPECT_THROW(LoadShares(), std::runtime_error);
}

TEST_F(ShareRegistryTest, AddRefusesBadRecordsAndWritesNothing) {
  struct Case {
    ShareRecord share;
    const char* problem;
  };
  ShareRecord bad_priv = Share("a", "/a");
  bad_priv.privileges["bob"] = "RW";
  const Case cases[] = {
      {Share("", "/a"), "name is empty"},
      {Share("a/b", "/a"), "contains \"/\""},
      {Share(std::string(256, 'n'), "/a"), "longer than 255"},
      {Share("a", ""), "path is empty"},
      {Share("a", "srv/a"), "not absolute"},
      {Share("a", "/"), "root directory"},
      {Share("a", "///"), "root directory"},
      {Share("a", "/srv/../etc"), "component"},
      {Share("a", "/srv/./a"), "component"},
      {Share("a", "/srv//a"), "component"},
      {Share("a", "/" + std::string(4095, 'p')), "longer than 4095"},
      {bad_priv, "\"RW\""},
  };
  for (const Case& c : cases) {
    try {
      AddShare(c.share);
      ADD_FAILURE() << "accepted name [" << c.share.name << "] path [" << c.share.path << "]";
    } catch (const std::invalid_argument& e) {
      EXPECT_NE(std::string(e.what()).find(c.problem), std::string::npos)
          << c.share.path << " gave: " << e.what();
    }
  }
  EXPECT_FALSE(std::filesystem::exists(RegistryFile()));
}

TEST_F(ShareRegistryTest, AddRefusesADuplicateNameButNotAPrefix) {
  AddShare(Share("photo", "/srv/photo"));
  EXPECT_THROW(AddShare(Share("photo", "/srv/other")), std::invalid_argument);
  AddShare(Share("photo2", "/srv/photo2"));
  AddShare(Share("Photo", "/srv/Photo"));
  EXPECT_EQ(Names(), (std::vector<std::string>{"photo", "photo2", "Photo"}));
}

TEST_F(ShareRegistryTest, AddLeavesAMalformedRegistryAlone) {
  const std::string text = "[{\"name\": \"a\"}]";
  WriteRegistry(text);
  EXPECT_THROW(AddShare(Share("b", "/b")), std::runtime_error);
  EXPECT_EQ(ReadText(RegistryFile()), text);
}

TEST_F(ShareRegistryTest, UpdateKeepsThePlaceAndRemoveTakesOnlyTheName) {
  AddShare(Share("ph", "/srv/ph"));
  AddShare(Share("photo", "/srv/photo"));
  AddShare(Share("video", "/srv/video"));
  ShareRecord changed = Share("photo", "/srv/new/photo/");
  changed.readonly = true;
  UpdateShare(changed);
  EXPECT_THROW(UpdateShare(Share("music", "/srv/music")), std::invalid_argument);

  ShareRecord read;
  ASSERT_TRUE(FindShare("photo", read));
  EXPECT_EQ(read.path, "/srv/new/photo");
  EXPECT_TRUE(read.readonly);
  EXPECT_EQ(Names(), (std::vector<std::string>{"ph", "photo", "video"}));

  EXPECT_TRUE(RemoveShare("ph"));
  EXPECT_FALSE(RemoveShare("ph"));
  EXPECT_EQ(Names(), (std::vector<std::string>{"photo", "video"}));
}

TEST_F(ShareRegistryTest, ConcurrentAddsFromProcessesAllLand) {
  constexpr int kProcesses = 8;
  constexpr int kSharesEach = 6;
  std::vector<pid_t> children;
  for (int p = 0; p < kProcesses; ++p) {
    pid_t pid = ::fork();
    ASSERT_GE(pid, 0);
    if (pid == 0) {
      int failures = 0;
      for (int i = 0; i < kSharesEach; ++i) {
        std::string name = "s" + std::to_string(p) + "_" + std::to_string(i);
        try {
          AddShare(Share(name, "/srv/" + name));
        } catch (...) {
          ++failures;
        }
      }
      ::_exit(failures);
    }
    children.push_back(pid);
  }
  for (pid_t pid : children) {
    int status = 0;
    ASSERT_EQ(::waitpid(pid, &status, 0), pid);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
  }
  std::vector<ShareRecord> shares = LoadShares();
  EXPECT_EQ(shares.size(), static_cast<size_t>(kProcesses * kSharesEach));
  ShareRecord read;
  for (int p = 0; p < kProcesses; ++p) {
    for (int i = 0; i < kSharesEach; ++i) {
      std::string name = "s" + std::to_string(p) + "_" + std::to_string(i);
      EXPECT_TRUE(FindShare(name, read)) << name;
    }
  }
}

}  // namespace
}  // namespace portable
}  // namespace orvex
