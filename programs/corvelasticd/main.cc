// corvelasticd: the search-engine daemon. Parses the command line, opens the
// registered indexes, and serves the socket until SIGTERM or SIGINT.
#include <grp.h>
#include <malloc.h>
#include <pwd.h>
#include <signal.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <iostream>
#include <string>

#include "common/log.h"
#include "common/stop_signals.h"
#include "common/sys.h"
#include "programs/corvelasticd/dispatcher.h"
#include "programs/corvelasticd/index_registry.h"
#include "programs/corvelasticd/server.h"

namespace {

using corvlumex::elasticd::Server;

constexpr const char* kUsage =
    "usage: corvelasticd [options]\n"
    "  --socket PATH            socket to serve (default: <root>/var/run/corvelasticd.sock)\n"
    "  --registry FILE          list of indexes (default: <root>/var/packages/CorvLumex/var/corvelasticd/indexes.json)\n"
    "  --socket-mode OCTAL      mode of the socket file (default 0666)\n"
    "  --socket-group NAME      group of the socket file\n"
    "  --service-user NAME      a user besides root and the daemon's own that may change indexes\n"
    "  --max-frame-bytes N      largest request accepted (default 67108864)\n"
    "  --max-writer-backlog N   writes waiting on one index before answers are busy (default 64)\n"
    "  --max-clients N          connections served at once (default 256)\n"
    "  --max-clients-per-user N connections one user other than root and the service users may hold (default 64)\n"
    "  --log-stderr             log to standard error instead of syslog\n"
    "  --test-open-delay-ms N   delay the reopening of indexes at start (tests of the busy answer)\n";

Server* g_server = nullptr;

void OnSignal(int) {
  if (g_server != nullptr) g_server->Stop();
}

[[noreturn]] void Fail(const std::string& message) {
  std::cerr << "corvelasticd: " << message << "\n";
  exit(2);
}

long Number(const std::string& option, const char* text, int base = 10) {
  char* end = nullptr;
  errno = 0;
  const long value = strtol(text, &end, base);
  if (errno != 0 || end == text || *end != '\0' || value < 0) Fail(option + " takes a non-negative number, not \"" + text + "\"");
  return value;
}

}  // namespace

int main(int argc, char** argv) {
  using namespace corvlumex;
  using namespace corvlumex::elasticd;
  // Every connection thread would get a heap of its own, each keeping the
  // peak of the largest document it ever served; one writer at a time gains
  // nothing from more than two.
  mallopt(M_ARENA_MAX, 2);
  ServerOptions server_options;
  server_options.socket_path = SysPath("/var/run/corvelasticd.sock");
  std::string registry_file = SysPath("/var/packages/CorvLumex/var/corvelasticd/indexes.json");
  DispatchOptions dispatch_options;
  dispatch_options.writer_uids.push_back(geteuid());
  int open_delay_ms = 0;

  for (int i = 1; i < argc; ++i) {
    const std::string option = argv[i];
    if (option == "--help" || option == "-h") {
      std::cout << kUsage;
      return 0;
    }
    if (option == "--log-stderr") {
      LogToStderr("corvelasticd");
      continue;
    }
    if (i + 1 >= argc) Fail("unknown option or missing value: " + option + "\n" + kUsage);
    const char* value = argv[++i];
    if (option == "--socket") {
      server_options.socket_path = value;
    } else if (option == "--registry") {
      registry_file = value;
    } else if (option == "--socket-mode") {
      server_options.socket_mode = static_cast<mode_t>(Number(option, value, 8) & 07777);
    } else if (option == "--socket-group") {
      const struct group* entry = getgrnam(value);
      if (entry == nullptr) Fail(std::string("no group ") + value);
      server_options.socket_group = entry->gr_gid;
    } else if (option == "--service-user") {
      const struct passwd* entry = getpwnam(value);
      if (entry == nullptr) Fail(std::string("no user ") + value);
      dispatch_options.writer_uids.push_back(entry->pw_uid);
    } else if (option == "--max-frame-bytes") {
      server_options.max_frame_bytes = static_cast<size_t>(Number(option, value));
    } else if (option == "--max-writer-backlog") {
      dispatch_options.max_writer_backlog = static_cast<int>(Number(option, value));
    } else if (option == "--max-clients") {
      server_options.max_clients = static_cast<int>(Number(option, value));
    } else if (option == "--max-clients-per-user") {
      server_options.max_clients_per_user = static_cast<int>(Number(option, value));
    } else if (option == "--test-open-delay-ms") {
      open_delay_ms = static_cast<int>(Number(option, value));
    } else {
      Fail("unknown option " + option + "\n" + kUsage);
    }
  }

  server_options.trusted_uids = dispatch_options.writer_uids;
  signal(SIGPIPE, SIG_IGN);
  IndexRegistry registry(registry_file, open_delay_ms);
  Dispatcher dispatcher(registry, dispatch_options);
  Server server(server_options, dispatcher);
  try {
    server.Listen();
  } catch (const std::exception& error) {
    Fail(error.what());
  }
  g_server = &server;
  OnStopSignals(OnSignal);

  registry.Start();
  CORV_LOG("corvelasticd serving %s", server_options.socket_path.c_str());
  server.Run();
  g_server = nullptr;
  registry.Shutdown();
  CORV_LOG("corvelasticd stopped");
  return 0;
}
