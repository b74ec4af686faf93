#include "kalo/kalo_error.h"

#include <gtest/gtest.h>

#include <thread>

namespace {

TEST(KaloErrorTest, KeepsCodeFileBaseNameAndLine) {
  KLIBCErrClear();
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_NONE);
  EXPECT_STREQ(KLIBCErrorGetFile(), "");
  EXPECT_EQ(KLIBCErrorGetLine(), 0);

  const int line = __LINE__ + 1;
  KLIBC_ERR_SET(KLIB_ERR_OUT_OF_SPACE);
  EXPECT_EQ(KLIBCErrGet(), 0x2400);
  EXPECT_STREQ(KLIBCErrorGetFile(), "kalo_error_test.cc");
  EXPECT_EQ(KLIBCErrorGetLine(), line);

  KLIBCErrSet(KLIB_ERR_QUOTA_EXCEEDED, nullptr, 9);
  EXPECT_EQ(KLIBCErrGet(), 0x2900);
  EXPECT_STREQ(KLIBCErrorGetFile(), "");
}

TEST(KaloErrorTest, EachThreadHasItsOwnLastError) {
  KLIBC_ERR_SET(KLIB_ERR_NO_SUCH_SHARE);
  int seen_in_thread = -1;
  std::thread other([&seen_in_thread] {
    seen_in_thread = KLIBCErrGet();
    KLIBC_ERR_SET(KLIB_ERR_IO);
  });
  other.join();
  EXPECT_EQ(seen_in_thread, KLIB_ERR_NONE);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_NO_SUCH_SHARE);
}

}  // namespace
