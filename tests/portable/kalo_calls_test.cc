// The small platform calls: the last error, composed share paths, UTF-8
// case folding, the quota check, program execution, users and credentials.
#include <dirent.h>
#include <fcntl.h>
#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <string>
#include <thread>
#include <tuple>
#include <vector>

#include "kalo/kalo_error.h"
#include "kalo/kalo_exec.h"
#include "kalo/kalo_path.h"
#include "kalo/kalo_quota.h"
#include "kalo/kalo_unicode.h"
#include "kalo/kalo_user.h"
#include "kalo_test_root.h"

namespace orvex {
namespace portable {
namespace {

using testing::ReadFileText;
using testing::TempRootTest;

TEST(KaloErrorTest, KeepsCodeFileBaseNameAndLinePerThread) {
  KLIBCErrClear();
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_NONE);
  EXPECT_STREQ(KLIBCErrorGetFile(), "");
  const int line = __LINE__ + 1;
  KLIBC_ERR_SET(KLIB_ERR_OUT_OF_SPACE);
  EXPECT_EQ(KLIBCErrGet(), 0x2400);
  EXPECT_STREQ(KLIBCErrorGetFile(), "kalo_calls_test.cc");
  EXPECT_EQ(KLIBCErrorGetLine(), line);
  int seen_in_thread = -1;
  std::thread([&seen_in_thread] {
    seen_in_thread = KLIBCErrGet();
    KLIBC_ERR_SET(KLIB_ERR_IO);
  }).join();
  EXPECT_EQ(seen_in_thread, KLIB_ERR_NONE);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_OUT_OF_SPACE);
  KLIBCErrSet(KLIB_ERR_QUOTA_EXCEEDED, nullptr, 9);
  EXPECT_EQ(KLIBCErrGet(), 0x2900);
  EXPECT_STREQ(KLIBCErrorGetFile(), "");
}

TEST(KaloPathTest, ComposesInsideTheMetadataFolderOfAbsoluteRootsOnly) {
  const std::vector<std::pair<const char*, std::string>> cases = {
      {"/volume1/photo", "/volume1/photo"},
      {"/volume1/photo/", "/volume1/photo"},
      {"/srv/my data//", "/srv/my data"},
      {"/", ""},
  };
  char buf[4096];
  for (const auto& [share_path, base] : cases) {
    ASSERT_EQ(FILEIDXQueuePathCompose(share_path, buf, sizeof(buf)), 0) << share_path;
    EXPECT_EQ(buf, base + "/@eaDir/@fileindex/queue");
    ASSERT_EQ(FILEIDXDBPathCompose(share_path, buf, sizeof(buf)), 0) << share_path;
    EXPECT_EQ(buf, base + "/@eaDir/@fileindex/db");
  }
  for (const char* bad : {static_cast<const char*>(nullptr), "", "volume1/photo", "./photo"}) {
    KLIBCErrClear();
    EXPECT_LT(FILEIDXQueuePathCompose(bad, buf, sizeof(buf)), 0);
    EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
    EXPECT_LT(FILEIDXDBPathCompose(bad, buf, sizeof(buf)), 0);
  }
  EXPECT_LT(FILEIDXQueuePathCompose("/v/p", nullptr, 10), 0);
  // The buffer must hold the terminating NUL; a failed compose leaves no
  // partial path.
  const std::string want = "/v/p/@eaDir/@fileindex/db";
  EXPECT_LT(FILEIDXDBPathCompose("/v/p", buf, want.size()), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BUFFER_TOO_SMALL);
  EXPECT_STREQ(buf, "");
  ASSERT_EQ(FILEIDXDBPathCompose("/v/p", buf, want.size() + 1), 0);
  EXPECT_EQ(buf, want);
}

int Sign(int v) { return (v > 0) - (v < 0); }

TEST(KaloUnicodeTest, ComparesByCaseFoldingOrAsBytesWhenInvalid) {
  const std::vector<std::tuple<const char*, const char*, int>> cases = {
      {"Photo", "photo", 0},
      {"apple", "Banana", -1},                        // letter order, not byte order ('B' < 'a')
      {"\xC3\xA9t\xC3\xA9", "\xC3\x89T\xC3\x89", 0},  // "été" / "ÉTÉ"
      {"stra\303\237e", "STRASSE", 0},                // "straße" folds to "strasse"
      {"\xCE\xA3\xCE\x9F\xCE\xA6", "\xCF\x83\xCE\xBF\xCF\x86", 0},  // "ΣΟΦ" / "σοφ"
      // Invalid UTF-8 compares as bytes, without folding.
      {"A\xFF", "a\xFF", -1},
      {"\xC0\xAF", "/", 1},              // overlong
      {"\xE2\x82", "\xE2\x82\xAC", -1},  // truncated sequence
      {nullptr, nullptr, 0},
      {nullptr, "", -1},  // null sorts first
  };
  for (size_t k = 0; k < cases.size(); ++k) {
    const auto& [a, b, sign] = cases[k];
    EXPECT_EQ(Sign(KLIBCUnicodeUTF8StrCaseCmp(a, b)), sign) << "row " << k;
    EXPECT_EQ(Sign(KLIBCUnicodeUTF8StrCaseCmp(b, a)), -sign) << "row " << k;
  }
}

using KaloQuotaTest = TempRootTest;

TEST_F(KaloQuotaTest, ComparesAgainstTheFreeSpaceAndTellsWhyNot) {
  KLIBCErrClear();
  EXPECT_EQ(KALOQuotaIsEnough(0, root_.c_str(), 0, 0), 1);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_NONE) << "success leaves no error";
  struct statvfs vfs;
  ASSERT_EQ(::statvfs(root_.c_str(), &vfs), 0);
  const unsigned long long block = vfs.f_frsize;
  // Space moves while other processes write; stay blocks away from the edge.
  if (vfs.f_bavail > 128) {
    EXPECT_EQ(KALOQuotaIsEnough(0, root_.c_str(), (vfs.f_bavail - 64) * block, 0), 1);
  }
  EXPECT_EQ(KALOQuotaIsEnough(0, root_.c_str(), vfs.f_blocks * block + 1, 0), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_OUT_OF_SPACE);
  // A check that cannot be made is not a space error.
  EXPECT_EQ(KALOQuotaIsEnough(0, (root_ + "/missing").c_str(), 1, 0), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_IO);
  for (const char* bad : {static_cast<const char*>(nullptr), ""}) {
    EXPECT_EQ(KALOQuotaIsEnough(0, bad, 1, 0), 0);
    EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
  }
}

