#include "platform/linux/extract/worker_client.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <utility>
#include <memory>
#include <mutex>
#include <vector>

#include "common/error.h"
#include "common/file_util.h"
#include "common/frame.h"
#include "common/json_util.h"
#include "common/log.h"
#include "common/sys.h"
#include "platform/linux/extract/document_fields.h"
#include "platform/linux/extract/worker_protocol.h"

extern char** environ;

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

constexpr size_t kMaxIdleWorkers = 2;
// How long a worker that hung up may take to exit before it is killed.
constexpr std::chrono::milliseconds kExitGraceStep(5);
constexpr int kExitGraceSteps = 100;

long EnvNumber(const char* name, long fallback, long low, long high) {
  const char* text = std::getenv(name);
  if (text == nullptr || *text == '\0') return fallback;
  char* end = nullptr;
  errno = 0;
  const long value = strtol(text, &end, 10);
  if (errno != 0 || *end != '\0' || value < low || value > high) {
    errno = 0;
    return fallback;
  }
  return value;
}

bool IsExecutable(const std::string& path) { return !path.empty() && access(path.c_str(), X_OK) == 0; }

[[noreturn]] void Fail(const std::string& reason) { throw Error(kErrorParseDocument, reason); }

// Writes a frame without letting a vanished worker raise SIGPIPE in the
// caller: the signal is blocked in this thread and a pending one consumed.
bool WriteFrameQuietly(int socket, const std::string& text) {
  sigset_t pipe_set, old_set;
  sigemptyset(&pipe_set);
  sigaddset(&pipe_set, SIGPIPE);
  pthread_sigmask(SIG_BLOCK, &pipe_set, &old_set);
  sigset_t pending;
  sigpending(&pending);
  const bool was_pending = sigismember(&pending, SIGPIPE) == 1;
  bool written = true;
  try {
    WriteFrame(socket, text);
  } catch (const Error&) {
    written = false;
  }
  if (!written && !was_pending) {
    const struct timespec zero = {0, 0};
    sigtimedwait(&pipe_set, nullptr, &zero);
  }
  pthread_sigmask(SIG_SETMASK, &old_set, nullptr);
  errno = 0;
  return written;
}

// One worker process and our end of its socket.
class WorkerProcess {
 public:
  WorkerProcess(pid_t pid, int socket) : pid_(pid), socket_(socket) {}
  ~WorkerProcess() {
    close(socket_);  // a healthy worker exits at end of stream
    if (pid_ < 0) return;
    if (broken_) kill(pid_, SIGKILL);
    int status;
    while (waitpid(pid_, &status, 0) < 0 && errno == EINTR) {
    }
    errno = 0;
  }
  WorkerProcess(const WorkerProcess&) = delete;
  WorkerProcess& operator=(const WorkerProcess&) = delete;

  static std::unique_ptr<WorkerProcess> Start(const ExtractLimits& limits) {
    const std::string program = FindWorkerProgram();
    if (program.empty()) {
      Fail(std::string("no extraction worker: ") + kWorkerProgram +
           " was not found (set CORVLUMEX_EXTRACT_WORKER)");
    }
    int ends[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) {
      Fail(std::string("cannot create the worker socket: ") + strerror(errno));
    }
    const std::string memory = std::to_string(limits.memory_mb);
    // The worker's own CPU limit backs up our wall-clock limit in case we die.
    const std::string cpu = std::to_string(limits.timeout.count() / 1000 + 2);
    std::vector<char*> argv = {const_cast<char*>(program.c_str()), const_cast<char*>("--worker"),
                               const_cast<char*>("--memory-mb"), const_cast<char*>(memory.c_str()),
                               const_cast<char*>("--cpu-seconds"), const_cast<char*>(cpu.c_str()), nullptr};
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, ends[1], 0);
    posix_spawn_file_actions_addopen(&actions, 1, "/dev/null", O_WRONLY, 0);
    pid_t pid = -1;
    const int spawned = posix_spawn(&pid, program.c_str(), &actions, nullptr, argv.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    close(ends[1]);
    if (spawned != 0) {
      close(ends[0]);
      Fail("cannot start " + program + ": " + strerror(spawned));
    }
    return std::unique_ptr<WorkerProcess>(new WorkerProcess(pid, ends[0]));
  }

