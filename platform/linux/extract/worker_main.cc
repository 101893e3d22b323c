#include "platform/linux/extract/worker_main.h"

#include <fcntl.h>
#include <malloc.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>
#include <vector>

#include "common/error.h"
#include "common/frame.h"
#include "common/frame_reader.h"
#include "common/json_util.h"
#include "common/log.h"
#include "platform/linux/extract/parsers/extract_content.h"
#include "platform/linux/extract/parsers/file_bytes.h"
#include "platform/linux/extract/parsers/formats.h"
#include "platform/linux/extract/parsers/text_sink.h"
#include "platform/linux/extract/worker_protocol.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

// A request names one file: a path and a flag.
constexpr size_t kMaxRequestBytes = 64u << 10;
// The library sends the request right after the descriptor.
constexpr int kRequestWaitMs = 10000;

// Test-only misbehaviour, so the tests can show what the indexer does when a
// parser loops, crashes or eats memory without needing such a file:
// CORVLUMEX_EXTRACT_TEST_HOOK=spin|crash|hog|probe.
std::string Outcome(const char* what, bool succeeded) {
  std::string text = std::string(what) + ": " + (succeeded ? "allowed" : strerror(errno));
  errno = 0;
  return text;
}

// What the confinement lets this process do, as the failure text.
[[noreturn]] void ProbeConfinement() {
  std::string report = "probe: ";
  const int sock = socket(AF_INET, SOCK_STREAM, 0);
  report += Outcome("socket", sock >= 0) + "; ";
  if (sock >= 0) close(sock);
  const pid_t child = fork();
  if (child == 0) _exit(0);
  report += Outcome("fork", child > 0) + "; ";
  if (child > 0) waitpid(child, nullptr, 0);
  char* const argv[] = {const_cast<char*>("/bin/true"), nullptr};
  report += Outcome("exec", execv("/bin/true", argv) == 0) + "; ";
  const std::string scratch = "/tmp/corvcontentextractd-probe-" + std::to_string(getpid());
  const int file = open(scratch.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
  bool written = false;
  if (file >= 0) {
    written = write(file, "x", 1) == 1;
    if (!written) report += Outcome("write file", false) + "; ";
    close(file);
    unlink(scratch.c_str());
  } else {
    report += Outcome("open file", false) + "; ";
  }
  if (written) report += "write file: allowed; ";
  report += "uid " + std::to_string(geteuid());
  throw ExtractError(report);
}

void RunTestHook(const WorkerLimits& limits) {
  const char* hook = std::getenv("CORVLUMEX_EXTRACT_TEST_HOOK");
  if (hook == nullptr) return;
  if (strcmp(hook, "spin") == 0) {
    volatile unsigned long counter = 0;
    for (;;) counter = counter + 1;
  }
  if (strcmp(hook, "crash") == 0) raise(SIGSEGV);
  if (strcmp(hook, "probe") == 0) ProbeConfinement();
  if (strcmp(hook, "hog") == 0) {
    // Stops by itself at four times the limit, should the limit be missing.
    std::vector<char*> blocks;
    const size_t block = 16u << 20;
    for (size_t total = 0; total < (static_cast<size_t>(limits.memory_mb) << 22); total += block) {
      char* memory = new char[block];
      memset(memory, 1, block);
      blocks.push_back(memory);
    }
    for (char* memory : blocks) delete[] memory;
  }
}

Json::Value Failure(const std::string& reason) {
  Json::Value reply(Json::objectValue);
  reply["ok"] = false;
  reply["error"] = reason;
  return reply;
}

// The text cap the request asks for; the default when it names none, and
// never more than the largest setting (the reply must fit a frame).
size_t TextCap(const Json::Value& request) {
  const Json::Value& cap = request["text_cap"];
  if (!cap.isUInt64() || cap.asUInt64() == 0) return kTextContentCap;
  return static_cast<size_t>(std::min<Json::UInt64>(cap.asUInt64(), static_cast<Json::UInt64>(kMaxTextCapMb) << 20));
}

Json::Value Answer(int fd, const Json::Value& request, const WorkerLimits& limits) {
  if (fd < 0) return Failure("the request carried no file descriptor");
  if (!request.isObject() || !request["name"].isString() || !(request["need_meta"].isNull() || request["need_meta"].isBool())) {
    return Failure("the request must be {\"name\": string, \"need_meta\": bool}");
  }
  Json::Value reply(Json::objectValue);
  try {
    RunTestHook(limits);
    reply["fields"] = ExtractContent(fd, request["name"].asString(), request["need_meta"].asBool(), TextCap(request));
    reply["ok"] = true;
  } catch (const std::bad_alloc&) {
    reply = Failure("out of memory (the worker may use " + std::to_string(limits.memory_mb) + " MiB)");
  } catch (const std::exception& error) {
    reply = Failure(error.what());
  } catch (...) {
    reply = Failure("the parser failed");
  }
  return reply;
}

bool SendReply(int socket, const Json::Value& reply) {
  try {
    WriteFrame(socket, JsonToString(reply));
    return true;
  } catch (const Error&) {
    return false;
  }
}

}  // namespace

int RunWorker(int socket, const WorkerLimits& limits) {
  signal(SIGPIPE, SIG_IGN);
  // Nothing of ours goes to syslog from inside the confinement (no sockets):
  // problems travel back in the replies.
  SetLogSink([](int, const std::string& line) { fprintf(stderr, "corvcontentextractd: %s\n", line.c_str()); });
  SilenceParserLibraries();
  InitContentDetection();
  try {
    ConfineWorker(limits);
  } catch (const std::exception& error) {
    fprintf(stderr, "corvcontentextractd: %s\n", error.what());
    return 1;
  }
  for (;;) {
    const int fd = ReceiveDescriptor(socket);
    // The end of the stream is the library letting the worker go.
    if (fd < 0 && errno == 0) return 0;
    // A marker byte without a descriptor still precedes a request: it is
    // read and answered, so the conversation stays in step.
    if (fd < 0 && errno != EPROTO) return 1;
    errno = 0;
    std::string text;
    const FrameStatus status =
        ReadFrameBounded(socket, kMaxRequestBytes, kRequestWaitMs, kRequestWaitMs, &text);
    if (status != FrameStatus::kOk) {
      if (fd >= 0) close(fd);
      // Cut, late or oversized: where the next request begins is unknown.
      if (status == FrameStatus::kTooLarge) SendReply(socket, Failure("the request is larger than " + std::to_string(kMaxRequestBytes) + " bytes"));
      return 1;
    }
    Json::Value request;
    Json::Value reply;
    if (!JsonFromString(request, text)) {
      reply = Failure("the request is not JSON");
    } else {
      RenewCpuAllowance(limits);
      reply = Answer(fd, request, limits);
    }
    if (fd >= 0) close(fd);
    if (!SendReply(socket, reply)) return 1;
    // A worker serves many files: without this, the buffers of one large
    // file (tens of MiB of unpacked and converted text) would stay resident
    // for all the small ones after it.
    reply = Json::Value();
    malloc_trim(0);
  }
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
