// The share registry and the platform's share records read from it.
#include <sys/stat.h>
#include <unistd.h>

#include <stdexcept>
#include <string>
#include <vector>

#include "kalo/kalo_error.h"
#include "kalo/kalo_share.h"
#include "kalo_test_root.h"
#include "orvex/portable/share_registry.h"

namespace orvex {
namespace portable {
namespace {

using testing::ReadFileText;

ShareRecord Share(const std::string& name, const std::string& path) {
  ShareRecord share;
  share.name = name;
  share.path = path;
  return share;
}

std::vector<std::string> Names() {
  std::vector<std::string> names;
  for (const ShareRecord& share : LoadShares()) names.push_back(share.name);
  return names;
}

class ShareRegistryTest : public testing::TempRootTest {
 protected:
  const std::string registry_ = root_ + "/etc/orvex/shares.json";
};

TEST_F(ShareRegistryTest, RoundTripKeepsEveryFieldAndTheOrder) {
  ShareRecord photo = Share("photo", "/srv/data/photo/");
  photo.encryption = photo.readonly = photo.hide_unreadable = true;  // not the other two
  photo.ftp_privilege = 7;
  photo.privileges = {{"alice", "rw"}, {"bob", "ro"}, {"eve", "na"}};
  AddShare(Share("ph", "/srv/data/ph"));
  AddShare(photo);
  AddShare(Share("фото", "/srv/данные/фото"));
  EXPECT_EQ(Names(), (std::vector<std::string>{"ph", "photo", "фото"}));
  ShareRecord read;
  ASSERT_TRUE(FindShare("photo", read));
  EXPECT_EQ(read.path, "/srv/data/photo") << "trailing slash dropped";
  EXPECT_EQ(std::vector<bool>({read.encryption, read.encrypted, read.readonly, read.recycle_bin,
                               read.hide_unreadable}),
            std::vector<bool>({true, false, true, false, true}));
  EXPECT_EQ(read.ftp_privilege, 7);
  EXPECT_EQ(read.privileges, photo.privileges);
  ASSERT_TRUE(FindShare("фото", read));
  EXPECT_EQ(read.path, "/srv/данные/фото");
  EXPECT_FALSE(FindShare("Photo", read)) << "names are exact case";
  struct stat st;
  ASSERT_EQ(::stat(registry_.c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0644u);
  EXPECT_NE(ReadFileText(registry_).find("\"фото\""), std::string::npos) << "UTF-8, not escapes";
}

TEST_F(ShareRegistryTest, MissingRegistryMeansNoSharesAndHandWrittenOneTakesDefaults) {
  EXPECT_TRUE(LoadShares().empty());
  EXPECT_FALSE(RemoveShare("photo"));
  EXPECT_FALSE(std::filesystem::exists(registry_)) << "a no-op remove writes nothing";

  WriteRegistry(R"([{"name": "music", "path": "/volume1/music/"}])");
  ShareRecord read;
  ASSERT_TRUE(FindShare("music", read));
  EXPECT_EQ(read.path, "/volume1/music");
  EXPECT_FALSE(read.readonly);
  EXPECT_EQ(read.ftp_privilege, 0);
}

TEST_F(ShareRegistryTest, MalformedRegistryNamesTheFileAndTheProblem) {
  const std::vector<std::pair<std::string, std::string>> cases = {
      {"", "not valid JSON"},
      {R"([{"name": "a", "path": "/a"})", "not valid JSON"},
      {R"({"name": "a", "path": "/a"})", "not a JSON array"},
      {R"([{"name": "a", "name": "b", "path": "/a"}])", "not valid JSON"},
      {R"(["a"])", "share [0]: is not an object"},
      {R"([{"path": "/a"}])", "share [0]: key \"name\" is missing"},
      {R"([{"name": "a"}])", "share [0]: key \"path\" is missing"},
      {R"([{"name": "a", "path": "/a"}, {"name": 3, "path": "/b"}])",
       "share [1]: key \"name\" is not a string"},
      {R"([{"name": "a", "path": "/a/../b"}])", "\"..\" component"},
      {R"([{"name": "a", "path": "/a", "readonly": "yes"}])", "key \"readonly\" is not a boolean"},
      {R"([{"name": "a", "path": "/a", "ftp_privilege": 1.5}])",
       "key \"ftp_privilege\" is not an integer"},
      {R"([{"name": "a", "path": "/a", "privileges": {"bob": "rx"}}])",
       "privilege of \"bob\" is \"rx\""},
      {R"([{"name": "a", "path": "/a", "read_only": true}])", "unknown key \"read_only\""},
      {R"([{"name": "a", "path": "/a"}, {"name": "a", "path": "/b"}])",
       "share [1]: duplicate name \"a\""},
  };
  for (const auto& [text, problem] : cases) {
    WriteRegistry(text);
    try {
      LoadShares();
      ADD_FAILURE() << "accepted: " << text;
    } catch (const std::runtime_error& e) {
      const std::string what = e.what();
      EXPECT_EQ(what.rfind(registry_ + ": ", 0), 0u) << what;
      EXPECT_NE(what.find(problem), std::string::npos) << text << " gave: " << what;
    }
  }
  // Adding to a malformed registry leaves it as it was.
  EXPECT_THROW(AddShare(Share("b", "/b")), std::runtime_error);
  EXPECT_EQ(ReadFileText(registry_), cases.back().first);
  // So is one that cannot be read: a failure, not an empty list.
  std::filesystem::remove(registry_);
  std::filesystem::create_directories(registry_);
  EXPECT_THROW(LoadShares(), std::runtime_error);
}

TEST_F(ShareRegistryTest, AddRefusesBadRecordsAndWritesNothing) {
  ShareRecord bad_priv = Share("a", "/a");
  bad_priv.privileges["bob"] = "RW";
  const std::vector<std::pair<ShareRecord, std::string>> cases = {
      {Share("", "/a"), "name is empty"},
      {Share("a/b", "/a"), "contains \"/\""},
      {Share(std::string(256, 'n'), "/a"), "longer than 255"},
      {Share("a", ""), "path is empty"},
      {Share("a", "srv/a"), "not absolute"},
      {Share("a", "///"), "root directory"},
      {Share("a", "/srv/../etc"), "component"},
      {Share("a", "/srv//a"), "component"},
      {Share("a", "/" + std::string(4095, 'p')), "longer than 4095"},
      {bad_priv, "\"RW\""},
  };
  for (const auto& [share, problem] : cases) {
    try {
      AddShare(share);
      ADD_FAILURE() << "accepted name [" << share.name << "] path [" << share.path << "]";
    } catch (const std::invalid_argument& e) {
      EXPECT_NE(std::string(e.what()).find(problem), std::string::npos)
          << share.path << " gave: " << e.what();
    }
  }
  EXPECT_FALSE(std::filesystem::exists(registry_));
}

TEST_F(ShareRegistryTest, AddUpdateAndRemoveWorkOnExactNamesKeepingTheOrder) {
  AddShare(Share("ph", "/srv/ph"));
  AddShare(Share("photo", "/srv/photo"));
  AddShare(Share("Photo", "/srv/Photo"));
  EXPECT_THROW(AddShare(Share("photo", "/srv/other")), std::invalid_argument);
  ShareRecord changed = Share("photo", "/srv/new/photo/");
  changed.readonly = true;
  UpdateShare(changed);
  EXPECT_THROW(UpdateShare(Share("music", "/srv/music")), std::invalid_argument);
  ShareRecord read;
  ASSERT_TRUE(FindShare("photo", read));
  EXPECT_EQ(read.path, "/srv/new/photo");
  EXPECT_TRUE(read.readonly);
  EXPECT_EQ(Names(), (std::vector<std::string>{"ph", "photo", "Photo"}));
  EXPECT_TRUE(RemoveShare("ph"));
  EXPECT_FALSE(RemoveShare("ph"));
  EXPECT_EQ(Names(), (std::vector<std::string>{"photo", "Photo"}));
}

TEST_F(ShareRegistryTest, ConcurrentAddsFromProcessesAllLand) {
  constexpr int kProcesses = 8;
  constexpr int kSharesEach = 6;
  std::vector<pid_t> children;
  for (int p = 0; p < kProcesses; ++p) {
    const pid_t pid = ::fork();
    ASSERT_GE(pid, 0);
    if (pid == 0) {
      int failures = 0;
      for (int i = 0; i < kSharesEach; ++i) {
        const std::string name = "s" + std::to_string(p) + "_" + std::to_string(i);
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
  // Names are unique in the registry: every add landed.
  EXPECT_EQ(Names().size(), static_cast<size_t>(kProcesses * kSharesEach));
}

constexpr uid_t kNobody = 65534;

class KaloShareTest : public testing::TempRootTest {
 protected:
  void TearDown() override {
    for (PKALOSHARE share : opened_) KALOShareFree(share);
  }

  // Opens name; nullptr (and a failed test) when it cannot.
  PKALOSHARE Open(const std::string& name) {
    PKALOSHARE share = nullptr;
    EXPECT_EQ(KALOShareGet(name.c_str(), &share), 0) << name << " err=" << KLIBCErrGet();
    opened_.push_back(share);
    return share;
  }

  // A share root directory with owner and mode (group 0).
  std::string ShareDir(const std::string& name, uid_t owner, mode_t mode) {
    const std::string dir = root_ + "/volume1/" + name;
    std::filesystem::create_directories(dir);
    EXPECT_EQ(::chown(dir.c_str(), owner, 0), 0);
    EXPECT_EQ(::chmod(dir.c_str(), mode), 0);
    return dir;
  }

  std::vector<PKALOSHARE> opened_;
};

TEST_F(KaloShareTest, EachFlagAndFieldIsReadFromItsOwnKey) {
  WriteRegistry(R"([
    {"name": "plain", "path": "/volume1/plain/"},
    {"name": "encryption", "path": "/v/1", "encryption": true},
    {"name": "encrypted", "path": "/v/2", "encrypted": true},
    {"name": "readonly", "path": "/v/3", "readonly": true},
    {"name": "recycle_bin", "path": "/v/4", "recycle_bin": true, "ftp_privilege": 5},
    {"name": "hide_unreadable", "path": "/v/5", "hide_unreadable": true}])");
  using Getter = int (*)(PKALOSHARE, bool*);
  const std::vector<std::pair<std::string, Getter>> getters = {
      {"encryption", KLIBShareIsEncryptionGet},
      {"encrypted", KLIBShareIsEncryptedGet},
      {"readonly", KLIBShareIsReadOnlyGet},
      {"recycle_bin", KLIBShareRecycleStatusGet},
  };
  for (const std::string name :
       {"plain", "encryption", "encrypted", "readonly", "recycle_bin", "hide_unreadable"}) {
    PKALOSHARE share = Open(name);
    ASSERT_NE(share, nullptr);
    EXPECT_EQ(share->szName, name);
    for (const auto& [key, get] : getters) {
      bool value = key != name;
      EXPECT_EQ(get(share, &value), 0);
      EXPECT_EQ(value, key == name) << name << " read as " << key;
    }
    EXPECT_EQ(KLIBShareHideUnreadableGet(share), name == "hide_unreadable") << name;
  }
  EXPECT_STREQ(Open("plain")->szPath, "/volume1/plain");
  EXPECT_EQ(Open("plain")->nFTPPrivilege, 0);
  EXPECT_EQ(Open("recycle_bin")->nFTPPrivilege, 5);
  for (const auto& [key, get] : getters) {
    bool value = false;
    KLIBCErrClear();
    EXPECT_LT(get(nullptr, &value), 0) << key;
    EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
    EXPECT_LT(get(Open("plain"), nullptr), 0) << key;
  }
  EXPECT_FALSE(KLIBShareHideUnreadableGet(nullptr));
}

TEST_F(KaloShareTest, FailuresCarryDistinctErrors) {
  PKALOSHARE share = reinterpret_cast<PKALOSHARE>(0x1);
  EXPECT_LT(KALOShareGet("photo", &share), 0) << "no registry: no shares";
  EXPECT_EQ(share, nullptr);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_NO_SUCH_SHARE);

  WriteRegistry(R"([{"name": "gone", "path": "/nonexistent/orvex/gone"}])");
  EXPECT_LT(KALOShareGet("Gone", &share), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_NO_SUCH_SHARE);
  EXPECT_LT(KALOShareGet("", &share), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
  EXPECT_LT(KALOShareGet("gone", nullptr), 0);
  share = Open("gone");
  EXPECT_LT(KALOShareUserPrivGet("no_such_user_orvex", share), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_NO_SUCH_USER);
  EXPECT_LT(KALOShareUserPrivGet("nobody", share), 0);  // the root directory is missing
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_IO);
  EXPECT_LT(KALOShareUserPrivGet(nullptr, share), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);

  WriteRegistry(R"([{"name": "photo", "path": "/v/photo"},])");
  EXPECT_LT(KALOShareGet("photo", &share), 0);
  EXPECT_EQ(share, nullptr);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_SHARE_REGISTRY);
  EXPECT_STREQ(KLIBCErrorGetFile(), "kalo_share.cc");
  EXPECT_GT(KLIBCErrorGetLine(), 0);
}

TEST_F(KaloShareTest, ListedPrivilegesWinOverTheDirectoryMode) {
  struct Case {
    uid_t owner;
    mode_t mode;
    int nobody;
  };
  const std::vector<Case> cases = {
      {0, 0700, KALO_SHARE_PRIV_NA},       {0, 0755, KALO_SHARE_PRIV_RO},
      {0, 0777, KALO_SHARE_PRIV_RW},       {0, 0774, KALO_SHARE_PRIV_NA},  // r without x
      {kNobody, 0700, KALO_SHARE_PRIV_RW}, {kNobody, 0500, KALO_SHARE_PRIV_RO},
      {kNobody, 0077, KALO_SHARE_PRIV_NA},  // owner class decides, not other
  };
  ShareRecord team = Share("team", ShareDir("team", 0, 0700));
  team.privileges = {{"nobody", "rw"}, {"root", "na"}, {"ghost", "ro"}};
  AddShare(team);
  for (size_t k = 0; k < cases.size(); ++k) {
    const std::string name = "s" + std::to_string(k);
    AddShare(Share(name, ShareDir(name, cases[k].owner, cases[k].mode)));
  }
  PKALOSHARE listed = Open("team");
  EXPECT_EQ(KALOShareUserPrivGet("nobody", listed), KALO_SHARE_PRIV_RW);
  EXPECT_EQ(KALOShareUserPrivGet("root", listed), KALO_SHARE_PRIV_NA);
  EXPECT_EQ(KALOShareUserPrivGet("ghost", listed), KALO_SHARE_PRIV_RO) << "needs no system user";
  for (size_t k = 0; k < cases.size(); ++k) {
    PKALOSHARE share = Open("s" + std::to_string(k));
    EXPECT_EQ(KALOShareUserPrivGet("nobody", share), cases[k].nobody) << "row " << k;
    EXPECT_EQ(KALOShareUserPrivGet("root", share), KALO_SHARE_PRIV_RW) << "row " << k;
  }
}

}  // namespace
}  // namespace portable
}  // namespace orvex