  Json::Value Ask(int fd, const std::string& path, bool need_meta, const ExtractLimits& limits) {
    const std::chrono::milliseconds timeout = limits.timeout;
    ++used_;
    broken_ = true;  // until a whole, well-formed reply has arrived
    Json::Value request(Json::objectValue);
    request["name"] = Basename(path);
    request["need_meta"] = need_meta;
    request["text_cap"] = static_cast<Json::UInt64>(limits.text_cap);
    if (!SendDescriptor(socket_, fd) || !WriteFrameQuietly(socket_, JsonToString(request))) {
      Fail(std::string("the extraction worker is gone: ") + strerror(errno));
    }
    WaitForReply(timeout);
    uint32_t length = 0;
    const ssize_t peeked = recv(socket_, &length, sizeof(length), MSG_PEEK | MSG_WAITALL);
    if (peeked != static_cast<ssize_t>(sizeof(length))) Fail(DeathReason());
    if (length > MaxReplyBytes(limits.text_cap)) Fail("the extraction worker sent " + std::to_string(length) + " bytes");
    Json::Value reply;
    try {
      if (!JsonFromString(reply, ReadFrame(socket_)) || !reply.isObject()) {
        Fail("the extraction worker sent an unreadable reply");
      }
    } catch (const Error& error) {
      Fail("the extraction worker's reply was cut: " + error.reason);
    }
    broken_ = false;
    if (!reply["ok"].asBool()) Fail(reply["error"].isString() ? reply["error"].asString() : "extraction failed");
    // Moved out: a large text is not held twice.
    return std::move(reply["fields"]);
  }

  bool Reusable(const ExtractLimits& limits) const { return !broken_ && used_ < limits.files_per_worker; }

 private:
  void WaitForReply(std::chrono::milliseconds timeout) {
    const auto deadline = std::chrono::steady_clock::now() + timeout;
    for (;;) {
      const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
          deadline - std::chrono::steady_clock::now());
      struct pollfd watch = {socket_, POLLIN, 0};
      const int ready = poll(&watch, 1, left.count() > 0 ? static_cast<int>(left.count()) : 0);
      if (ready > 0) break;
      if (ready < 0 && errno == EINTR) continue;
      if (ready == 0) {
        kill(pid_, SIGKILL);
        Fail("extraction took longer than " + std::to_string(timeout.count()) + " ms; the worker was stopped");
      }
      Fail(std::string("cannot wait for the extraction worker: ") + strerror(errno));
    }
    // The whole reply must follow within the same limit.
    const auto left = std::chrono::duration_cast<std::chrono::microseconds>(
        deadline - std::chrono::steady_clock::now());
    const long usec = left.count() > 1000 ? left.count() : 1000;
    struct timeval receive_timeout = {usec / 1000000, usec % 1000000};
    setsockopt(socket_, SOL_SOCKET, SO_RCVTIMEO, &receive_timeout, sizeof(receive_timeout));
  }

  // Why the worker ended without a reply, from its exit status. A worker
  // that hung up but lingers gets a short grace, then is killed.
  std::string DeathReason() {
    int status = 0;
    pid_t reaped = 0;
    for (int attempt = 0; attempt < kExitGraceSteps && reaped == 0; ++attempt) {
      reaped = waitpid(pid_, &status, WNOHANG);
      if (reaped == 0) SleepFor(kExitGraceStep);
    }
    if (reaped == 0) {
      kill(pid_, SIGKILL);
      while ((reaped = waitpid(pid_, &status, 0)) < 0 && errno == EINTR) {
      }
    }
    errno = 0;
    if (reaped != pid_) return "the extraction worker ended without a reply";
    // Reaped here: the destructor's kill and wait must not touch a reused pid.
    pid_ = -1;
    if (WIFSIGNALED(status)) {
      const int signal = WTERMSIG(status);
      std::string reason = "the extraction worker was killed by signal " + std::to_string(signal) + " (" +
                           strsignal(signal) + ")";
      if (signal == SIGXCPU) reason += ": CPU time limit";
      return reason;
    }
    return "the extraction worker exited with status " + std::to_string(WEXITSTATUS(status)) +
           " without a reply";
  }

  pid_t pid_;
  int socket_;
  bool broken_ = false;
  int used_ = 0;
};

std::mutex& PoolMutex() {
  static std::mutex mutex;
  return mutex;
}

std::vector<std::unique_ptr<WorkerProcess>>& IdleWorkers() {
  static auto* idle = new std::vector<std::unique_ptr<WorkerProcess>>();  // outlives static destructors
  return *idle;
}

