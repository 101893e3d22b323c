// fileindex-web: the web pages and JSON API of the file search, for every
// user of the server (search, as themselves) and its administrators
// (indexed folders, pause, status). See docs/web.md.
#include <CLI/CLI.hpp>
#include <pthread.h>
#include <signal.h>
#include <unistd.h>

#include <cstdlib>
#include <thread>
#include <iostream>

#include "common/stop_signals.h"
#include "common/sys.h"
#include "programs/fileindex-web/auth_routes.h"
#include "programs/fileindex-web/web_server.h"

#ifndef FILEINDEX_WEB_ROOT
#define FILEINDEX_WEB_ROOT "/usr/share/corvlumex/web"
#endif

namespace {

httplib::Server* running_server = nullptr;

void StopServer(int) {
  // stop() only flags the listener and shuts its socket down.
  if (running_server != nullptr) running_server->stop();
}

}  // namespace

int main(int argc, char** argv) {
  using corvlumex::web::WebOptions;
  WebOptions options;
  options.web_root = FILEINDEX_WEB_ROOT;
  CLI::App app{"fileindex-web: search the file server from a browser, and manage indexing"};
  app.add_option("--address", options.address, "address to listen on (default: loopback only)");
  app.add_option("--port", options.port, "port to listen on")->check(CLI::Range(1, 65535));
  auto* cert = app.add_option("--certificate", options.certificate, "PEM certificate: serve HTTPS")->check(CLI::ExistingFile);
  app.add_option("--key", options.key, "PEM private key of the certificate")->check(CLI::ExistingFile)->needs(cert);
  cert->needs(app.get_option("--key"));
  app.add_option("--web-root", options.web_root, "folder of the pages")->check(CLI::ExistingDirectory);
  app.add_option("--admin-group", options.admin_group, "members of this group (and root) manage indexing");
  app.add_option("--pam-service", options.pam_service, "PAM service name for sign-in");
  app.add_option("--idle-minutes", options.idle_minutes, "a session ends after this long without a request")->check(CLI::Range(1, 24 * 60));
  app.add_option("--lifetime-hours", options.lifetime_hours, "a session ends this long after sign-in")->check(CLI::Range(1, 24 * 30));
  app.add_option("--threads", options.threads, "requests served at once")->check(CLI::Range(2, 256));
  app.add_option("--sign-in-link-file", options.sign_in_link_file,
                 "in a sandbox (CORVLUMEX_ROOT set) only: write a one-time sign-in link for this user here");
  CLI11_PARSE(app, argc, argv);
  if (!options.sign_in_link_file.empty() && !corvlumex::InSandbox()) {
    std::cerr << "fileindex-web: --sign-in-link-file works only in a sandbox (CORVLUMEX_ROOT); on a server sign in with your password\n";
    return 2;
  }

  // A sandbox's daemon writes a fresh one-time link on SIGHUP (`scripts/run
  // link`): the signal waits for one thread, so every other thread, the
  // server's pool included, is started with it blocked.
  sigset_t hangup;
  sigemptyset(&hangup);
  sigaddset(&hangup, SIGHUP);
  pthread_sigmask(SIG_BLOCK, &hangup, nullptr);

  corvlumex::web::WebContext context(options);
  std::unique_ptr<httplib::Server> server;
  try {
    server = corvlumex::web::MakeServer(context);
  } catch (const std::exception& error) {
    std::cerr << "fileindex-web: " << error.what() << "\n";
    return 1;
  }
  if (!server->bind_to_port(options.address, options.port)) {
    std::cerr << "fileindex-web: cannot listen on " << options.address << ":" << options.port
              << " (in use, or a privileged port without root); choose another with --port\n";
    return 1;
  }
  signal(SIGPIPE, SIG_IGN);
  running_server = server.get();
  corvlumex::OnStopSignals(StopServer);
  corvlumex::web::WriteSignInLink(context);
  if (!options.sign_in_link_file.empty()) {
    std::thread([&context, hangup] {
      for (int signal = 0;;) {
        if (sigwait(&hangup, &signal) == 0) corvlumex::web::WriteSignInLink(context);
      }
    }).detach();
  }
  std::cerr << "fileindex-web: listening on " << (options.https() ? "https://" : "http://") << options.address << ":"
            << options.port << "\n";
  const bool clean = server->listen_after_bind();
  running_server = nullptr;
  return clean ? 0 : 1;
}
