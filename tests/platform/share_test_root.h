// ShareTestRoot: a test fixture with its own ORVEX_ROOT and share registry.
// Shares are registered with real root directories under the temporary
// directory. One test at a time (it changes the process environment). Only
// jsoncpp besides: the portable platform's tests use it too.
#ifndef ORVEX_TESTS_PLATFORM_SHARE_TEST_ROOT_H_
#define ORVEX_TESTS_PLATFORM_SHARE_TEST_ROOT_H_

#include <gtest/gtest.h>
#include <json/json.h>

#include <filesystem>
#include <sstream>
#include <string>

#include "support/run_program.h"
#include "support/temp_dir.h"

namespace orvex {
namespace testing {

class ShareTestRoot : public ::testing::Test {
 protected:
  // Registers share name with its root at <temp>/<subdir> (default
  // "volume1/<name>"), creates the root directory and returns its path.
  // options holds further registry keys ("readonly": true, ...).
  std::string AddShare(const std::string& name, const Json::Value& options = Json::objectValue,
                       const std::string& subdir = "") {
    const std::string root = dir_.Join(subdir.empty() ? "volume1/" + name : subdir);
    std::filesystem::create_directories(root);
    AddShareAt(name, root, options);
    return root;
  }

  // Registers share name at root as given, creating nothing.
  void AddShareAt(const std::string& name, const std::string& root,
                  const Json::Value& options = Json::objectValue) {
    Json::Value entry = options;
    entry["name"] = name;
    entry["path"] = root;
    shares_.append(entry);
    Json::StreamWriterBuilder compact;
    compact["indentation"] = "";
    WriteRegistryText(Json::writeString(compact, shares_));
  }

  void WriteRegistryText(const std::string& text) {
    std::filesystem::create_directories(dir_.Join("etc/orvex"));
    dir_.Write("etc/orvex/shares.json", text);
  }

  // Creates directories below root.
  static void MakeDirs(const std::string& root, std::initializer_list<const char*> rels) {
    for (const char* rel : rels) std::filesystem::create_directories(root + "/" + rel);
  }

  TempDir dir_;
  ScopedOrvexRoot orvex_root_{dir_.path()};
  Json::Value shares_{Json::arrayValue};
};

// Json options from a one-line literal such as R"({"readonly": true})".
inline Json::Value Options(const std::string& text) {
  Json::Value value;
  std::istringstream in(text);
  std::string errors;
  EXPECT_TRUE(Json::parseFromStream(Json::CharReaderBuilder(), in, &value, &errors)) << text;
  return value;
}

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_PLATFORM_SHARE_TEST_ROOT_H_
