#include "common/stop_signals.h"

#include <pthread.h>
#include <signal.h>

#include <cstring>

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


void OnStopSignals(void (*handler)(int)) {
  struct sigaction action;
  memset(&action, 0, sizeof(action));
  action.sa_handler = handler;
  sigaction(SIGTERM, &action, nullptr);
  sigaction(SIGINT, &action, nullptr);
}

}  // namespace corvlumex
