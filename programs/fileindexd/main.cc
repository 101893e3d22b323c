// fileindexd: the indexing daemon. Serves the command socket and runs one
// worker per indexed share until SIGTERM or SIGINT.
#include <malloc.h>
#include <signal.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <cerrno>
#include <iostream>

#include "common/log.h"
#include "common/stop_signals.h"
#include "common/sys.h"
#include "fileindex/state/constants.h"
#include "programs/fileindexd/command_server.h"
#include "programs/fileindexd/daemon.h"

namespace {

corvlumex::fileindexd::CommandServer* g_server = nullptr;

void OnSignal(int) {
  if (g_server != nullptr) g_server->Stop();
}

}  // namespace

int main(int argc, char** argv) {
  using namespace corvlumex;
  using namespace corvlumex::fileindexd;

  CLI::App app{"fileindexd: keeps the search index of every indexed folder in step with the disk"};
  std::string socket_path = SysPath(fileindex::kFileIndexDaemonSocketPath);
  bool log_stderr = false;
  bool debug = false;
  long settle_ms = 1000, settle_max_ms = 60000, poll_ms = 250, slice_ms = 1000;
  app.add_option("--socket", socket_path, "command socket (default: <root>/var/run/fileindexd.sock)");
  app.add_flag("--log-stderr,--foreground", log_stderr, "log to standard error instead of syslog");
  app.add_flag("--debug", debug, "also log every queued event as it is read");
  app.add_option("--settle-ms", settle_ms, "first settle interval of a file that keeps changing")
      ->check(CLI::Range(0L, 3600000L));
  app.add_option("--settle-max-ms", settle_max_ms, "longest settle interval")->check(CLI::Range(0L, 86400000L));
  unsigned walk_threads = 2;
  app.add_option("--walk-threads", walk_threads, "threads extracting and storing the files of a folder walk")
      ->check(CLI::Range(1u, 16u));
  app.add_option("--poll-ms", poll_ms, "queue poll when its folder cannot be watched")
      ->check(CLI::Range(10L, 600000L));
  app.add_option("--slice-ms", slice_ms,
                 "a long batch is committed, and how far it got saved, after this much work (default 1000)")
      ->check(CLI::Range(50L, 600000L));
  CLI11_PARSE(app, argc, argv);

  // The library's debug lines (one per queued event) only when asked for.
  corvlumex::fileindex::log_level = debug ? 7 : 6;
  if (log_stderr) LogToStderr("fileindexd");
  signal(SIGPIPE, SIG_IGN);
  // A walk's threads (extraction, sending, the fresh lane) would each get a
  // heap of their own, each keeping the peak of the largest document that
  // passed through it; the work is bound by the search daemon, not by malloc.
  mallopt(M_ARENA_MAX, 2);

  WorkerOptions options;
  options.fallback_poll = std::chrono::milliseconds(poll_ms);
  options.walk_threads = walk_threads;
  options.slice = std::chrono::milliseconds(slice_ms);
  options.settle.initial = std::chrono::milliseconds(settle_ms);
  options.settle.ceiling = std::chrono::milliseconds(std::max(settle_ms, settle_max_ms));
  Daemon daemon(options);
  CommandServer server(
      socket_path, [&daemon](const std::string& type, const Json::Value& data) { return daemon.Handle(type, data); },
      &Daemon::IsReadOnly);
  try {
    server.Listen();
  } catch (const std::exception& error) {
    std::cerr << "fileindexd: " << error.what() << std::endl;
    return 1;
  }
  g_server = &server;
  OnStopSignals(OnSignal);

  daemon.Start();
  errno = 0;  // what the start-up left in errno is no failure of this line
  CORV_LOG("fileindexd serving %s", socket_path.c_str());
  server.Run();
  g_server = nullptr;
  daemon.Stop();
  CORV_LOG("fileindexd stopped");
  return 0;
}
