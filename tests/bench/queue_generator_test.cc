// The queue generator behind the sample queue and the benchmarks: its good
// lines must be exactly what the tree accepts, its bad lines exactly what the
// tree skips, and a seed must always give the same queue.
#include "../../bench/queue_generator.h"

#include <gtest/gtest.h>

#include <fstream>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "orvex/foundation/error.h"
#include "orvex/foundation/log.h"
#include "orvex/queue/event.h"
#include "orvex/queue/op_tree.h"
#include "support/temp_dir.h"

namespace orvex {
namespace bench {
namespace {

using fileindex::Event;

std::vector<std::string> Generate(const QueueShape& shape, size_t lines, QueueCounts* counts) {
  QueueGenerator generator(shape);
  std::vector<std::string> out;
  while (out.size() < lines) out.push_back(generator.NextLine());
  *counts = generator.counts();
  return out;
}

bool Canonical(const std::string& path, const std::string& root) {
  return path.compare(0, root.size() + 1, root + "/") == 0 && path.back() != '/' &&
         path.find("//") == std::string::npos;
}

TEST(QueueGeneratorTest, SameSeedGivesSameQueueAndOtherSeedsDiffer) {
  QueueShape shape;
  shape.seed = 42;
  QueueCounts counts;
  const std::vector<std::string> a = Generate(shape, 3000, &counts);
  EXPECT_EQ(a, Generate(shape, 3000, &counts));
  shape.seed = 43;
  EXPECT_NE(a, Generate(shape, 3000, &counts));
}

// Every line not counted as malformed parses as an event of a known kind on
// canonical paths in the share; every kind occurs, as often as counted.
TEST(QueueGeneratorTest, GoodLinesAreEventsOfEveryKindOnCanonicalPaths) {
  QueueShape shape;
  shape.share_root = "/volume2/music";
  shape.dir_events = 0.2;  // plenty of directory and custom events
  QueueCounts counts;
  size_t bad = 0;
  size_t dir_renames = 0;
  std::map<uint32_t, size_t> by_mask;
  for (const std::string& line : Generate(shape, 20000, &counts)) {
    std::unique_ptr<Event> ev;
    try {
      ev = std::make_unique<Event>(line);
    } catch (const Error&) {
    }
    if (!ev || !Canonical(ev->path, shape.share_root)) {
      ++bad;
      continue;
    }
    ++by_mask[ev->event];
    if (ev->event == kMaskRename) {
      EXPECT_TRUE(Canonical(ev->path_old, shape.share_root)) << line;
      dir_renames += ev->is_dir;
    }
  }
  EXPECT_EQ(counts.malformed, bad);
  const std::map<uint32_t, size_t> expected = {
      {kMaskModify, counts.modifies},  {kMaskAttr, counts.attrs},
      {kMaskCreate, counts.creates},   {kMaskDelete, counts.deletes},
      {kMaskRename, counts.renames},   {kMaskReindex, counts.reindexes},
      {kMaskUpdateCfg, counts.configs}};
  EXPECT_EQ(expected, by_mask);
  for (const auto& [mask, n] : by_mask) EXPECT_GT(n, 0u) << "no events of mask " << mask;
  EXPECT_GT(dir_renames, 0u);
}

TEST(QueueGeneratorTest, TreeSkipsExactlyTheMalformedLinesAtTheRateAsked) {
  testing::TempDir dir;
  for (const double fraction : {0.0, 0.05}) {
    SCOPED_TRACE(fraction);
    QueueShape shape;
    shape.malformed = fraction;
    QueueGenerator generator(shape);
    const std::string queue = dir.Join("queue");
    {
      std::ofstream out(queue, std::ios::binary | std::ios::trunc);
      generator.Write(out, 20000);
    }
    size_t logged = 0;
    const LogSink previous = SetLogSink([&](int, const std::string& line) {
      logged += line.find("InsertEvent failed") != std::string::npos;
    });
    const int saved_level = fileindex::log_level;
    fileindex::log_level = 6;
    const fileindex::OPTree tree(queue);
    fileindex::log_level = saved_level;
    SetLogSink(previous);
    const QueueCounts& counts = generator.counts();
    EXPECT_EQ(counts.lines, tree.lines_read());
    EXPECT_EQ(counts.malformed, tree.lines_skipped());
    EXPECT_EQ(counts.malformed, logged);
    EXPECT_FALSE(tree.crashed());
    EXPECT_NEAR(fraction, static_cast<double>(counts.malformed) / counts.lines,
                0.15 * fraction + 1e-9);
  }
}

}  // namespace
}  // namespace bench
}  // namespace orvex
