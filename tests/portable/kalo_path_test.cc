#include "kalo/kalo_path.h"

#include <gtest/gtest.h>

#include <string>

#include "kalo/kalo_error.h"

namespace {

TEST(KaloPathTest, ComposesQueueAndDatabaseInsideTheMetadataFolder) {
  struct Case {
    const char* share_path;
    const char* queue;
    const char* db;
  };
  const Case cases[] = {
      {"/volume1/photo", "/volume1/photo/@eaDir/@fileindex/queue",
       "/volume1/photo/@eaDir/@fileindex/db"},
      {"/volume1/photo/", "/volume1/photo/@eaDir/@fileindex/queue",
       "/volume1/photo/@eaDir/@fileindex/db"},
      {"/srv/my data//", "/srv/my data/@eaDir/@fileindex/queue",
       "/srv/my data/@eaDir/@fileindex/db"},
      {"/", "/@eaDir/@fileindex/queue", "/@eaDir/@fileindex/db"},
  };
  for (const Case& c : cases) {
    char buf[4096];
    ASSERT_EQ(FILEIDXQueuePathCompose(c.share_path, buf, sizeof(buf)), 0) << c.share_path;
    EXPECT_STREQ(buf, c.queue);
    ASSERT_EQ(FILEIDXDBPathCompose(c.share_path, buf, sizeof(buf)), 0) << c.share_path;
    EXPECT_STREQ(buf, c.db);
  }
}

TEST(KaloPathTest, RefusesEmptyOrRelativeShareRoots) {
  char buf[4096] = "untouched";
  for (const char* bad : {static_cast<const char*>(nullptr), "", "volume1/photo", "./photo"}) {
    KLIBCErrClear();
    EXPECT_LT(FILEIDXQueuePathCompose(bad, buf, sizeof(buf)), 0) << (bad ? bad : "null");
    EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BAD_PARAMETER);
    EXPECT_LT(FILEIDXDBPathCompose(bad, buf, sizeof(buf)), 0);
  }
  EXPECT_LT(FILEIDXQueuePathCompose("/v/p", nullptr, 10), 0);
}

TEST(KaloPathTest, BufferMustHoldTheTerminatingNul) {
  const std::string want = "/v/p/@eaDir/@fileindex/db";
  char buf[64];
  EXPECT_LT(FILEIDXDBPathCompose("/v/p", buf, want.size()), 0);
  EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_BUFFER_TOO_SMALL);
  EXPECT_STREQ(buf, "") << "a failed compose leaves no partial path";
  ASSERT_EQ(FILEIDXDBPathCompose("/v/p", buf, want.size() + 1), 0);
  EXPECT_EQ(buf, want);
}

}  // namespace
