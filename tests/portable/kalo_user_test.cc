#include "kalo/kalo_user.h"

#include <dirent.h>
#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <vector>

#include "kalo/kalo_error.h"
#include "kalo_test_root.h"

namespace orvex {
namespace portable {
namespace {

constexpr uid_t kNobody = 65534;

std::vector<gid_t> Groups() {
  std::vector<gid_t> groups(static_cast<size_t>(::getgroups(0, nullptr)));
  groups.resize(static_cast<size_t>(::getgroups(static_cast<int>(groups.size()), groups.data())));
  return groups;
}

bool CanList(const std::string& dir) {
  DIR* d = ::opendir(dir.c_str());
  if (d == nullptr) return false;
  ::closedir(d);
  return true;
}

class KaloUserTest : public TempRootTest {
 protected:
  void SetUp() override {
    TempRootTest::SetUp();
    if (::getuid() != 0) GTEST_SKIP() << "needs root";
    struct passwd* nobody = ::getpwnam("nobody");
    if (nobody == nullptr || nobody->pw_uid != kNobody) GTEST_SKIP() << "needs user nobody";
    nobody_gid_ = nobody->pw_gid;
  }

  // A failed expectation while switched must not leave later tests as nobody.
  void TearDown() override {
    if (::geteuid() != 0 && ::seteuid(0) != 0) ADD_FAILURE() << "cannot return to root";
    if (::getegid() != 0 && ::setegid(0) != 0) ADD_FAILURE() << "cannot return to group 0";
    TempRootTest::TearDown();
  }

  gid_t nobody_gid_ = 0;
};

TEST_F(KaloUserTest, LooksUpUsersByUid) {
  PKALOUSER user = nullptr;
  ASSERT_EQ(KALOUserGetByUID(0, &user), 0);
  EXPECT_STREQ(user->szName, "root");
  EXPECT_EQ(user->uid, 0u);
  EXPECT_EQ(user->gid, 0u);
  KALOUserFree(user);

  ASSERT_EQ(KALOUserGetByUID(kNobody, &user), 0);
  EXPECT_STREQ(user->szName, "nobody");
  KALOUserFree(user);

  user = reinterpret_cast<PKALOUSER>(0x1);
  EXPECT_LT(KALOUserGetByUID(3999999, &user), 0);
  EXPECT_EQ(user, nullptr);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_NO_SUCH_USER);
  EXPECT_LT(KALOUserGetByUID(0, nullptr), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
}

TEST_F(KaloUserTest, RootSwitchesToNobodyAndBack) {
  std::string secret = root_ + "/secret";
  ASSERT_EQ(::mkdir(secret.c_str(), 0700), 0);

  ASSERT_EQ(KALOCredResetByName("nobody"), 0);
  EXPECT_EQ(::geteuid(), kNobody);
  EXPECT_EQ(::getegid(), nobody_gid_);
  EXPECT_EQ(::getuid(), 0u) << "only the effective ids change";
  std::vector<gid_t> groups = Groups();
  EXPECT_EQ(std::count(groups.begin(), groups.end(), 0u), 0) << "no group 0 left to nobody";
  EXPECT_FALSE(CanList(secret)) << "nobody really lost root's access";
  EXPECT_EQ(KALOCredResetByName("nobody"), 0) << "asking for the current user is a no-op";
  EXPECT_EQ(::geteuid(), kNobody);

  ASSERT_EQ(KALOCredResetByName("root"), 0);
  EXPECT_EQ(::geteuid(), 0u);
  EXPECT_EQ(::getegid(), 0u);
  EXPECT_TRUE(CanList(secret));
  EXPECT_EQ(KALOCredResetByName("root"), 0);
  EXPECT_EQ(::geteuid(), 0u);
}

TEST_F(KaloUserTest, UnknownOrEmptyNameFailsAndKeepsTheIdentity) {
  EXPECT_LT(KALOCredResetByName("no_such_user_orvex"), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_NO_SUCH_USER);
  EXPECT_LT(KALOCredResetByName(""), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
  EXPECT_LT(KALOCredResetByName(nullptr), 0);
  EXPECT_EQ(::geteuid(), 0u);
}

TEST_F(KaloUserTest, UnprivilegedProcessKeepsItsIdentityAndSucceeds) {
  // The child drops root for good (real, effective and saved ids), as a
  // process started by an ordinary user would be.
  int status = InChild([] {
    if (::setgroups(0, nullptr) != 0 || ::setgid(kNobody) != 0 || ::setuid(kNobody) != 0) {
      return 10;
    }
    if (KALOCredResetByName("root") != 0) return 11;
    if (::geteuid() != kNobody) return 12;
    if (KALOCredResetByName("root") != 0) return 13;  // said once, still succeeds
    if (KALOCredResetByName("nobody") != 0) return 14;
    if (::geteuid() != kNobody) return 15;
    if (KALOCredResetByName("no_such_user_orvex") >= 0) return 16;
    return 0;
  });
  EXPECT_EQ(status, 0);
}

}  // namespace
}  // namespace portable
}  // namespace orvex
