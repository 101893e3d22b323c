#include "programs/daemon_support/stop_signals.h"

#include <pthread.h>
#include <signal.h>

namespace corvlumex {
namespace {

sigset_t StopSignals() {
  sigset_t stop_signals;
  sigemptyset(&stop_signals);
  sigaddset(&stop_signals, SIGTERM);
  sigaddset(&stop_signals, SIGINT);
  return stop_signals;
}

}  // namespace

void BlockStopSignals() {
  const sigset_t stop_signals = StopSignals();
  pthread_sigmask(SIG_BLOCK, &stop_signals, nullptr);
  signal(SIGPIPE, SIG_IGN);
}

StopSignalThread::StopSignalThread(std::function<void(int signal)> on_stop)
    : thread_([on_stop = std::move(on_stop)] {
        const sigset_t stop_signals = StopSignals();
        int received = 0;
        sigwait(&stop_signals, &received);
        on_stop(received);
      }) {}

StopSignalThread::~StopSignalThread() {
  pthread_kill(thread_.native_handle(), SIGTERM);
  thread_.join();
}

}  // namespace corvlumex
