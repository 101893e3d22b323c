#include "common/stop_signals.h"

#include <signal.h>

#include <cstring>

namespace corvlumex {

void OnStopSignals(void (*handler)(int)) {
  struct sigaction action;
  memset(&action, 0, sizeof(action));
  action.sa_handler = handler;
  sigaction(SIGTERM, &action, nullptr);
  sigaction(SIGINT, &action, nullptr);
}

}  // namespace corvlumex
