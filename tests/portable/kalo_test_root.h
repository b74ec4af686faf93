// TempRootTest: a fixture with a fresh ORVEX_ROOT and a way to write the
// share registry. One test at a time (it changes the process environment).
#ifndef ORVEX_TESTS_PORTABLE_KALO_TEST_ROOT_H_
#define ORVEX_TESTS_PORTABLE_KALO_TEST_ROOT_H_

#include <gtest/gtest.h>

#include <filesystem>
#include <string>

#include "support/run_program.h"
#include "support/temp_dir.h"

namespace orvex {
namespace testing {

class TempRootTest : public ::testing::Test {
 protected:
  void WriteRegistry(const std::string& json) const {
    std::filesystem::create_directories(dir_.Join("etc/orvex"));
    dir_.Write("etc/orvex/shares.json", json);
  }

  TempDir dir_;
  ScopedOrvexRoot orvex_root_{dir_.path()};
  const std::string root_ = dir_.path();
};

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_PORTABLE_KALO_TEST_ROOT_H_
