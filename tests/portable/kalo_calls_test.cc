// The small platform calls: the last error, composed share paths, UTF-8
// case folding, the quota check, program execution, users and credentials.
#include <dirent.h>
#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/wait.h>
#include <unistd.h>

#include <string>
#include <tuple>
#include <vector>

#include "kalo/kalo_error.h"
#include "kalo/kalo_exec.h"
#include "kalo/kalo_path.h"
#include "kalo/kalo_quota.h"
#include "kalo/kalo_unicode.h"
#include "kalo/kalo_user.h"
#include "platform/share_test_root.h"

namespace orvex {
namespace portable {
namespace {

using TempRootTest = testing::ShareTestRoot;

TEST(KaloPathTest, ComposesInsideTheMetadataFolderOfAbsoluteRootsOnly) {
  char buf[4096];
  for (const auto& [share_path, base] : std::vector<std::pair<const char*, std::string>>{
           {"/volume1/photo/", "/volume1/photo"}, {"/", ""}}) {
    ASSERT_EQ(FILEIDXQueuePathCompose(share_path, buf, sizeof(buf)), 0) << share_path;
    EXPECT_EQ(buf, base + "/@eaDir/@fileindex/queue");
    ASSERT_EQ(FILEIDXDBPathCompose(share_path, buf, sizeof(buf)), 0) << share_path;
    EXPECT_EQ(buf, base + "/@eaDir/@fileindex/db");
  }
  EXPECT_LT(FILEIDXQueuePathCompose("volume1/photo", buf, sizeof(buf)), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
  // The buffer must hold the NUL; a failed compose leaves no partial path.
  const std::string want = "/v/p/@eaDir/@fileindex/db";
  EXPECT_LT(FILEIDXDBPathCompose("/v/p", buf, want.size()), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BUFFER_TOO_SMALL);
  EXPECT_STREQ(buf, "");
}

int Sign(int v) { return (v > 0) - (v < 0); }

TEST(KaloUnicodeTest, ComparesByCaseFoldingOrAsBytesWhenInvalid) {
  const std::vector<std::tuple<const char*, const char*, int>> cases = {
      {"apple", "Banana", -1},          // letter order, not byte order ('B' < 'a')
      {"stra\303\237e", "STRASSE", 0},  // "straße" folds to "strasse"
      {"A\xFF", "a\xFF", -1},           // invalid UTF-8 compares as bytes, without folding
      {nullptr, "", -1},                // null sorts first
  };
  for (const auto& [a, b, sign] : cases) {
    EXPECT_EQ(Sign(KLIBCUnicodeUTF8StrCaseCmp(a, b)), sign) << (a ? a : "null");
    EXPECT_EQ(Sign(KLIBCUnicodeUTF8StrCaseCmp(b, a)), -sign) << (a ? a : "null");
  }
}

TEST_F(TempRootTest, QuotaComparesAgainstTheFreeSpaceAndTellsWhyNot) {
  EXPECT_EQ(KALOQuotaIsEnough(0, dir_.path().c_str(), 0, 0), 1);
  struct statvfs vfs;
  ASSERT_EQ(::statvfs(dir_.path().c_str(), &vfs), 0);
  EXPECT_EQ(KALOQuotaIsEnough(0, dir_.path().c_str(), vfs.f_blocks * vfs.f_frsize + 1, 0), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_OUT_OF_SPACE);
  // A check that cannot be made is not a space error.
  EXPECT_EQ(KALOQuotaIsEnough(0, dir_.Join("missing").c_str(), 1, 0), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_IO);
}

TEST_F(TempRootTest, ExecPassesArgumentsVerbatimAndFailsInTheCallerOnly) {
  EXPECT_EQ(KLIBCExec("/bin/sh", "-c", "exit 255"), 255);
  // Failures alternate between the two errors so each call is seen to set its own.
  const pid_t self = ::getpid();
  EXPECT_LT(KLIBCExec("/bin/sh", "-c", "kill -9 $$"), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_EXEC);
  EXPECT_LT(KLIBCExecl("/bin/true", 0, nullptr), 0) << "only the run-and-wait option word";
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
  EXPECT_LT(KLIBCExec("/nonexistent/orvex/program", "x"), 0);
  EXPECT_EQ(::getpid(), self) << "the failed child must never come back here";
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_EXEC);
  // Arguments reach the program verbatim, without a shell.
  const std::string out = dir_.Join("args.txt");
  const std::string script =
      dir_.Write("print_args", "#!/bin/sh\nfor a in \"$@\"; do printf '%s\\n' \"$a\"; done > " +
                                   out + "\nexit 7\n");
  ASSERT_EQ(::chmod(script.c_str(), 0755), 0);
  EXPECT_EQ(KLIBCExec(script.c_str(), "a b", "$HOME", nullptr, "ignored after a null"), 7);
  EXPECT_EQ(testing::ReadFileText(out), "a b\n$HOME\n");
  EXPECT_EQ(KLIBCExecl(script.c_str(), KLIBC_EXECL_WAIT, "-c", "", "3", "4", "5", "6", "7", "8",
                       "9", "10", "11", "12", nullptr),
            7);  // more arguments than the fixed-list call takes
  EXPECT_EQ(testing::ReadFileText(out), "-c\n\n3\n4\n5\n6\n7\n8\n9\n10\n11\n12\n");
}

constexpr uid_t kNobody = 65534;

class KaloUserTest : public TempRootTest {
 protected:
  void SetUp() override {
    if (::getuid() != 0) GTEST_SKIP() << "needs root";
    const passwd* nobody = ::getpwnam("nobody");
    if (nobody == nullptr || nobody->pw_uid != kNobody) GTEST_SKIP() << "needs user nobody";
  }
  // A failed expectation while switched must not leave later tests as nobody.
  void TearDown() override {
    if (::geteuid() != 0 && ::seteuid(0) != 0) ADD_FAILURE() << "cannot return to root";
    if (::getegid() != 0 && ::setegid(0) != 0) ADD_FAILURE() << "cannot return to group 0";
  }
};

TEST_F(KaloUserTest, RootSwitchesToNobodyAndBack) {
  const std::string secret = dir_.Join("secret");
  ASSERT_EQ(::mkdir(secret.c_str(), 0750), 0);  // group 0 may list it too
  auto can_list = [&secret] {
    DIR* d = ::opendir(secret.c_str());
    if (d != nullptr) ::closedir(d);
    return d != nullptr;
  };
  ASSERT_EQ(KALOCredResetByName("nobody"), 0);
  EXPECT_EQ(::geteuid(), kNobody);
  EXPECT_EQ(::getuid(), 0u) << "only the effective ids change";
  EXPECT_FALSE(can_list()) << "nobody kept root's user or group access";
  ASSERT_EQ(KALOCredResetByName("root"), 0);
  EXPECT_EQ(::getegid(), 0u);
  EXPECT_TRUE(can_list());
  EXPECT_LT(KALOCredResetByName("no_such_user_orvex"), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_NO_SUCH_USER);
  EXPECT_EQ(::geteuid(), 0u);
}

// A process started by an ordinary user keeps its identity and succeeds.
TEST_F(KaloUserTest, UnprivilegedProcessKeepsItsIdentity) {
  const pid_t pid = ::fork();
  if (pid == 0) {
    if (::setgroups(0, nullptr) != 0 || ::setgid(kNobody) != 0 || ::setuid(kNobody) != 0) {
      ::_exit(10);
    }
    if (KALOCredResetByName("root") != 0) ::_exit(11);
    ::_exit(::geteuid() == kNobody ? 0 : 12);
  }
  int status = -1;
  ASSERT_EQ(::waitpid(pid, &status, 0), pid);
  EXPECT_EQ(status, 0);
}

}  // namespace
}  // namespace portable
}  // namespace orvex
