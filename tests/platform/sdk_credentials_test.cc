#include "orvex/platform/sdk_credentials.h"

#include <grp.h>
#include <gtest/gtest.h>
#include <pwd.h>
#include <sys/wait.h>
#include <unistd.h>

#include <string>

#include "orvex/foundation/error.h"
#include "support/log_capture.h"

namespace orvex {
namespace sdk {
namespace {

using orvex::testing::LogCapture;

// A uid no user database entry has.
constexpr uid_t kUnknownUid = 54321;

class SDKCredentialsTest : public ::testing::Test {
 protected:
  void SetUp() override {
    if (geteuid() != 0) GTEST_SKIP() << "switching credentials needs root";
    const passwd* nobody = getpwnam("nobody");
    ASSERT_NE(nobody, nullptr);
    nobody_uid_ = nobody->pw_uid;
    nobody_gid_ = nobody->pw_gid;
    ASSERT_EQ(getpwuid(kUnknownUid), nullptr);
  }

  // Runs body in a forked child; returns its exit status.
  template <typename Body>
  static int InChild(Body body) {
    const pid_t pid = fork();
    if (pid == 0) {
      int status = 98;
      try {
        status = body();
      } catch (...) {
        status = 99;
      }
      _exit(status);
    }
    int status = 0;
    waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  }

  uid_t nobody_uid_ = 0;
  gid_t nobody_gid_ = 0;
};

TEST_F(SDKCredentialsTest, SwitchesForTheScopeAndBack) {
  {
    SDKCredentials creds("nobody");
    EXPECT_EQ(geteuid(), nobody_uid_);
    EXPECT_EQ(getegid(), nobody_gid_);
    EXPECT_EQ(getuid(), 0u);
  }
  EXPECT_EQ(geteuid(), 0u);
  EXPECT_EQ(getegid(), 0u);
}

TEST_F(SDKCredentialsTest, NestedScopesReturnToTheUserBeforeEach) {
  {
    SDKCredentials outer("nobody");
    {
      SDKCredentials inner("root");
      EXPECT_EQ(geteuid(), 0u);
      SDKCredentials same("root");
      EXPECT_EQ(geteuid(), 0u);
    }
    EXPECT_EQ(geteuid(), nobody_uid_);
  }
  EXPECT_EQ(geteuid(), 0u);
}

TEST_F(SDKCredentialsTest, UnknownUserThrows503NamingTheUserAndKeepsRoot) {
  LogCapture log;
  try {
    SDKCredentials creds("no-such-user-orvex");
    FAIL() << "no error";
  } catch (const Error& e) {
    EXPECT_EQ(e.code(), kErrorCredentials);
    EXPECT_NE(std::string(e.reason()).find("no-such-user-orvex"), std::string::npos) << e.reason();
  }
  EXPECT_EQ(geteuid(), 0u);
  ASSERT_EQ(log.Matching("Failed [0 > KALOCredResetByName(user_name.c_str())]").size(), 1u);
  EXPECT_EQ(log.lines()[0].rfind("credentials:", 0), 0u) << log.lines()[0];
}

TEST_F(SDKCredentialsTest, UnknownEffectiveUserThrows503FromTheLookUp) {
  // Root may take any effective uid, also one without a user entry; the
  // child does it so the test process stays root.
  const int status = InChild([] {
    if (seteuid(kUnknownUid) != 0) return 2;
    LogCapture log;
    try {
      SDKCredentials creds("root");
    } catch (const Error& e) {
      const bool logged = !log.Matching("KALOUserGetByUID failed, err=").empty();
      const bool stayed = geteuid() == kUnknownUid;
      return e.code() == kErrorCredentials &&
                     e.reason().rfind("KALOUserGetByUID failed, err=", 0) == 0 && logged && stayed
                 ? 0
                 : 3;
    }
    return 4;
  });
  EXPECT_EQ(status, 0);
}

TEST_F(SDKCredentialsTest, UnprivilegedProcessKeepsItsIdentityWithoutError) {
  const uid_t uid = nobody_uid_;
  const gid_t gid = nobody_gid_;
  const int status = InChild([uid, gid] {
    // For real: no way back to root afterwards.
    if (setgroups(0, nullptr) != 0 || setresgid(gid, gid, gid) != 0 ||
        setresuid(uid, uid, uid) != 0) {
      return 2;
    }
    {
      SDKCredentials creds("root");
      if (geteuid() != uid) return 3;
    }
    return geteuid() == uid ? 0 : 4;
  });
  EXPECT_EQ(status, 0);
}

}  // namespace
}  // namespace sdk
}  // namespace orvex
