// The queue generator behind the sample queue and the benchmarks: a seed
// always gives the same queue, and the tree skips exactly the lines it
// counts as malformed.
#include "../../bench/queue_generator.h"

#include <gtest/gtest.h>

#include <fstream>
#include <string>

#include "orvex/foundation/log.h"
#include "orvex/queue/op_tree.h"
#include "support/run_program.h"
#include "support/temp_dir.h"

namespace orvex {
namespace bench {
namespace {

TEST(QueueGeneratorTest, SameSeedSameQueueAndTheTreeSkipsExactlyTheMalformedLines) {
  QueueShape shape;
  shape.malformed = 0.05;
  testing::TempDir dir;
  std::string texts[2];
  QueueCounts counts;
  for (std::string& text : texts) {
    QueueGenerator generator(shape);
    std::ofstream out(dir.Join("queue"), std::ios::binary | std::ios::trunc);
    generator.Write(out, 20000);
    out.close();
    text = testing::ReadFileText(dir.Join("queue"));
    counts = generator.counts();
  }
  EXPECT_EQ(texts[0], texts[1]);
  size_t logged = 0;
  const LogSink previous = SetLogSink([&](int, const std::string& line) {
    logged += line.find("InsertEvent failed") != std::string::npos;
  });
  const int saved_level = fileindex::log_level;
  fileindex::log_level = 6;
  const fileindex::OPTree tree(dir.Join("queue"));
  fileindex::log_level = saved_level;
  SetLogSink(previous);
  EXPECT_EQ(counts.lines, tree.lines_read());
  EXPECT_EQ(counts.malformed, tree.lines_skipped());
  EXPECT_EQ(counts.malformed, logged);
  EXPECT_FALSE(tree.crashed());
  EXPECT_NEAR(0.05, static_cast<double>(counts.malformed) / counts.lines, 0.01);
}

}  // namespace
}  // namespace bench
}  // namespace orvex
