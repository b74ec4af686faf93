#include "kalo/kalo_share.h"

#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "kalo/kalo_error.h"
#include "kalo_test_root.h"

namespace orvex {
namespace portable {
namespace {

constexpr uid_t kNobody = 65534;

class KaloShareTest : public TempRootTest {
 protected:
  // Opens name, failing the test when it cannot.
  PKALOSHARE Open(const char* name) {
    PKALOSHARE share = nullptr;
    EXPECT_EQ(KALOShareGet(name, &share), 0) << name << " err=" << KLIBCErrGet();
    opened_.push_back(share);
    return share;
  }

  void TearDown() override {
    for (PKALOSHARE share : opened_) KALOShareFree(share);
    TempRootTest::TearDown();
  }

  // A share directory with owner, group and mode.
  std::string ShareDir(const std::string& name, uid_t owner, gid_t group, mode_t mode) {
    std::string dir = root_ + "/volume1/" + name;
    std::filesystem::create_directories(dir);
    EXPECT_EQ(::chown(dir.c_str(), owner, group), 0);
    EXPECT_EQ(::chmod(dir.c_str(), mode), 0);
    return dir;
  }

  std::vector<PKALOSHARE> opened_;
};

TEST_F(KaloShareTest, RecordCarriesPathNameAndEveryFlag) {
  WriteRegistry(R"([
    {"name": "plain", "path": "/volume1/plain"},
    {"name": "locked", "path": "/volume1/locked/", "encryption": true, "encrypted": true,
     "readonly": true, "recycle_bin": true, "hide_unreadable": true, "ftp_privilege": 5}
  ])");
  PKALOSHARE plain = Open("plain");
  PKALOSHARE locked = Open("locked");
  ASSERT_NE(plain, nullptr);
  ASSERT_NE(locked, nullptr);
  EXPECT_STREQ(locked->szName, "locked");
  EXPECT_STREQ(locked->szPath, "/volume1/locked");
  EXPECT_EQ(locked->nFTPPrivilege, 5);
  EXPECT_EQ(plain->nFTPPrivilege, 0);

  using Getter = int (*)(PKALOSHARE, bool*);
  for (Getter get : {KLIBShareIsEncryptionGet, KLIBShareIsEncryptedGet, KLIBShareIsReadOnlyGet,
                     KLIBShareRecycleStatusGet}) {
    bool value = true;
    EXPECT_EQ(get(plain, &value), 0);
    EXPECT_FALSE(value);
    value = false;
    EXPECT_EQ(get(locked, &value), 0);
    EXPECT_TRUE(value);
    KLIBCErrClear();
    EXPECT_LT(get(nullptr, &value), 0);
    EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
    EXPECT_LT(get(plain, nullptr), 0);
  }
  EXPECT_FALSE(KLIBShareHideUnreadableGet(plain));
  EXPECT_TRUE(KLIBShareHideUnreadableGet(locked));
  EXPECT_FALSE(KLIBShareHideUnreadableGet(nullptr));
}

TEST_F(KaloShareTest, EachFlagIsReadFromItsOwnKey) {
  WriteRegistry(R"([
    {"name": "ro", "path": "/v/ro", "readonly": true},
    {"name": "enc", "path": "/v/enc", "encrypted": true}
  ])");
  bool readonly = false, encrypted = true, encryption = true, recycle = true;
  PKALOSHARE ro = Open("ro");
  ASSERT_NE(ro, nullptr);
  EXPECT_EQ(KLIBShareIsReadOnlyGet(ro, &readonly), 0);
  EXPECT_EQ(KLIBShareIsEncryptedGet(ro, &encrypted), 0);
  EXPECT_EQ(KLIBShareRecycleStatusGet(ro, &recycle), 0);
  EXPECT_TRUE(readonly);
  EXPECT_FALSE(encrypted);
  EXPECT_FALSE(recycle);
  PKALOSHARE enc = Open("enc");
  ASSERT_NE(enc, nullptr);
  EXPECT_EQ(KLIBShareIsEncryptedGet(enc, &encrypted), 0);
  EXPECT_EQ(KLIBShareIsEncryptionGet(enc, &encryption), 0);
  EXPECT_EQ(KLIBShareIsReadOnlyGet(enc, &readonly), 0);
  EXPECT_TRUE(encrypted);
  EXPECT_FALSE(encryption);
  EXPECT_FALSE(readonly);
}

TEST_F(KaloShareTest, UnknownShareAndBadRegistryFailWithDistinctErrors) {
  PKALOSHARE share = reinterpret_cast<PKALOSHARE>(0x1);
  EXPECT_LT(KALOShareGet("photo", &share), 0) << "no registry: no shares";
  EXPECT_EQ(share, nullptr);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_NO_SUCH_SHARE);

