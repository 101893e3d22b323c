// Speed of the operation tree.
//   build/bench/optree/optree_bench [--benchmark_filter=...]
// Every case lowers log_level below 7, as the daemon does: at 7 every queue
// line is also written to the log.
#include <benchmark/benchmark.h>
#include <json/json.h>
#include <stdlib.h>
#include <unistd.h>

#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include "bench/optree/queue_gen.h"
#include "common/log.h"
#include "fileindex/queue/optree.h"

namespace corvlumex {
namespace fileindex {
namespace bench {
namespace {

constexpr size_t kQueueLines = 1000000;

// A scratch directory removed at exit.
class Scratch {
 public:
  Scratch() {
    char pattern[] = "/tmp/optree-bench-XXXXXX";
    if (mkdtemp(pattern) == nullptr) abort();
    dir_ = pattern;
  }
  ~Scratch() {
    for (const std::string& file : files_) unlink(file.c_str());
    rmdir(dir_.c_str());
  }
  std::string File(const std::string& name) {
    files_.push_back(dir_ + "/" + name);
    return files_.back();
  }

 private:
  std::string dir_;
  std::vector<std::string> files_;
};

Scratch& Dir() {
  static Scratch scratch;
  return scratch;
}

const std::vector<std::string>& QueueLines() {
  static const std::vector<std::string> lines = GenerateQueue(kQueueLines);
  return lines;
}

const std::string& QueueFile() {
  static const std::string path = [] {
    const std::string file = Dir().File("queue_1m");
    WriteQueueFile(file, QueueLines());
    return file;
  }();
  return path;
}

const std::string& EmptyQueue() {
  static const std::string path = [] {
    const std::string file = Dir().File("empty");
    WriteQueueFile(file, {});
    return file;
  }();
  return path;
}

std::vector<std::shared_ptr<Event>> Parse(const std::vector<std::string>& lines) {
  std::vector<std::shared_ptr<Event>> events;
  events.reserve(lines.size());
  for (const std::string& line : lines) events.push_back(std::make_shared<Event>(line));
  return events;
}

void Fold(benchmark::State& state, const std::vector<std::shared_ptr<Event>>& events) {
  log_level = 6;
  for (auto _ : state) {
    auto tree = std::make_shared<OPTree>(EmptyQueue());
    for (const auto& event : events) tree->InsertEvent(event);
    benchmark::DoNotOptimize(tree->Ops().size());
    state.PauseTiming();
    tree.reset();
    state.ResumeTiming();
  }
  state.SetItemsProcessed(static_cast<int64_t>(state.iterations() * events.size()));
}

// Folding alone: the realistic mix, already parsed.
void BM_FoldParsedEvents(benchmark::State& state) {
  static const auto events = Parse(QueueLines());
  Fold(state, events);
}
BENCHMARK(BM_FoldParsedEvents)->Unit(benchmark::kMillisecond)->MinTime(3);

// Building a tree from the 1,000,000-line queue file (read, parse, fold).
void BM_BuildTreeFromFile(benchmark::State& state) {
  log_level = 6;
  const std::string& path = QueueFile();
  for (auto _ : state) {
    auto tree = std::make_shared<OPTree>(path);
    benchmark::DoNotOptimize(tree->Ops().size());
    state.PauseTiming();
    tree.reset();
    state.ResumeTiming();
  }
  state.SetItemsProcessed(static_cast<int64_t>(state.iterations() * kQueueLines));
}
BENCHMARK(BM_BuildTreeFromFile)->Unit(benchmark::kMillisecond)->MinTime(3);

// The whole job as the indexer sees it: from opening the queue file until
// the last operation was handed out and the tree released (its release is
// timed too, unlike the case above).
void BM_FoldQueueFileAndRelease(benchmark::State& state) {
  log_level = 6;
  const std::string& path = QueueFile();
  for (auto _ : state) {
    auto tree = std::make_shared<OPTree>(path);
    size_t handed = 0;
    tree->ProcessOP([&handed](std::shared_ptr<OP>) { ++handed; });
    tree.reset();
    benchmark::DoNotOptimize(handed);
  }
  state.SetItemsProcessed(static_cast<int64_t>(state.iterations() * kQueueLines));
}
BENCHMARK(BM_FoldQueueFileAndRelease)->Unit(benchmark::kMillisecond)->MinTime(3);

// The floor: reading the same file line by line and parsing every line with
// jsoncpp alone, with one reused reader (its fastest use).
void BM_JsoncppParseFloor(benchmark::State& state) {
  const std::string& path = QueueFile();
  Json::CharReaderBuilder builder;
  builder["collectComments"] = false;
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  for (auto _ : state) {
    std::ifstream input(path);
    std::string line;
    size_t parsed = 0;
    while (std::getline(input, line)) {
      Json::Value value;
      std::string errors;
      parsed += reader->parse(line.data(), line.data() + line.size(), &value, &errors);
    }
    benchmark::DoNotOptimize(parsed);
  }
  state.SetItemsProcessed(static_cast<int64_t>(state.iterations() * kQueueLines));
}
BENCHMARK(BM_JsoncppParseFloor)->Unit(benchmark::kMillisecond)->MinTime(3);

std::vector<std::shared_ptr<Event>> CreatesIn(size_t files, size_t folders) {
  std::vector<std::string> lines;
  lines.reserve(files);
  for (size_t i = 0; i < files; ++i) {
    lines.push_back(QueueLine(kEventCreate, "/volume1/share/import/folder_" + std::to_string(i % folders) +
                                                "/IMG_2023_" + std::to_string(i) + ".jpg"));
  }
  return Parse(lines);
}

// 200,000 creates in one folder against the same spread over 1,000 folders.
void BM_CreatesOneFolder(benchmark::State& state) {
  static const auto events = CreatesIn(200000, 1);
  Fold(state, events);
}
BENCHMARK(BM_CreatesOneFolder)->Unit(benchmark::kMillisecond)->MinTime(2);

void BM_CreatesThousandFolders(benchmark::State& state) {
  static const auto events = CreatesIn(200000, 1000);
  Fold(state, events);
}
BENCHMARK(BM_CreatesThousandFolders)->Unit(benchmark::kMillisecond)->MinTime(2);

// One rename of a folder holding N pending files (half of them in
// subfolders of 100), timed alone.
void BM_RenameFolderWithPendingDescendants(benchmark::State& state) {
  log_level = 6;
  const size_t files = static_cast<size_t>(state.range(0));
  std::vector<std::string> lines;
  for (size_t i = 0; i < files; ++i) {
    const std::string folder = i % 2 ? "/volume1/share/big/sub_" + std::to_string(i / 200) : "/volume1/share/big";
    lines.push_back(QueueLine(kEventCreate, folder + "/file_" + std::to_string(i) + ".pdf"));
  }
  const auto events = Parse(lines);
  const auto rename =
      std::make_shared<Event>(QueueLine(kEventRename, "/volume1/share/moved", true, "/volume1/share/big"));
  for (auto _ : state) {
    state.PauseTiming();
    auto tree = std::make_shared<OPTree>(EmptyQueue());
    for (const auto& event : events) tree->InsertEvent(event);
    state.ResumeTiming();
    tree->InsertEvent(rename);
    state.PauseTiming();
    tree.reset();
    state.ResumeTiming();
  }
  state.SetComplexityN(state.range(0));
  state.SetItemsProcessed(static_cast<int64_t>(state.iterations() * files));
}
BENCHMARK(BM_RenameFolderWithPendingDescendants)
    ->RangeMultiplier(2)
    ->Range(12500, 200000)
    ->Unit(benchmark::kMillisecond)
    ->Complexity(benchmark::oN);

}  // namespace
}  // namespace bench
}  // namespace fileindex
}  // namespace corvlumex

BENCHMARK_MAIN();
