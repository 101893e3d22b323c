// Extraction speed per format: in this process straight from the parsers
// (BM_Parse), and through ParseFile with a warm confined worker
// (BM_ParseFile). BM_ParseFile minus BM_Parse is the isolation's cost per
// file; BM_WorkerStart is the price of a fresh worker (first file, and after
// every failure).
//
//   build/bench/extract/extract_bench            (finds the worker in the build folder)
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <unistd.h>

#include <cstdlib>
#include <string>
#include <vector>

#include "platform/linux/extract/parsers/extract_content.h"
#include "platform/linux/extract/parsers/formats.h"
#include "platform/linux/extract/parsers/text_sink.h"
#include "platform/linux/extract/worker_client.h"
#include "platform/linux/linux_platform.h"
#include "tests/support/extract_samples.h"

namespace {

using namespace corvlumex;
using namespace corvlumex::testing_support;

struct Sample {
  const char* name;
  bool need_meta;
};

const Sample kSamples[] = {
    {"small.txt", false}, {"latin1.txt", false}, {"page.html", false}, {"ten-pages.pdf", false},
    {"doc.docx", false},  {"sheet.xlsx", false}, {"doc.odt", false},   {"book.epub", false},
    {"song.mp3", true},   {"song.flac", true},   {"photo.jpg", true},  {"clip.mp4", true},
    {"blob.bin", false},
};

std::string& Folder() {
  static std::string folder;
  return folder;
}

void MakeSamples() {
  char pattern[] = "/tmp/corvextract-bench-XXXXXX";
  Folder() = mkdtemp(pattern);
  const std::string d = Folder() + "/";
  std::string words;
  for (int i = 0; i < 300; ++i) words += "word" + std::to_string(i) + " ";
  WriteBytes(d + "small.txt", words);
  std::string latin;
  for (int i = 0; i < 200; ++i) latin += "Caf\xE9 cr\xE8me br\xFBl\xE9" "e gar\xE7on ";
  WriteBytes(d + "latin1.txt", latin);
  WriteBytes(d + "page.html", "<html><head><title>Bench</title></head><body>" + std::string(50, ' ') +
                                  "<p>" + words + "</p><script>var x;</script></body></html>");
  std::vector<std::string> pages(10, "A line of text on a page of the benchmark document");
  MakePdf(d + "ten-pages.pdf", pages, "Bench", "Author");
  const std::vector<std::string> paragraphs(50, "A paragraph of the benchmark document with some words");
  MakeOffice(d + "doc.docx", "docx", paragraphs, "Bench", "Author");
  MakeOffice(d + "sheet.xlsx", "xlsx", paragraphs, "Bench", "Author");
  MakeOffice(d + "doc.odt", "odt", paragraphs, "Bench", "Author");
  MakeOffice(d + "book.epub", "epub", paragraphs, "Bench", "Author");
  RunTool("ffmpeg -nostdin -loglevel error -y -f lavfi -i sine=duration=30 -b:a 128k -metadata title=Bench " + d +
          "song.mp3");
  RunTool("ffmpeg -nostdin -loglevel error -y -f lavfi -i sine=duration=30 -metadata title=Bench " + d + "song.flac");
  RunTool("ffmpeg -nostdin -loglevel error -y -f lavfi -i testsrc=size=1280x720 -frames:v 1 " + d + "photo.jpg");
  RunTool("exiftool -q -overwrite_original -Make=Canon -ISO=400 -FNumber=2.8 " + d + "photo.jpg");
  RunTool("ffmpeg -nostdin -loglevel error -y -f lavfi -i testsrc=size=320x240:rate=25:duration=10 -f lavfi "
          "-i sine=duration=10 -c:v mpeg4 -c:a aac " + d + "clip.mp4");
  WriteBytes(d + "blob.bin", std::string(65536, '\x01'));
}

void BM_Parse(benchmark::State& state, Sample sample) {
  const std::string path = Folder() + "/" + sample.name;
  const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  for (auto _ : state) benchmark::DoNotOptimize(platform::extract::ExtractContent(fd, sample.name, sample.need_meta, platform::extract::kTextContentCap));
  close(fd);
  state.SetItemsProcessed(state.iterations());
}

void BM_ParseFile(benchmark::State& state, Sample sample) {
  platform::LinuxPlatform linux_platform;
  const std::string path = Folder() + "/" + sample.name;
  Json::Value options(Json::objectValue);
  options["need_meta"] = sample.need_meta;
  Json::Value document;
  linux_platform.ParseFile(path, options, document);  // a warm worker
  for (auto _ : state) linux_platform.ParseFile(path, options, document);
  state.SetItemsProcessed(state.iterations());
}

void BM_WorkerStart(benchmark::State& state) {
  platform::LinuxPlatform linux_platform;
  const std::string path = Folder() + "/small.txt";
  const Json::Value options(Json::objectValue);
  Json::Value document;
  for (auto _ : state) {
    platform::extract::StopIdleExtractWorkers();
    linux_platform.ParseFile(path, options, document);
  }
  state.SetItemsProcessed(state.iterations());
}

}  // namespace

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  if (std::getenv("CORVLUMEX_EXTRACT_WORKER") == nullptr) {
    char self[4096];
    const ssize_t length = readlink("/proc/self/exe", self, sizeof(self) - 1);
    const std::string bench(self, length > 0 ? static_cast<size_t>(length) : 0);
    // build/bench/extract/extract_bench -> build/programs/corvcontentextractd/
    const std::string build = bench.substr(0, bench.rfind("/bench/"));
    setenv("CORVLUMEX_EXTRACT_WORKER", (build + "/programs/corvcontentextractd/corvcontentextractd").c_str(), 1);
  }
  platform::extract::SilenceParserLibraries();
  MakeSamples();
  for (const Sample& sample : kSamples) {
    // Wall-clock time: through the worker, the work is done in another process.
    benchmark::RegisterBenchmark((std::string("BM_Parse/") + sample.name).c_str(), BM_Parse, sample)->UseRealTime();
    benchmark::RegisterBenchmark((std::string("BM_ParseFile/") + sample.name).c_str(), BM_ParseFile, sample)
        ->UseRealTime();
  }
  benchmark::RegisterBenchmark("BM_WorkerStart", BM_WorkerStart)->Iterations(50)->UseRealTime();
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  std::system(("rm -rf " + Folder()).c_str());
  return 0;
}
