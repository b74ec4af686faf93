// The queue generator behind the sample queue and the benchmarks: its good
// lines must be exactly what the tree accepts, its bad lines exactly what the
// tree skips, and a seed must always give the same queue.
#include "../../bench/queue_generator.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/log.h"
#include "orvex/queue/event.h"
#include "orvex/queue/op_tree.h"

namespace {

using orvex::bench::QueueCounts;
using orvex::bench::QueueGenerator;
using orvex::bench::QueueShape;
using orvex::fileindex::Event;

std::vector<std::string> Generate(const QueueShape& shape, size_t lines, QueueCounts* counts) {
  QueueGenerator generator(shape);
  std::vector<std::string> out;
  while (out.size() < lines) out.push_back(generator.NextLine());
  if (counts != nullptr) *counts = generator.counts();
  return out;
}

bool Canonical(const std::string& path, const std::string& root) {
  return path.compare(0, root.size() + 1, root + "/") == 0 && path.back() != '/' &&
         path.find("//") == std::string::npos;
}

TEST(QueueGeneratorTest, SameSeedGivesSameQueueAndOtherSeedsDiffer) {
  QueueShape shape;
  shape.seed = 42;
  std::vector<std::string> a = Generate(shape, 3000, nullptr);
  EXPECT_EQ(a, Generate(shape, 3000, nullptr));
  shape.seed = 43;
  EXPECT_NE(a, Generate(shape, 3000, nullptr));
}

TEST(QueueGeneratorTest, EveryGoodLineIsAnEventOnACanonicalPathInTheShare) {
  QueueShape shape;
  shape.share_root = "/volume2/music";
  shape.dir_events = 0.2;  // plenty of directory and custom events
  QueueCounts counts;
  std::vector<std::string> lines = Generate(shape, 20000, &counts);
  size_t bad = 0;
  size_t kinds[8] = {};
  for (const auto& line : lines) {
    std::unique_ptr<Event> ev;
    try {
      ev = std::make_unique<Event>(line);
    } catch (const orvex::Error&) {
      ++bad;
      continue;
    }
    if (!Canonical(ev->path, shape.share_root)) {
      ++bad;  // a bad path: the tree refuses it
      continue;
    }
    Json::Value raw;
    ASSERT_TRUE(orvex::fromString(raw, line)) << line;
    const bool custom =
        ev->event == orvex::bench::kMaskReindex || ev->event == orvex::bench::kMaskUpdateCfg;
    if (custom) {
      EXPECT_FALSE(raw.isMember("is_dir")) << line;
      EXPECT_TRUE(raw.isMember("data")) << line;
      EXPECT_EQ("", ev->path_old) << line;
    } else if (ev->event == orvex::bench::kMaskRename) {
      EXPECT_TRUE(Canonical(ev->path_old, shape.share_root)) << line;
      EXPECT_NE(ev->path, ev->path_old) << line;
    } else {
      EXPECT_FALSE(raw.isMember("path_old")) << line;
    }
    if (ev->event == orvex::bench::kMaskUpdateCfg) {
      for (const char* key : {"document", "audio", "video", "photo"}) {
        EXPECT_TRUE(ev->data[key].isBool()) << line;
      }
    }
    switch (ev->event) {
      case 0x40:
        ++kinds[0];
        break;
      case 0x2:
        ++kinds[1];
        break;
      case 0x4:
        ++kinds[2];
        break;
      case 0x80:
        ++kinds[3];
        break;
      case 0x100:
        ++kinds[ev->is_dir ? 5 : 4];
        break;
      case 0x10000:
        ++kinds[6];
        break;
      case 0x20000:
        ++kinds[7];
        break;
      default:
        ADD_FAILURE() << "unexpected mask in " << line;
    }
  }
  EXPECT_EQ(counts.malformed, bad);
  for (size_t k = 0; k < 8; ++k) EXPECT_GT(kinds[k], 0u) << "no events of kind " << k;
  EXPECT_EQ(counts.creates, kinds[0]);
  EXPECT_EQ(counts.renames, kinds[4] + kinds[5]);
  EXPECT_EQ(counts.reindexes, kinds[6]);
}

TEST(QueueGeneratorTest, MalformedFractionIsNearTheOneAsked) {
  for (double fraction : {0.0, 0.01, 0.1}) {
    QueueShape shape;
    shape.malformed = fraction;
    QueueCounts counts;
    Generate(shape, 50000, &counts);
    EXPECT_NEAR(fraction, static_cast<double>(counts.malformed) / 50000, 0.15 * fraction + 1e-9)
        << fraction;
  }
}

TEST(QueueGeneratorTest, TreeSkipsExactlyTheMalformedLines) {
  char tmpl[] = "/tmp/queue_generator_test.XXXXXX";
  int fd = ::mkstemp(tmpl);
  ASSERT_GE(fd, 0);
  ::close(fd);
  QueueShape shape;
  shape.malformed = 0.05;
  QueueGenerator generator(shape);
  {
    std::ofstream out(tmpl, std::ios::binary | std::ios::trunc);
    generator.Write(out, 5000);
  }
  size_t logged = 0;
  orvex::LogSink previous = orvex::SetLogSink([&](int, const std::string& line) {
    if (line.find("InsertEvent failed") != std::string::npos) ++logged;
  });
  const int saved_level = orvex::fileindex::log_level;
  orvex::fileindex::log_level = 6;
  orvex::fileindex::OPTree tree(tmpl);
  orvex::fileindex::log_level = saved_level;
  orvex::SetLogSink(previous);
  ::unlink(tmpl);

  EXPECT_EQ(generator.counts().lines, tree.lines_read());
  EXPECT_EQ(generator.counts().malformed, tree.lines_skipped());
  EXPECT_EQ(generator.counts().malformed, logged);
  EXPECT_FALSE(tree.crashed());
}

TEST(QueueGeneratorTest, LineWritersEscapeNamesAndKeepTheDaemonFormat) {
  const std::string odd = "/volume1/photo/say \"hi\"\\ tab\there/東京.jpg";
  Event ev(orvex::bench::DaemonLine(orvex::bench::kMaskRename, true, odd, "/volume1/photo/x"));
  EXPECT_EQ(odd, ev.path);
  EXPECT_EQ("/volume1/photo/x", ev.path_old);
  EXPECT_TRUE(ev.is_dir);
  EXPECT_EQ("{\"event\": 64, \"is_dir\": false, \"path\": \"/v/s/a\"}",
            orvex::bench::DaemonLine(orvex::bench::kMaskCreate, false, "/v/s/a"));
  EXPECT_EQ(
      "{\"event\":131072,\"path\":\"/v/s\",\"path_old\":\"\",\"data\":{\"document\":true,"
      "\"audio\":false,\"video\":true,\"photo\":false}}",
      orvex::bench::CustomLine(orvex::bench::kMaskUpdateCfg, "/v/s",
                               orvex::bench::FileTypeFlags(true, false, true, false)));
}

}  // namespace