std::unique_ptr<WorkerProcess> AcquireWorker(const ExtractLimits& limits) {
  {
    std::lock_guard<std::mutex> guard(PoolMutex());
    if (!IdleWorkers().empty()) {
      std::unique_ptr<WorkerProcess> worker = std::move(IdleWorkers().back());
      IdleWorkers().pop_back();
      return worker;
    }
  }
  return WorkerProcess::Start(limits);
}

void ReleaseWorker(std::unique_ptr<WorkerProcess> worker, const ExtractLimits& limits) {
  if (!worker->Reusable(limits)) return;
  std::lock_guard<std::mutex> guard(PoolMutex());
  if (IdleWorkers().size() < kMaxIdleWorkers) IdleWorkers().push_back(std::move(worker));
}

}  // namespace

ExtractLimits CurrentExtractLimits() {
  ExtractLimits limits;
  limits.timeout = std::chrono::milliseconds(
      EnvNumber("CORVLUMEX_EXTRACT_TIMEOUT_MS", limits.timeout.count(), 1, 24L * 3600 * 1000));
  limits.memory_mb = static_cast<unsigned int>(EnvNumber("CORVLUMEX_EXTRACT_MEMORY_MB", limits.memory_mb, 64, 1 << 20));
  limits.text_cap = static_cast<size_t>(EnvNumber("CORVLUMEX_EXTRACT_TEXT_MB", static_cast<long>(limits.text_cap >> 20), 1,
                                                  kMaxTextCapMb))
                    << 20;
  return limits;
}

std::string FindWorkerProgram() {
  const char* configured = std::getenv("CORVLUMEX_EXTRACT_WORKER");
  if (configured != nullptr && *configured != '\0') return IsExecutable(configured) ? configured : std::string();
  // A test run names its build folder; every program started by a test then
  // finds the worker that was built with it.
  const char* build = std::getenv("FILEINDEX_BUILD_DIR");
  if (build != nullptr && *build != '\0') {
    const std::string built = std::string(build) + "/programs/" + kWorkerProgram + "/" + kWorkerProgram;
    if (IsExecutable(built)) return built;
  }
  char self[4096];
  const ssize_t length = readlink("/proc/self/exe", self, sizeof(self) - 1);
  if (length > 0) {
    const std::string folder = Dirname(std::string(self, static_cast<size_t>(length)));
    const std::string beside = folder + "/" + kWorkerProgram;
    if (IsExecutable(beside)) return beside;
    // A program started by hand (or by a test binary run without ctest) from
    // a build tree: each program has its own folder there, so "beside" finds
    // nothing, and without a worker every file but UTF-8 plain text would
    // silently lose its content and media type. The build's top folder is
    // the one holding CMakeCache.txt, which no installed layout has.
    std::string top = folder;
    for (int level = 0; level < 6 && top.size() > 1; ++level, top = Dirname(top)) {
      if (!IsFileExist(top + "/CMakeCache.txt")) continue;
      const std::string built = top + "/programs/" + kWorkerProgram + "/" + kWorkerProgram;
      if (IsExecutable(built)) return built;
      break;
    }
  }
  const std::string installed = SysPath(kWorkerInstallPath);
  errno = 0;
  return IsExecutable(installed) ? installed : std::string();
}

Json::Value ExtractInWorker(int fd, const std::string& path, bool need_meta) {
  const ExtractLimits limits = CurrentExtractLimits();
  std::unique_ptr<WorkerProcess> worker = AcquireWorker(limits);
  Json::Value fields;
  try {
    fields = worker->Ask(fd, path, need_meta, limits);
  } catch (const Error& error) {
    CORV_LOG("content extraction of %s failed: %s", path.c_str(), error.reason.c_str());
    ReleaseWorker(std::move(worker), limits);
    throw;
  }
  ReleaseWorker(std::move(worker), limits);

  // Only known fields with values of their declared type reach the index.
  Json::Value checked(Json::objectValue);
  if (!fields.isObject()) return checked;
  for (const std::string& name : fields.getMemberNames()) {
    FieldType type;
    if (ContentFieldType(name, &type) && ValueFitsType(fields[name], type)) {
      checked[name] = std::move(fields[name]);
    } else {
      CORV_LOG("content extraction of %s: field %s dropped (unknown or of the wrong type)", path.c_str(),
               name.c_str());
    }
  }
  return checked;
}

void StopIdleExtractWorkers() {
  std::vector<std::unique_ptr<WorkerProcess>> stopping;
  {
    std::lock_guard<std::mutex> guard(PoolMutex());
    stopping.swap(IdleWorkers());
  }
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
