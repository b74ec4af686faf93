#include "kalo/kalo_quota.h"

#include <sys/statvfs.h>

#include "kalo/kalo_error.h"
#include "kalo_test_root.h"

namespace orvex {
namespace portable {
namespace {

using KaloQuotaTest = TempRootTest;

TEST_F(KaloQuotaTest, SmallRequestFitsAndAbsurdOneDoesNot) {
  KLIBCErrClear();
  EXPECT_EQ(KALOQuotaIsEnough(0, root_.c_str(), 1, 0), 1);
  EXPECT_EQ(KALOQuotaIsEnough(0, root_.c_str(), 0, 0), 1);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_NONE) << "success leaves no error";

  EXPECT_EQ(KALOQuotaIsEnough(0, root_.c_str(), ~0ULL, 0), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_OUT_OF_SPACE);
}

TEST_F(KaloQuotaTest, ComparesAgainstTheSpaceOfUnprivilegedUsers) {
  struct statvfs vfs;
  ASSERT_EQ(::statvfs(root_.c_str(), &vfs), 0);
  const unsigned long long available = static_cast<unsigned long long>(vfs.f_bavail) * vfs.f_frsize;
  if (available < vfs.f_frsize * 4) GTEST_SKIP() << "temporary file system is full";
  // Space moves while other processes write; stay blocks away from the edge.
  EXPECT_EQ(KALOQuotaIsEnough(0, root_.c_str(), available - 64 * vfs.f_frsize, 0), 1);
  EXPECT_EQ(KALOQuotaIsEnough(0, root_.c_str(),
                              static_cast<unsigned long long>(vfs.f_blocks) * vfs.f_frsize + 1, 0),
            0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_OUT_OF_SPACE);
}

TEST_F(KaloQuotaTest, UnusablePathIsNotASpaceError) {
  EXPECT_EQ(KALOQuotaIsEnough(0, (root_ + "/missing").c_str(), 1, 0), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_IO);
  EXPECT_EQ(KALOQuotaIsEnough(0, nullptr, 1, 0), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
  EXPECT_EQ(KALOQuotaIsEnough(0, "", 1, 0), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
}

}  // namespace
}  // namespace portable
}  // namespace orvex
