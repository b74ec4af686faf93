// The extractors share no state: files of every type read from several
// threads at once give what they give when read alone.
#include <gtest/gtest.h>

#include <string>
#include <thread>
#include <vector>

#include "extract/test_files.h"
#include "support/temp_dir.h"

namespace orvex {
namespace extract {
namespace {

using testing::Extract;

TEST(ConcurrentExtractionTest, ThreadsGetWhatASingleReaderGets) {
  orvex::testing::TempDir dir;
  std::vector<std::string> paths = {
      dir.Write("a.pdf", testing::MinimalPdf("/Title (Threads)", "Parallel text")),
      dir.Write("a.html", "<title>Page</title><p>body</p>"),
      dir.Write("a.txt", testing::Encode("Fünf Äpfel und Birnen, sagte der Bäcker zur Bäckerin.",
                                         "WINDOWS-1252")),
      dir.Write("a.mp3",
                testing::Id3v23({{"TIT2", std::string("\0Song", 5)}}) + testing::Mp3Frames(10)),
      dir.Write("a.jpg", testing::MinimalJpeg(8, 8)),
  };
  testing::WriteExif(paths.back());
  paths.push_back(dir.Join("a.docx"));
  testing::WriteZip(paths.back(), {{"word/document.xml", "<d><p><t>Word text</t></p></d>"},
                                   {"docProps/core.xml", "<c><title>Doc</title></c>"}});
  paths.push_back(dir.Join("a.avi"));
  testing::WriteAvi(paths.back());

  std::vector<Json::Value> alone;
  for (const std::string& path : paths) {
    const auto result = Extract(path);
    ASSERT_TRUE(result.ok) << path << ": " << result.problem;
    alone.push_back(result.out);
  }
  constexpr int kThreads = 4;
  constexpr int kRounds = 10;
  std::vector<std::vector<std::string>> mismatches(kThreads);
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      for (int round = 0; round < kRounds; ++round) {
        for (size_t i = 0; i < paths.size(); ++i) {
          const size_t k = (i + t) % paths.size();  // threads start on different types
          const auto result = Extract(paths[k]);
          if (!result.ok || result.out != alone[k]) mismatches[t].push_back(paths[k]);
        }
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  for (int t = 0; t < kThreads; ++t) {
    for (const std::string& path : mismatches[t]) ADD_FAILURE() << "thread " << t << ": " << path;
  }
}

TEST(ConcurrentExtractionTest, ZeroCapGivesPropertiesWithoutText) {
  orvex::testing::TempDir dir;
  const auto pdf = Extract(dir.Write("t.pdf", testing::MinimalPdf("/Title (T)", "text")), 0);
  ASSERT_TRUE(pdf.ok) << pdf.problem;
  EXPECT_EQ("T", pdf.out["KALOMDTitle"].asString());
  EXPECT_FALSE(pdf.out.isMember("KALOMDTextContent"));
  const auto txt = Extract(dir.Write("t.txt", "text"), 0);
  ASSERT_TRUE(txt.ok) << txt.problem;
  EXPECT_FALSE(txt.out.isMember("KALOMDTextContent"));
}

}  // namespace
}  // namespace extract
}  // namespace orvex
