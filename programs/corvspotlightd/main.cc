// corvspotlightd: answers the Elasticsearch-style searches of Samba's
// Spotlight back end from corvelasticd's indexes, so Mac clients search the
// SMB shares with what we indexed. See docs/spotlight.md.
//
//   corvspotlightd [--address A] [--port N] [--service-user NAME] [--log-stderr] ...
//
// SIGTERM or SIGINT stops it after the requests in progress.
#include <pwd.h>
#include <syslog.h>

#include <CLI/CLI.hpp>
#include <cstdio>

#include "common/index_fields.h"
#include "common/log.h"
#include "common/stop_signals.h"
#include "fileindex/elastic/schema.h"
#include "programs/corvspotlightd/http_listener.h"
#include "programs/corvspotlightd/search_handler.h"

namespace {

using corvlumex::spotlightd::ListenerOptions;

// Words without a field: the file's name and its text, as Finder means them.
std::vector<std::string> DefaultFields() {
  return {corvlumex::kFieldFSName, corvlumex::kFieldTextContent};
}

}  // namespace

int main(int argc, char** argv) {
  ListenerOptions options;
  std::string service_user;
  bool log_stderr = false;
  long idle_seconds = options.idle_timeout.count();
  CLI::App app{"corvspotlightd: answers Samba's Spotlight searches from the search index"};
  app.add_option("--address", options.address, "loopback address to listen on")
      ->check([](const std::string& address) {
        return address.rfind("127.", 0) == 0 || address == "::1" ? std::string()
                                                                 : std::string("only a loopback address is allowed");
      });
  app.add_option("--port", options.port, "TCP port (0: any free one, printed at start)")->check(CLI::Range(0, 65535));
  app.add_option("--service-user", service_user, "a user besides root whose processes may search");
  app.add_option("--max-connections", options.max_connections, "connections served at once (one thread each)")
      ->check(CLI::Range(1, 4096));
  app.add_option("--idle-timeout", idle_seconds, "seconds an idle connection is kept")->check(CLI::Range(1L, 604800L));
  app.add_flag("--log-stderr,--foreground", log_stderr, "log to standard error instead of syslog");
  CLI11_PARSE(app, argc, argv);
  options.idle_timeout = std::chrono::seconds(idle_seconds);

  if (log_stderr) {
    corvlumex::SetLogSink([](int, const std::string& line) {
      fprintf(stderr, "corvspotlightd: %s\n", line.c_str());
      fflush(stderr);
    });
  } else {
    openlog("corvspotlightd", LOG_PID, LOG_DAEMON);
  }
  if (!service_user.empty()) {
    const passwd* user = getpwnam(service_user.c_str());
    if (user == nullptr) {
      fprintf(stderr, "corvspotlightd: --service-user: no user \"%s\"\n", service_user.c_str());
      return 2;
    }
    options.allowed_uids.insert(user->pw_uid);
  }

  corvlumex::BlockStopSignals();

  const corvlumex::spotlightd::SearchHandler handler(
      corvlumex::spotlightd::FieldTable::FromMappings(corvlumex::fileindex::elastic::GetFileIndexMappings()),
      DefaultFields());
  corvlumex::spotlightd::HttpListener listener(options, handler);
  const int port = listener.Bind();
  if (port < 0) {
    fprintf(stderr, "corvspotlightd: cannot listen on %s port %d\n", options.address.c_str(), options.port);
    return 1;
  }
  CORV_LOG("listening on %s port %d", options.address.c_str(), port);
  bool served = false;
  {
    const corvlumex::StopSignalThread stopper([&](int received) {
      if (received != 0) CORV_LOG("stopping on signal %d", received);
      listener.Stop();
    });
    served = listener.Serve();
  }
  CORV_LOG("stopped");
  return served ? 0 : 1;
}