using KaloExecTest = TempRootTest;

TEST_F(KaloExecTest, ReturnsTheExitStatusOrFailsInTheCallerOnly) {
  EXPECT_EQ(KLIBCExec("/bin/true", nullptr), 0);
  EXPECT_EQ(KLIBCExec("/bin/false", nullptr), 1);
  EXPECT_EQ(KLIBCExec("/bin/sh", "-c", "exit 255"), 255);
  EXPECT_EQ(KLIBCExecl("/bin/sh", KLIBC_EXECL_WAIT, "-c", "exit 42", nullptr), 42);
  // Failures alternate between the two errors so that each call is seen to
  // set its own.
  const pid_t self = ::getpid();
  const std::string not_executable = dir_.Write("plain.sh", "#!/bin/sh\nexit 0\n");
  EXPECT_LT(KLIBCExec(nullptr, "x"), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
  EXPECT_LT(KLIBCExec("/bin/sh", "-c", "kill -9 $$"), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_EXEC);
  EXPECT_LT(KLIBCExecl("/bin/true", 0, nullptr), 0) << "only the run-and-wait option word";
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
  EXPECT_LT(KLIBCExec("/nonexistent/orvex/program", "x"), 0);
  EXPECT_EQ(::getpid(), self) << "the failed child must never come back here";
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_EXEC);
  EXPECT_LT(KLIBCExec("", nullptr), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
  EXPECT_LT(KLIBCExecl(not_executable.c_str(), KLIBC_EXECL_WAIT, nullptr), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_EXEC);
}

TEST_F(KaloExecTest, PassesArgumentsVerbatimWithoutAShellAndInheritsDescriptors) {
  // Writes each argument on a line of its own, so the test sees exactly the
  // argv the program received.
  const std::string out = dir_.Join("args.txt");
  const std::string script =
      dir_.Write("print_args", "#!/bin/sh\nfor a in \"$@\"; do printf '%s\\n' \"$a\"; done > " +
                                   out + "\nexit 7\n");
  ASSERT_EQ(::chmod(script.c_str(), 0755), 0);
  EXPECT_EQ(KLIBCExec(script.c_str(), "a b", "$HOME", "*"), 7);
  EXPECT_EQ(ReadFileText(out), "a b\n$HOME\n*\n");
  EXPECT_EQ(KLIBCExec(script.c_str(), "one", nullptr, "ignored after the first null"), 7);
  EXPECT_EQ(ReadFileText(out), "one\n");
  EXPECT_EQ(KLIBCExecl(script.c_str(), KLIBC_EXECL_WAIT, "-c", "KALO.Orvex.Application", "",
                       "<a data-kalo-fn=\"preference\">", "</a>", "6", "7", "8", "9", "10", "11",
                       "12", nullptr),
            7);
  EXPECT_EQ(ReadFileText(out),
            "-c\nKALO.Orvex.Application\n\n<a data-kalo-fn=\"preference\">\n</a>\n6\n7\n8\n9\n"
            "10\n11\n12\n");
  EXPECT_EQ(KLIBCExecl(script.c_str(), KLIBC_EXECL_WAIT, nullptr), 7);
  EXPECT_EQ(ReadFileText(out), "");

  const std::string file = dir_.Join("inherited.txt");
  const int fd = ::open(file.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
  ASSERT_GE(fd, 0);
  EXPECT_EQ(KLIBCExec("/bin/sh", "-c", ("echo through >&" + std::to_string(fd)).c_str()), 0);
  ::close(fd);
  EXPECT_EQ(ReadFileText(file), "through\n");
}

constexpr uid_t kNobody = 65534;

bool CanList(const std::string& dir) {
  DIR* d = ::opendir(dir.c_str());
  if (d != nullptr) ::closedir(d);
  return d != nullptr;
}

class KaloUserTest : public testing::TempRootTest {
 protected:
  void SetUp() override {
    if (::getuid() != 0) GTEST_SKIP() << "needs root";
    const passwd* nobody = ::getpwnam("nobody");
    if (nobody == nullptr || nobody->pw_uid != kNobody) GTEST_SKIP() << "needs user nobody";
    nobody_gid_ = nobody->pw_gid;
  }

  // A failed expectation while switched must not leave later tests as nobody.
  void TearDown() override {
    if (::geteuid() != 0 && ::seteuid(0) != 0) ADD_FAILURE() << "cannot return to root";
    if (::getegid() != 0 && ::setegid(0) != 0) ADD_FAILURE() << "cannot return to group 0";
  }

  gid_t nobody_gid_ = 0;
};

TEST_F(KaloUserTest, LooksUpUsersByUid) {
  PKALOUSER user = nullptr;
  ASSERT_EQ(KALOUserGetByUID(kNobody, &user), 0);
  EXPECT_STREQ(user->szName, "nobody");
  EXPECT_EQ(user->uid, kNobody);
  EXPECT_EQ(user->gid, nobody_gid_);
  KALOUserFree(user);
  user = reinterpret_cast<PKALOUSER>(0x1);
  EXPECT_LT(KALOUserGetByUID(3999999, &user), 0);
  EXPECT_EQ(user, nullptr);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_NO_SUCH_USER);
  EXPECT_LT(KALOUserGetByUID(0, nullptr), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
}

TEST_F(KaloUserTest, RootSwitchesToNobodyAndBack) {
  const std::string secret = root_ + "/secret";
  ASSERT_EQ(::mkdir(secret.c_str(), 0700), 0);
  ASSERT_EQ(::chmod(secret.c_str(), 0750), 0);  // group 0 may list it too
  for (int twice = 0; twice < 2; ++twice) {     // asking for the current user is a no-op
    ASSERT_EQ(KALOCredResetByName("nobody"), 0);
    EXPECT_EQ(::geteuid(), kNobody);
    EXPECT_EQ(::getegid(), nobody_gid_);
  }
  EXPECT_EQ(::getuid(), 0u) << "only the effective ids change";
  EXPECT_FALSE(CanList(secret)) << "nobody kept root's user or group access";
  for (int twice = 0; twice < 2; ++twice) {
    ASSERT_EQ(KALOCredResetByName("root"), 0);
    EXPECT_EQ(::geteuid(), 0u);
    EXPECT_EQ(::getegid(), 0u);
  }
  EXPECT_TRUE(CanList(secret));

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
  const int status = testing::InChild([] {
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
