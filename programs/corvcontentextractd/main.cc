// corvcontentextractd: the confined content-extraction worker of the file
// index, and a user's tool to see what the index would store for a file.
//
//   corvcontentextractd --print FILE [--meta]   the document as JSON
//   corvcontentextractd --worker [--memory-mb N] [--cpu-seconds N]
//                       (started by the library, socket on standard input)
#include <signal.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "common/error.h"
#include "common/log.h"
#include "platform/linux/extract/worker_main.h"
#include "platform/platform.h"

namespace {

constexpr char kUsage[] =
    "usage: corvcontentextractd --print FILE [--meta]\n"
    "       corvcontentextractd --worker [--memory-mb N] [--cpu-seconds N]\n"
    "  --print   prints the document that indexing FILE gives, as JSON\n"
    "  --meta    includes the audio, photo and video fields\n"
    "  --worker  serves the file index on standard input (started by the library)\n";

int Usage(const std::string& problem) {
  fprintf(stderr, "corvcontentextractd: %s\n%s", problem.c_str(), kUsage);
  return 2;
}

bool ParseCount(const char* text, unsigned int* value) {
  char* end = nullptr;
  errno = 0;
  const unsigned long parsed = strtoul(text, &end, 10);
  if (errno != 0 || end == text || *end != '\0' || parsed == 0 || parsed > 1u << 20) return false;
  *value = static_cast<unsigned int>(parsed);
  return true;
}

int Print(std::string path, bool need_meta) {
  // The index keys documents by full path; so does this view of them.
  if (!path.empty() && path[0] != '/') {
    char cwd[4096];
    if (getcwd(cwd, sizeof(cwd)) != nullptr) path = std::string(cwd) + "/" + path;
  }
  // Without a configured worker, this very program is the worker.
  if (std::getenv("CORVLUMEX_EXTRACT_WORKER") == nullptr) {
    char self[4096];
    const ssize_t length = readlink("/proc/self/exe", self, sizeof(self) - 1);
    if (length > 0) setenv("CORVLUMEX_EXTRACT_WORKER", std::string(self, static_cast<size_t>(length)).c_str(), 1);
  }
  corvlumex::SetLogSink([](int, const std::string& line) { fprintf(stderr, "%s\n", line.c_str()); });
  Json::Value options(Json::objectValue);
  options["need_meta"] = need_meta;
  Json::Value document;
  try {
    corvlumex::platform::Current()->ParseFile(path, options, document);
  } catch (const corvlumex::Error& error) {
    fprintf(stderr, "corvcontentextractd: %s: %s\n", path.c_str(), error.reason.c_str());
    return 1;
  }
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "  ";
  builder["emitUTF8"] = true;
  printf("%s\n", Json::writeString(builder, document).c_str());
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  signal(SIGPIPE, SIG_IGN);
  if (argc < 2) return Usage("nothing to do");
  const std::string mode = argv[1];
  if (mode == "--help" || mode == "-h") {
    fputs(kUsage, stdout);
    return 0;
  }
  if (mode == "--print") {
    if (argc < 3 || argc > 4) return Usage("--print takes one file and an optional --meta");
    if (argc == 4 && strcmp(argv[3], "--meta") != 0) return Usage(std::string("unknown option ") + argv[3]);
    return Print(argv[2], argc == 4);
  }
  if (mode == "--worker") {
    corvlumex::platform::extract::WorkerLimits limits;
    for (int i = 2; i < argc; i += 2) {
      const std::string option = argv[i];
      if (i + 1 >= argc) return Usage(option + " needs a number");
      unsigned int* target = option == "--memory-mb" ? &limits.memory_mb
                             : option == "--cpu-seconds" ? &limits.cpu_seconds : nullptr;
      if (target == nullptr) return Usage("unknown option " + option);
      if (!ParseCount(argv[i + 1], target)) return Usage(option + " needs a positive number, not " + argv[i + 1]);
    }
    return corvlumex::platform::extract::RunWorker(0, limits);
  }
  return Usage("unknown mode " + mode);
}
