// tree_micro: per-operation costs of the operation tree's hot paths, with
// Google Benchmark: scanning a queue line against parsing it as JSON, finding
// the node of a known path in a large tree, and folding one event into a
// path that already has pending work. Complements queue_bench, which checks
// how whole queues scale.
#include <benchmark/benchmark.h>

#include <cstdio>
#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include "orvex/foundation/log.h"
#include "orvex/queue/op_tree.h"
#include "queue/event_parser.h"
#include "queue_generator.h"

namespace {

using orvex::fileindex::Event;
using orvex::fileindex::EventFields;
using orvex::fileindex::OPTree;

const std::string kLine = orvex::bench::DaemonLine(orvex::bench::kMaskModify, false,
                                                   "/volume1/photo/album 0042/IMG_0001234.JPG");

// A tree with `paths` files pending, 1000 to a directory.
std::unique_ptr<OPTree> TreeWith(size_t paths, std::vector<std::string>& names) {
  const std::string empty = "/tmp/orvex_tree_micro_empty";
  std::ofstream(empty).close();
  auto tree = std::make_unique<OPTree>(empty);
  std::remove(empty.c_str());
  char name[96];
  for (size_t i = 0; i < paths; ++i) {
    std::snprintf(name, sizeof(name), "/volume1/photo/album %04zu/IMG_%07zu.JPG", i / 1000, i);
    names.emplace_back(name);
    tree->InsertEvent(std::make_shared<Event>(
        orvex::bench::DaemonLine(orvex::bench::kMaskCreate, false, names.back())));
  }
  return tree;
}

void BM_ScanLine(benchmark::State& state) {
  EventFields fields;
  for (auto _ : state) benchmark::DoNotOptimize(orvex::fileindex::ParseEventFast(kLine, fields));
}
BENCHMARK(BM_ScanLine);

void BM_ParseLineAsJson(benchmark::State& state) {
  for (auto _ : state) {
    EventFields fields;
    orvex::fileindex::ParseEventJson(kLine, fields);
    benchmark::DoNotOptimize(fields.event);
  }
}
BENCHMARK(BM_ParseLineAsJson);

void BM_FindKnownPath(benchmark::State& state) {
  std::vector<std::string> names;
  auto tree = TreeWith(static_cast<size_t>(state.range(0)), names);
  size_t i = 0;
  for (auto _ : state) {
    benchmark::DoNotOptimize(tree->GetNodeByPath(names[i]));
    i = (i + 7919) % names.size();  // a stride that visits every path
  }
}
BENCHMARK(BM_FindKnownPath)->Arg(1000)->Arg(100000);

void BM_FoldModifyIntoPendingUpsert(benchmark::State& state) {
  std::vector<std::string> names;
  auto tree = TreeWith(static_cast<size_t>(state.range(0)), names);
  std::vector<std::shared_ptr<Event>> modifies;
  for (const auto& name : names) {
    modifies.push_back(
        std::make_shared<Event>(orvex::bench::DaemonLine(orvex::bench::kMaskModify, false, name)));
  }
  size_t i = 0;
  for (auto _ : state) {
    tree->InsertEvent(modifies[i]);  // absorbed: the tree does not grow
    i = (i + 7919) % modifies.size();
  }
}
BENCHMARK(BM_FoldModifyIntoPendingUpsert)->Arg(1000)->Arg(100000);

}  // namespace

int main(int argc, char** argv) {
  orvex::SetLogSink([](int, const std::string&) {});
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 2;
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  return 0;
}
