// How every daemon of the system is told to stop.
#pragma once

#include <functional>
#include <thread>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {

// Routes SIGTERM and SIGINT of a daemon to `handler` (without SA_RESTART,
// so a blocked accept or poll returns and the daemon can stop).
void OnStopSignals(void (*handler)(int));

// SIGTERM and SIGINT taken synchronously by one thread of their own, for a
// daemon whose stop is more than a flag a signal handler may set: the stop
// then runs as ordinary code (it may lock, log and wait).
//
//   BlockStopSignals();           // first, before any thread is started
//   ... start the daemon ...
//   {
//     StopSignalThread stopper([&](int signal) { daemon.Stop(); });
//     daemon.Run();               // returns once Stop() was called, or on its own
//   }                             // the thread is woken if no signal came, and joined
//
// Blocks SIGTERM and SIGINT in the calling thread and so in every thread it
// starts afterwards, which leaves them to StopSignalThread; ignores SIGPIPE,
// so a peer gone away is an error of the write, not the daemon's end.
void BlockStopSignals();

class StopSignalThread {
 public:
  // Waits for SIGTERM or SIGINT and calls `on_stop` with the signal.
  explicit StopSignalThread(std::function<void(int signal)> on_stop);
  // Wakes the thread with SIGTERM when no signal came (the daemon ended on
  // its own), so `on_stop` runs exactly once either way, and joins it.
  ~StopSignalThread();
  StopSignalThread(const StopSignalThread&) = delete;
  StopSignalThread& operator=(const StopSignalThread&) = delete;

 private:
  std::thread thread_;
};

}  // namespace corvlumex

CORVLUMEX_API_END
