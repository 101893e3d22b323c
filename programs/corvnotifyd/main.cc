// corvnotifyd: watches the folders named by the monitor-queue configurations
// and appends one line per file-system change to each share's queue.
//
//   corvnotifyd [--foreground] [--config-dir DIR]
//
// SIGTERM or SIGINT stops it after every event read so far is written.
#include <fcntl.h>
#include <sys/file.h>
#include <syslog.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <optional>
#include <string>

#include "common/error.h"
#include "common/log.h"
#include "common/stop_signals.h"
#include "common/sys.h"
#include "platform/linux/config_files.h"
#include "platform/linux/notifier_presence.h"
#include "programs/corvnotifyd/notifier.h"

namespace {

using corvlumex::notifyd::NotifierOptions;

void Usage(FILE* out) {
  fprintf(out,
          "usage: corvnotifyd [--foreground] [--config-dir DIR]\n"
          "  --foreground    stay attached to the terminal and log to standard error\n"
          "  --config-dir    folder of the monitor-queue configurations (default %s)\n",
          corvlumex::platform::NotifierConfigDir().c_str());
}

// Test hooks, honoured only inside a sandbox root so that a stray variable
// cannot change a real server's behaviour.
void ApplyTestHooks(NotifierOptions* options) {
  if (!corvlumex::InSandbox()) return;
  if (const char* pause = getenv("CORVNOTIFYD_TEST_PAUSE_FILE")) options->pause_file = pause;
  if (const char* backoff = getenv("CORVNOTIFYD_TEST_BACKOFF_MS")) {
    options->backoff_base = std::chrono::milliseconds(atol(backoff));
  }
  if (const char* limit = getenv("CORVNOTIFYD_TEST_WATCH_LIMIT")) options->watch_limit = strtoul(limit, nullptr, 10);
  if (const char* retry = getenv("CORVNOTIFYD_TEST_ROOT_RETRY_MS")) {
    options->missing_root_retry = std::chrono::milliseconds(atol(retry));
  }
}

// The exit status when the arguments end the program (help, a mistake);
// nothing when it is to run.
std::optional<int> ParseArguments(int argc, char** argv, bool* foreground, NotifierOptions* options) {
  options->config_dir = corvlumex::platform::NotifierConfigDir();
  for (int i = 1; i < argc; ++i) {
    const std::string arg = argv[i];
    if (arg == "--foreground") {
      *foreground = true;
    } else if (arg == "--config-dir" && i + 1 < argc && argv[i + 1][0] != '\0') {
      options->config_dir = argv[++i];
    } else if (arg == "--help" || arg == "-h") {
      Usage(stdout);
      return 0;
    } else {
      fprintf(stderr, "corvnotifyd: %s: %s\n", arg == "--config-dir" ? "--config-dir needs a folder" : "unknown option",
              arg.c_str());
      Usage(stderr);
      return 2;
    }
  }
  while (options->config_dir.size() > 1 && options->config_dir.back() == '/') options->config_dir.pop_back();
  return std::nullopt;
}

// Two notifiers reading one configuration would append every change twice:
// the configuration folder stays locked while this one runs (the lock goes
// with the process, also into the background child; its descriptors stay
// open until the process ends). It also carries the mark by which
// `fileindex status` tells that a notifier runs. The folder is made first,
// so that even the first run is locked and seen. False, said on standard
// error, when the locks cannot be had.
bool HoldConfigLocks(const std::string& config_dir) {
  if (!corvlumex::platform::MakeDirs(config_dir)) {
    fprintf(stderr, "corvnotifyd: cannot create the configuration folder %s: %s\n", config_dir.c_str(), strerror(errno));
    return false;
  }
  const int config_lock = open(config_dir.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (config_lock < 0) {
    fprintf(stderr, "corvnotifyd: cannot open the configuration folder %s: %s\n", config_dir.c_str(), strerror(errno));
    return false;
  }
  // The one-notifier lock is taken on a file only this daemon's user can
  // open: a lock on the folder itself (readable by every local user) could be
  // taken by anyone, and would keep the notifier from ever starting.
  const std::string instance_path = config_dir + "/.corvnotifyd.lock";
  const int instance_lock = open(instance_path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600);
  if (instance_lock < 0) {
    fprintf(stderr, "corvnotifyd: cannot open its lock file %s: %s\n", instance_path.c_str(), strerror(errno));
    return false;
  }
  if (flock(instance_lock, LOCK_EX | LOCK_NB) != 0) {
    fprintf(stderr, "corvnotifyd: another corvnotifyd already watches as configured in %s\n", config_dir.c_str());
    return false;
  }
  if (!corvlumex::platform::HoldNotifierPresence(config_lock)) {
    fprintf(stderr, "corvnotifyd: cannot lock the configuration folder %s: %s\n", config_dir.c_str(), strerror(errno));
    return false;
  }
  return true;
}

// Logs to standard error in the foreground, else to syslog from a
// background process. False when it could not detach.
bool StartLogging(bool foreground) {
  if (foreground) {
    corvlumex::LogToStderr("corvnotifyd");
    return true;
  }
  openlog("corvnotifyd", LOG_PID, LOG_DAEMON);
  if (daemon(0, 0) != 0) {
    perror("corvnotifyd: daemon");
    return false;
  }
  return true;
}

// Watches until a stop signal, or until the reader fails; the exit status.
int RunNotifier(const NotifierOptions& options, bool foreground) {
  try {
    corvlumex::notifyd::Notifier notifier(options);
    notifier.Start();
    {
      const corvlumex::StopSignalThread stopper([&](int received) {
        CORV_LOG("stopping on signal %d: writing what is pending", received);
        notifier.Stop();
      });
      CORV_LOG("watching as configured in %s", options.config_dir.c_str());
      // Run() also ends when the reader fails: leaving the scope releases the signal thread.
      notifier.Run();
    }
    CORV_LOG("stopped");
  } catch (const corvlumex::Error& e) {
    CORV_LOG("cannot run: %s", e.what());
    if (!foreground) fprintf(stderr, "corvnotifyd: %s\n", e.what());
    return 1;
  }
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  bool foreground = false;
  NotifierOptions options;
  if (const std::optional<int> status = ParseArguments(argc, argv, &foreground, &options)) return *status;
  ApplyTestHooks(&options);
  if (!HoldConfigLocks(options.config_dir)) return 1;
  if (!StartLogging(foreground)) return 1;
  // The notifier's threads inherit the block.
  corvlumex::BlockStopSignals();
  return RunNotifier(options, foreground);
}