  WriteRegistry(R"([{"name": "photo", "path": "/v/photo"}])");
  EXPECT_LT(KALOShareGet("Photo", &share), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_NO_SUCH_SHARE);
  EXPECT_LT(KALOShareGet("", &share), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
  EXPECT_LT(KALOShareGet("photo", nullptr), 0);

  WriteRegistry(R"([{"name": "photo", "path": "/v/photo"},])");
  EXPECT_LT(KALOShareGet("photo", &share), 0);
  EXPECT_EQ(share, nullptr);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_SHARE_REGISTRY);
  EXPECT_STREQ(KLIBCErrorGetFile(), "kalo_share.cc");
  EXPECT_GT(KLIBCErrorGetLine(), 0);
}

TEST_F(KaloShareTest, ListedPrivilegesWinOverUnixPermissions) {
  std::string dir = ShareDir("team", 0, 0, 0700);
  WriteRegistry(R"([{"name": "team", "path": ")" + dir + R"(",
                     "privileges": {"nobody": "rw", "root": "na", "ghost": "ro"}}])");
  PKALOSHARE share = Open("team");
  ASSERT_NE(share, nullptr);
  EXPECT_EQ(KALOShareUserPrivGet("nobody", share), KALO_SHARE_PRIV_RW);
  EXPECT_EQ(KALOShareUserPrivGet("root", share), KALO_SHARE_PRIV_NA);
  EXPECT_EQ(KALOShareUserPrivGet("ghost", share), KALO_SHARE_PRIV_RO)
      << "a listed name needs no system user";
}

TEST_F(KaloShareTest, UnlistedUsersGetWhatTheDirectoryModeGives) {
  struct Case {
    uid_t owner;
    mode_t mode;
    int nobody;
  };
  const Case cases[] = {
      {0, 0700, KALO_SHARE_PRIV_NA},       {0, 0755, KALO_SHARE_PRIV_RO},
      {0, 0777, KALO_SHARE_PRIV_RW},       {0, 0774, KALO_SHARE_PRIV_NA},  // r without x
      {kNobody, 0700, KALO_SHARE_PRIV_RW}, {kNobody, 0500, KALO_SHARE_PRIV_RO},
      {kNobody, 0077, KALO_SHARE_PRIV_NA},  // owner class decides, not other
  };
  int n = 0;
  for (const Case& c : cases) {
    std::string name = "s" + std::to_string(n++);
    std::string dir = ShareDir(name, c.owner, 0, c.mode);
    WriteRegistry(R"([{"name": ")" + name + R"(", "path": ")" + dir + R"("}])");
    PKALOSHARE share = Open(name.c_str());
    ASSERT_NE(share, nullptr);
    EXPECT_EQ(KALOShareUserPrivGet("nobody", share), c.nobody)
        << "owner " << c.owner << " mode " << std::oct << c.mode;
    EXPECT_EQ(KALOShareUserPrivGet("root", share), KALO_SHARE_PRIV_RW);
  }
}

TEST_F(KaloShareTest, UnknownUserOrMissingDirectoryIsAnError) {
  WriteRegistry(R"([{"name": "gone", "path": "/nonexistent/orvex/gone"}])");
  PKALOSHARE share = Open("gone");
  ASSERT_NE(share, nullptr);
  EXPECT_LT(KALOShareUserPrivGet("no_such_user_orvex", share), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_NO_SUCH_USER);
  EXPECT_LT(KALOShareUserPrivGet("nobody", share), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_IO);
  EXPECT_LT(KALOShareUserPrivGet(nullptr, share), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
}

}  // namespace
}  // namespace portable
}  // namespace orvex
