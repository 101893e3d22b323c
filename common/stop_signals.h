// How every daemon of the system is told to stop.
#pragma once

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {

// Routes SIGTERM and SIGINT of a daemon to `handler` (without SA_RESTART,
// so a blocked accept or poll returns and the daemon can stop).
void OnStopSignals(void (*handler)(int));

}  // namespace corvlumex

CORVLUMEX_API_END
